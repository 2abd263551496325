#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/NodeArena.h"

#include <algorithm>
#include <new>

namespace thornvale {

namespace {
// An arena's slabs double from the first size to the largest, so that a
// small tree costs little and a large model few allocations.
constexpr size_t kFirstSlabBytes = 1024;
constexpr size_t kLargestSlabBytes = 64 * 1024;
constexpr size_t kAlign = NodeArena::kNodeAlign;
constexpr size_t kPrefix = NodeArena::kPrefix;
constexpr size_t kHeader = 64;      // the Slab (count, link), then blocks

}  // namespace

// A slab's count starts at kUnretired, so that frees cannot bring it to zero
// while its arena may still hand out blocks; retiring subtracts kUnretired
// minus the blocks handed out. An arena that keeps its slabs never retires
// them that way, so their counts never reach zero.
struct NodeArena::Slab {
  static constexpr uint32_t kUnretired = 1u << 31;
  std::atomic<uint32_t> live{kUnretired};
  Slab* next = nullptr;  // the arena's kept slabs
};
static_assert(sizeof(NodeArena::Slab) <= kHeader && kHeader % kAlign == 0, "the slab header fits");
static_assert(kHeader + kPrefix + NodeArena::kMaxNodeBytes <= kFirstSlabBytes, "every node fits a slab");

namespace {
void dropSlab(NodeArena::Slab* slab) {
  slab->~Slab();
  ::operator delete(static_cast<void*>(slab));
}
}  // namespace

void* NodeArena::allocateSlow(size_t bytes) {
  if (bytes > kMaxNodeBytes) throw std::bad_alloc();
  retire();
  const size_t slabBytes = slabBytes_ == 0 ? kFirstSlabBytes : std::min(2 * slabBytes_, kLargestSlabBytes);
  void* raw = ::operator new(slabBytes);
  slabBytes_ = slabBytes;
  slab_ = new (raw) Slab;
  next_ = static_cast<char*>(raw) + kHeader;
  end_ = static_cast<char*>(raw) + slabBytes;
  handedOut_ = 0;
  return allocate(bytes);  // fits: every node fits an empty slab
}

void NodeArena::retire() noexcept {
  if (slab_ == nullptr) return;
  if (lifetime_ == Lifetime::kArena) {
    slab_->next = kept_;
    kept_ = slab_;
  } else {
    const uint32_t drop = Slab::kUnretired - handedOut_;
    if (slab_->live.fetch_sub(drop, std::memory_order_acq_rel) == drop) dropSlab(slab_);
  }
  slab_ = nullptr;
  next_ = end_ = nullptr;
}

NodeArena::~NodeArena() {
  retire();
  while (kept_ != nullptr) {
    Slab* next = kept_->next;
    dropSlab(kept_);
    kept_ = next;
  }
}

void* allocateNodeOnHeap(size_t bytes) {
  char* block = static_cast<char*>(::operator new(kPrefix + bytes));
  *reinterpret_cast<NodeArena::Slab**>(block) = nullptr;  // the same type that releasing reads
  return block + kPrefix;
}

void releaseNode(void* node) noexcept {
  if (node == nullptr) return;
  char* block = static_cast<char*>(node) - kPrefix;
  auto* slab = *reinterpret_cast<NodeArena::Slab**>(block);
  if (slab == nullptr) {
    ::operator delete(block);
    return;
  }
  if (slab->live.fetch_sub(1, std::memory_order_acq_rel) == 1) dropSlab(slab);
}

}  // namespace thornvale
