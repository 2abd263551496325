// Storage for tree nodes: a NodeArena hands out node memory from slabs that
// grow from 1 KiB to 64 KiB, so that reading a model of a million nodes costs
// a few hundred allocations instead of a million, and the nodes of a tree lie
// side by side in the order they were read.
//
// Every node block starts with an 8-byte word that names its slab, or is
// null for a block from the heap, so that a node is freed the same way
// however it was made: Node's own operator delete calls releaseNode(). A slab
// goes back to the heap when its arena has moved on from it (or is
// destroyed) and every node in it has been freed, on whichever thread.
// Nodes may outlive their arena.
//
// Threads: one arena is used by one thread at a time; releaseNode() may run
// on any thread. allocate() throws std::bad_alloc.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

namespace thornvale {

class NodeArena {
 public:
  NodeArena() = default;
  NodeArena(const NodeArena&) = delete;
  NodeArena& operator=(const NodeArena&) = delete;
  ~NodeArena();

  // Memory for a node of `bytes` bytes (at most kMaxNodeBytes), aligned for
  // any node.
  void* allocate(size_t bytes);

  static constexpr size_t kMaxNodeBytes = 256;
  // Alignment of every node block.
  static constexpr size_t kNodeAlign = 8;

  struct Slab;  // defined with the allocator

 private:
  void retire() noexcept;

  Slab* slab_ = nullptr;
  char* next_ = nullptr;
  char* end_ = nullptr;
  uint32_t handedOut_ = 0;  // blocks of slab_ given out so far
  size_t slabBytes_ = 0;    // size of the latest slab
};

// Memory for a node of `bytes` bytes from the heap, freed by releaseNode().
void* allocateNodeOnHeap(size_t bytes);
// Frees a block from NodeArena::allocate() or allocateNodeOnHeap().
void releaseNode(void* block) noexcept;

}  // namespace thornvale
