// Storage for tree nodes: a NodeArena hands out node memory from slabs that
// grow from 1 KiB to 64 KiB, so that reading a model of a million nodes costs
// a few hundred allocations instead of a million, and the nodes of a tree lie
// side by side in the order they were read.
//
// Every node block starts with an 8-byte word that names its slab, or is
// null for a block from the heap, so that a node is freed the same way
// however it was made: Node's own operator delete calls releaseNode(). A slab
// goes back to the heap when its arena has moved on from it (or is
// destroyed) and every node in it has been freed, on whichever thread, so
// nodes may outlive their arena.
//
// An arena made with Lifetime::kArena keeps its slabs instead and frees them
// all when it is destroyed, whether their nodes were freed or not: freeing a
// million nodes one by one costs as much as reading them. Its owner must let
// no node outlive it; nodes freed before then are merely counted.
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
  // When slabs go back to the heap.
  enum class Lifetime {
    kNodes,  // once the arena has moved on and all their nodes are freed
    kArena,  // with the arena, all at once
  };

  explicit NodeArena(Lifetime lifetime = Lifetime::kNodes) : lifetime_(lifetime) {}
  NodeArena(const NodeArena&) = delete;
  NodeArena& operator=(const NodeArena&) = delete;
  ~NodeArena();

  // Memory for a node of `bytes` bytes (at most kMaxNodeBytes), aligned for
  // any node.
  void* allocate(size_t bytes) {
    const size_t need = kPrefix + (bytes + kNodeAlign - 1) / kNodeAlign * kNodeAlign;
    if (bytes > kMaxNodeBytes || static_cast<size_t>(end_ - next_) < need) return allocateSlow(bytes);
    char* block = next_;
    next_ += need;
    ++handedOut_;
    *reinterpret_cast<Slab**>(block) = slab_;
    return block + kPrefix;
  }

  static constexpr size_t kMaxNodeBytes = 256;
  // Alignment of every node block.
  static constexpr size_t kNodeAlign = 8;
  // Bytes before each block: the slab word, padded to keep blocks aligned.
  static constexpr size_t kPrefix = kNodeAlign;

  struct Slab;  // defined with the allocator

 private:
  // allocate() when the current slab is full or there is none.
  void* allocateSlow(size_t bytes);
  void retire() noexcept;

  Lifetime lifetime_;
  Slab* kept_ = nullptr;  // with Lifetime::kArena: the retired slabs, linked
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
