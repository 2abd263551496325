// The walk that CPUs without a vector kernel run (phones among them): trees
// laid out as complete binary trees, walked a level at a time over groups of
// kCompleteGroup trees, and buildCompleteForest(), which lays compiled trees
// out that way.
//
// A tree of depth D becomes 2^D - 1 splits in breadth-first order, so that
// the children of split i are 2i + 1 and 2i + 2 and need not be stored, and
// 2^D leaf values; every tree of a group is padded to the group's depth. A
// leaf above that depth becomes splits on a feature slot that always holds
// NaN whose leaves all carry its value, so either way leads to it.
//
// Features and thresholds are compared as unsigned keys (completeKeyOfBits()) that
// order as the floats do, so that a step is one node load, one feature load,
// an integer compare and an add with carry. The plain walk's NaN rule (at the
// root, the second child unless x <= t; below it, the second child when
// x > t) is built into the keys: a root split reads its feature from a second
// set of keys in which NaN is above every threshold, and its NaN threshold is
// below every feature; below the root, NaN features are below every
// threshold, and a NaN threshold is above every feature. Both +0 and -0 get
// the key of +0.
//
// walkComplete() walks groups of trees and writes each tree's leaf value.
// Thread-safe: the functions have no state.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <vector>

namespace thornvale {

struct CompleteSplit {
  // Position in the keys (the NaN slot for padding); at the root, the number
  // of slots plus the position.
  uint32_t feature;
  uint32_t threshold;  // completeThresholdKey() or, at the root, completeRootThresholdKey()
};
static_assert(sizeof(CompleteSplit) == 8, "complete-tree splits are two words");

// Key of a number that is not NaN: unsigned keys order as the numbers, and
// -0 and +0 get the same key. Written without branches, so that a loop of
// them compiles to vector code.
inline uint32_t completeKeyOfBits(uint32_t bits) {
  bits &= 0u - static_cast<uint32_t>((bits << 1) != 0);  // -0 becomes +0
  return bits ^ (static_cast<uint32_t>(static_cast<int32_t>(bits) >> 31) | 0x80000000u);
}
inline uint32_t bitsOf(float v) {
  uint32_t bits;
  std::memcpy(&bits, &v, sizeof bits);
  return bits;
}
inline bool isNaNBits(uint32_t bits) { return (bits & 0x7FFFFFFFu) > 0x7F800000u; }

// Keys of a feature value below the root and at the root, and of a threshold
// below the root and at the root; see above for NaN.
inline uint32_t completeFeatureKey(float v) {
  const uint32_t bits = bitsOf(v);
  return isNaNBits(bits) ? 0 : completeKeyOfBits(bits);
}
inline uint32_t completeRootFeatureKey(float v) {
  const uint32_t bits = bitsOf(v);
  return isNaNBits(bits) ? UINT32_MAX : completeKeyOfBits(bits);
}
inline uint32_t completeThresholdKey(float t) {
  const uint32_t bits = bitsOf(t);
  return isNaNBits(bits) ? UINT32_MAX : completeKeyOfBits(bits);
}
inline uint32_t completeRootThresholdKey(float t) {
  const uint32_t bits = bitsOf(t);
  return isNaNBits(bits) ? 0 : completeKeyOfBits(bits);
}

// Fills keys[0, slots) with the keys of features[0, slots - 1) and of NaN
// (the NaN slot, at slots - 1), and keys[slots, 2 * slots) with their root
// keys.
inline void completeKeys(const float* features, size_t slots, uint32_t* keys) {
  for (size_t i = 0; i + 1 < slots; ++i) {
    const uint32_t bits = bitsOf(features[i]);
    const uint32_t key = completeKeyOfBits(bits);
    const uint32_t nan = 0u - static_cast<uint32_t>(isNaNBits(bits));
    keys[i] = key & ~nan;
    keys[slots + i] = key | nan;
  }
  keys[slots - 1] = 0;
  keys[2 * slots - 1] = UINT32_MAX;
}

// Trees per group: the bits of a taken mask.
constexpr size_t kCompleteGroup = 32;
constexpr uint32_t kCompleteAllTaken = 0xFFFFFFFFu;
// Deepest tree the layout takes: a group of that depth holds 32 * 12 KiB.
constexpr uint32_t kCompleteMaxDepth = 10;

// Group g holds trees [g * kCompleteGroup, (g + 1) * kCompleteGroup), each
// of depth depths[g] (>= 1): its splits start at splits[splitStart[g]] and
// its leaves at leaves[leafStart[g]], tree after tree. Bit k of taken[g] says
// whether tree g * kCompleteGroup + k is in the layout; a lane of a tree that
// is not (or past the last tree) walks a tree whose leaves are 0.
struct CompleteForest {
  std::vector<CompleteSplit> splits;
  std::vector<float> leaves;
  std::vector<uint32_t> depths;
  std::vector<size_t> splitStart;
  std::vector<size_t> leafStart;
  std::vector<uint32_t> taken;

  bool empty() const { return depths.empty(); }
  size_t bytes() const {
    return splits.size() * sizeof(CompleteSplit) + leaves.size() * sizeof(float) +
           (depths.size() + taken.size()) * sizeof(uint32_t) +
           (splitStart.size() + leafStart.size()) * sizeof(size_t);
  }
};

// The steps of buildCompleteForest(), below.
namespace detail {

// The trees of one group that the layout takes (bit k for tree first + k) and
// the depth that they are padded to.
struct GroupPlan {
  uint32_t taken;
  uint32_t depth;
};

// Takes the trees of [first, end) that `takes` accepts and that are no deeper
// than kCompleteMaxDepth, then leaves the deepest ones out until the group's
// padded splits number at most four times the nodes of the trees first taken
// (or 63 per tree, whichever is more).
template <typename Tree, typename Takes>
GroupPlan planGroup(const std::vector<Tree>& trees, size_t first, size_t end, Takes& takes) {
  uint32_t taken = 0;
  uint64_t nodes = 0;
  for (size_t i = first; i < end; ++i) {
    if (trees[i].depth <= kCompleteMaxDepth && takes(trees[i])) {
      taken |= uint32_t{1} << (i - first);
      nodes += trees[i].nodes.size();
    }
  }
  const uint64_t budget = std::max<uint64_t>(4 * nodes, 63 * kCompleteGroup);
  for (;;) {
    uint32_t depth = 1;
    for (size_t i = first; i < end; ++i) {
      if (taken >> (i - first) & 1) depth = std::max(depth, trees[i].depth);
    }
    if (((uint64_t{1} << depth) - 1) * kCompleteGroup <= budget) return GroupPlan{taken, depth};
    for (size_t i = first; i < end; ++i) {
      if (trees[i].depth == depth) taken &= ~(uint32_t{1} << (i - first));
    }
  }
}

// Writes `tree` as a complete tree of `depth` levels: its splits into
// splits[0, 2^depth - 1) in breadth-first order, a root split reading the
// root keys, and its leaf values into leaves[0, 2^depth), each leaf above the
// last level filling the run of last-level leaves beneath it. Positions that
// the tree does not reach keep what they hold (padding splits on the NaN
// slot).
template <typename Tree>
void placeTree(const Tree& tree, int64_t leafId, uint32_t nanSlot, uint32_t depth, CompleteSplit* splits,
               float* leaves) {
  const size_t splitCount = (size_t{1} << depth) - 1;
  // Pairs of (compiled node, complete position), depth first.
  struct Place {
    size_t node;
    size_t at;
  };
  Place stack[2 * kCompleteMaxDepth + 2];
  size_t top = 0;
  stack[top++] = Place{0, 0};
  while (top != 0) {
    const Place p = stack[--top];
    const auto& n = tree.nodes[p.node];
    if (n.featureId == leafId) {
      size_t lo = p.at, hi = p.at;
      while (lo < splitCount) {
        lo = 2 * lo + 1;
        hi = 2 * hi + 2;
      }
      std::fill(leaves + (lo - splitCount), leaves + (hi - splitCount) + 1, n.value);
      continue;
    }
    const auto feature = static_cast<uint32_t>(n.featureId);
    splits[p.at] = p.at == 0 ? CompleteSplit{nanSlot + 1 + feature, completeRootThresholdKey(n.value)}
                             : CompleteSplit{feature, completeThresholdKey(n.value)};
    stack[top++] = Place{static_cast<size_t>(n.child) + 1, 2 * p.at + 2};
    stack[top++] = Place{static_cast<size_t>(n.child), 2 * p.at + 1};
  }
}

}  // namespace detail

// Lays out compiled trees. A Tree has `nodes` (root first, the two children
// of a split adjacent, each node with `featureId`, `child` (index of its
// first child) and `value`, a leaf marked by featureId == leafId) and `depth`;
// `takes(tree)` says whether the walk may take it; detail::planGroup() says
// which trees each group takes and how deep it is. `nanSlot` is the feature
// position that always holds NaN, the last of the nanSlot + 1 slots. Returns
// an empty forest when no tree is taken.
template <typename Tree, typename Takes>
CompleteForest buildCompleteForest(const std::vector<Tree>& trees, int64_t leafId, uint32_t nanSlot,
                                   Takes takes) {
  // Plan every group, so that the arrays are made once at their final size.
  CompleteForest out;
  size_t splitTotal = 0, leafTotal = 0;
  bool any = false;
  for (size_t first = 0; first < trees.size(); first += kCompleteGroup) {
    const auto plan = detail::planGroup(trees, first, std::min(trees.size(), first + kCompleteGroup), takes);
    any = any || plan.taken != 0;
    out.taken.push_back(plan.taken);
    out.depths.push_back(plan.depth);
    out.splitStart.push_back(splitTotal);
    out.leafStart.push_back(leafTotal);
    splitTotal += kCompleteGroup * ((size_t{1} << plan.depth) - 1);
    leafTotal += kCompleteGroup * (size_t{1} << plan.depth);
  }
  if (!any) return CompleteForest{};

  // Padding splits read the NaN slot; lanes without a tree have leaves of 0.
  out.splits.assign(splitTotal, CompleteSplit{nanSlot, 0});
  out.leaves.assign(leafTotal, 0.0f);
  for (size_t g = 0; g < out.depths.size(); ++g) {
    const uint32_t depth = out.depths[g];
    for (size_t k = 0; k < kCompleteGroup; ++k) {
      if ((out.taken[g] >> k & 1) == 0) continue;
      detail::placeTree(trees[g * kCompleteGroup + k], leafId, nanSlot, depth,
                        out.splits.data() + out.splitStart[g] + k * ((size_t{1} << depth) - 1),
                        out.leaves.data() + out.leafStart[g] + k * (size_t{1} << depth));
    }
  }
  return out;
}

// Walks the trees of groups [firstGroup, endGroup) of `forest` and stores
// their leaf values in `out`, kCompleteGroup per group. `keys` is what
// completeKeys() filled for the slots that the forest was laid out for.
void walkComplete(const CompleteForest& forest, size_t firstGroup, size_t endGroup, const uint32_t* keys,
                  float* out);
// The same walk, returning `sum` plus the leaf values widened to double, in
// tree order.
double sumComplete(const CompleteForest& forest, size_t firstGroup, size_t endGroup, const uint32_t* keys,
                   double sum);

}  // namespace thornvale
