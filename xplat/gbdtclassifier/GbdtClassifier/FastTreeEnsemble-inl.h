// FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>: the compiled forest behind
// the interface of FastTreeEnsemble.h, which says what it computes and
// throws. Included by the code that creates one (BoostingModel.cc) and by the
// tests and benchmarks that look inside.
//
// Each tree becomes one array of 12-byte nodes whose two children are
// adjacent. unnormalizedScore() walks many trees at once so that their memory
// loads overlap, yet adds the leaves in tree order, so it is bit-identical to
// unnormalizedScoreOneByOne(). It walks the plain trees over a second copy of
// them, laid out by init() for the kernel in use (WalkKernel.h). Where the
// CPU has AVX-512, kWalkGroup trees per call of the vector kernel
// (FastTreeEnsembleSimd.h), 8 bytes per node, 16 more per tree that is a
// single leaf, and 16 bytes per tree; trees deeper than kMaxGatherDepth or
// with more than kWalkMaxDistance nodes are not copied. Elsewhere,
// kCompleteGroup trees per call of the scalar walk of complete trees
// (CompleteTreeWalk.h), every tree padded to its group's depth: 8 bytes per
// split and 4 per leaf of the padded trees; trees deeper than
// kCompleteMaxDepth are not copied. Without a copy, or when a test asks for
// WalkKernel::kPortable, it walks 8 compiled trees in lock step. Trees with
// equality features, trees not copied, and forests reading more than
// kMaxGatherFeatures positions take the walks of the compiled trees.
//
// unnormalizedScores() scores rows a block at a time, sorted by the sub-model
// that each row selects, and walks each tree over the whole block while its
// nodes are in cache. Where the CPU has AVX-512 it walks the complete trees
// with kBlockRows rows in the vector lanes (CompleteBlockWalk.h), so init()
// lays the trees out as complete trees too; with kScalar it runs the scalar
// walk of complete trees row after row, group by group; otherwise, and for
// the trees that the layout leaves out, it walks the compiled trees with
// kRowsInStep rows in lock step.
//
// Threads: init() once, then any number of threads may score concurrently;
// useWalkKernel() is part of setting up, like init().
#pragma once

#include <glog/logging.h>

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"
#include "xplat/gbdtclassifier/GbdtClassifier/CompleteBlockWalk.h"
#include "xplat/gbdtclassifier/GbdtClassifier/CompleteTreeWalk.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsembleSimd.h"
#include "xplat/gbdtclassifier/GbdtClassifier/WalkKernel.h"

namespace thornvale {

template <typename FeatureIdT, typename NodeIndexT>
class FastTreeEnsembleOOP final : public FastTreeEnsemble<float> {
  static_assert(std::is_signed<FeatureIdT>::value && std::is_integral<FeatureIdT>::value,
                "FeatureIdT must be a signed integer");
  static_assert(std::is_unsigned<NodeIndexT>::value && sizeof(NodeIndexT) <= sizeof(size_t),
                "NodeIndexT must be an unsigned integer");

 public:
  // Scores with `kernel` (see walkKernel()); a kernel that this CPU cannot
  // run gives the best one it can.
  explicit FastTreeEnsembleOOP(WalkKernel kernel = bestWalkKernel())
      : kernel_(walkKernelSupported(kernel) ? kernel : bestWalkKernel()) {}

  struct FlatNode {
    FeatureIdT featureId;  // split: feature position; kLeaf for a leaf
    NodeIndexT child;      // split: index of the first child; leaf: 0
    float value;           // split: threshold; leaf: value * weight
  };
  static_assert(sizeof(FlatNode) <= 12, "compiled nodes take 12 bytes or less");
  struct FlatTree {
    std::vector<FlatNode> nodes;  // root at index 0
    bool hasEqualityFeature = false;
    uint32_t depth = 0;      // splits on the longest root-to-leaf path
    uint32_t leafDepth = 0;  // splits on the shortest root-to-leaf path
  };

  static constexpr FeatureIdT kLeaf = -1;
  // Largest feature id a split may carry.
  static constexpr int64_t kMaxFeatureId = std::numeric_limits<FeatureIdT>::max() - 1;
  // A first-child index at or above this cannot be stored.
  static constexpr uint64_t kNodeIndexLimit = uint64_t{std::numeric_limits<NodeIndexT>::max()} - 1;
  static constexpr size_t kBlock = 8;
  // Trees deeper than this are left to the scalar walks: a group runs as
  // many steps as its deepest tree.
  static constexpr uint32_t kMaxGatherDepth = 64;
  // The gather kernels read a copy of the features on the stack.
  static constexpr size_t kMaxGatherFeatures = 1023;
  static_assert(kMaxGatherFeatures <= kWalkMaxFeature, "the NaN slot must fit a WalkNode");
  static_assert(kMaxGatherFeatures < 4096, "vectors that the kernels lay out are copied by blocks");

  bool init(const Forest* forest, bool remap) override;

  double unnormalizedScore(const std::vector<float>& features) const override {
    checkLength(features);
    return scoreRow(features.data());
  }
  double score(const std::vector<float>& features) const override {
    return logistic(unnormalizedScore(features));
  }
  void unnormalizedScores(const float* rows, size_t numRows, size_t rowStride, double* out) const override;
  double unnormalizedScoreOneByOne(const std::vector<float>& features) const override {
    checkLength(features);
    const float* x = features.data();
    const auto [first, end] = selectModel(x);
    return sumOneByOne(x, first, end);
  }
  double unnormalizedScoreOfZeros() const override {
    const Zeros x;
    const auto [first, end] = selectModel(x);
    return sumOneByOne(x, first, end);
  }
  size_t numTrees() const override { return trees_.size(); }
  size_t requiredFeatures() const override { return requiredFeatures_; }
  int featureIdBits() const override { return static_cast<int>(8 * sizeof(FeatureIdT)); }

  // The kernel that unnormalizedScore() uses: the best one of this CPU until
  // useWalkKernel() picks another, which lays the trees out for it if they
  // are not yet. Changing it while other threads score is a data race.
  WalkKernel walkKernel() const { return kernel_; }
  // Returns false, and changes nothing, when the CPU cannot run `kernel`.
  bool useWalkKernel(WalkKernel kernel) {
    if (!walkKernelSupported(kernel)) return false;
    kernel_ = kernel;
    buildWalkCopy();
    return true;
  }
  // Bytes held by the copy of the trees that the current kernel walks (0 for
  // kPortable, or when the kernel takes none of the trees).
  // With kAvx512 that is the walk nodes and the complete trees of the block
  // walk.
  size_t gatherBytes() const {
    return kernel_ == WalkKernel::kScalar   ? complete_.bytes()
           : kernel_ == WalkKernel::kAvx512 ? walk_.bytes() + complete_.bytes()
                                            : 0;
  }

  // The range [first, end) of trees that the selector chooses for `features`.
  std::pair<size_t, size_t> selectModel(const std::vector<float>& features) const {
    checkLength(features);
    return selectModel(features.data());
  }

  const std::vector<FlatTree>& getTrees() const { return trees_; }
  const FlatTree& getSelector() const { return selector_; }
  double getBaseScore() const { return baseScore_; }
  const std::vector<uint32_t>& getModelIndexMap() const { return modelIndexMap_; }
  // Stored bits of the equality mask; positions past its end read as clear.
  const std::vector<bool>& getEqualityMask() const { return equalityMask_; }
  const std::vector<uint32_t>& getFeatureMapping() const { return featureMapping_; }

 private:
  struct Zeros {
    float operator[](ptrdiff_t) const { return 0.0f; }
  };

  void checkLength(const std::vector<float>& features) const {
    if (features.size() < requiredFeatures_) {
      throw std::invalid_argument("feature vector has " + std::to_string(features.size()) +
                                  " entries but the compiled forest reads position " +
                                  std::to_string(requiredFeatures_ - 1));
    }
  }

  bool isEquality(ptrdiff_t position) const {
    return static_cast<size_t>(position) < equalityMask_.size() && equalityMask_[position];
  }

  // Work list of compileTree, kept across trees.
  struct Pending {
    const Node* node;
    size_t slot;
    uint32_t depth;
  };
  static constexpr size_t kSelector = std::numeric_limits<size_t>::max();
  static std::string label(size_t tree) {
    return tree == kSelector ? "model selector tree" : "tree " + std::to_string(tree);
  }

  void buildEqualityMask(const Forest& forest, bool remap);
  // The feature position that `split` of `tree` reads: its pivotIndex, or the
  // featureMapping entry it names when remapping. Throws std::range_error
  // past the limit of FeatureIdT or outside the feature vector.
  int32_t splitPosition(const LinearNode& split, size_t tree) const;
  // The position that a split on `featureId` reads.
  int32_t checkedPosition(int32_t featureId, size_t tree) const {
    // Without a featureMapping every position reads 0.0; a negative one is
    // kept as 0.
    if (featureMapping_.empty()) return featureId < 0 ? 0 : featureId;
    if (featureId >= 0 && (remap_ || static_cast<uint64_t>(featureId) < featureMapping_.size())) {
      return featureId;
    }
    throwBadPosition(featureId, tree);
  }
  [[noreturn]] void throwBadPosition(int32_t featureId, size_t tree) const;
  // What compileTree() reuses from tree to tree: its work list, and the nodes
  // of the tree being compiled, copied out at their final size.
  struct CompileScratch {
    std::vector<Pending> pending;
    std::vector<FlatNode> nodes;
  };
  void compileTree(const Node& root, double scale, FlatTree& out, size_t tree, CompileScratch& scratch);
  // Claims the two slots of a split's children at the end of nodes[0, used),
  // growing `nodes` ahead of need; returns the first. Throws std::range_error
  // when that index cannot be stored.
  static size_t claimChildren(std::vector<FlatNode>& nodes, size_t& used);

  // Selector walk result as a model number: truncation toward zero, NaN and
  // negative values give 0, values beyond the range the largest value.
  static uint32_t modelNumber(float v) {
    if (!(v >= 1.0f)) return 0;
    if (v >= 4294967296.0f) return std::numeric_limits<uint32_t>::max();
    return static_cast<uint32_t>(v);
  }

  template <typename X>
  std::pair<size_t, size_t> selectModel(const X& x) const {
    const size_t n = trees_.size();
    if (selector_.nodes.empty()) return {0, n};
    const FlatNode* nodes = selector_.nodes.data();
    const uint64_t k = modelIndexMap_.size();
    // A model number past the last boundary selects the last sub-model.
    const uint64_t m = std::min<uint64_t>(modelNumber(nodes[plainLeaf(nodes, x)].value), k);
    const size_t first = m == 0 ? 0 : std::min<size_t>(modelIndexMap_[m - 1], n);
    const size_t end = m >= k ? n : std::min<size_t>(modelIndexMap_[m], n);
    return {first, std::max(first, end)};
  }

  template <typename X>
  static size_t plainLeaf(const FlatNode* nodes, const X& x) {
    const FlatNode* n = nodes;
    if (n->featureId == kLeaf) return 0;
    size_t i = n->child + static_cast<size_t>(!(x[n->featureId] <= n->value));
    for (;;) {
      n = nodes + i;
      if (n->featureId == kLeaf) return i;
      __builtin_prefetch(nodes + n->child, 0, 3);
      i = n->child + static_cast<size_t>(x[n->featureId] > n->value);
    }
  }

  template <typename X>
  size_t equalityLeaf(const FlatNode* nodes, const X& x) const {
    size_t i = 0;
    for (;;) {
      const FlatNode& n = nodes[i];
      if (n.featureId == kLeaf) return i;
      __builtin_prefetch(nodes + n.child, 0, 3);
      const float v = x[n.featureId];
      const bool second = isEquality(n.featureId) ? v != n.value : v > n.value;
      i = n.child + static_cast<size_t>(second);
    }
  }

  template <typename X>
  float leafValue(const FlatTree& tree, const X& x) const {
    const FlatNode* nodes = tree.nodes.data();
    return nodes[tree.hasEqualityFeature ? equalityLeaf(nodes, x) : plainLeaf(nodes, x)].value;
  }

  template <typename X>
  double sumOneByOne(const X& x, size_t first, size_t end) const {
    double sum = baseScore_;
    for (size_t i = first; i < end; ++i) sum += static_cast<double>(leafValue(trees_[i], x));
    return sum;
  }

  // Walks kBlock trees in lock step, one level of every tree per round, so
  // that their node loads overlap; the steps are branch-free. Until the
  // shallowest leaf of the block every tree is at a split; after that a tree
  // that has reached its leaf keeps its index (selected by a mask) and reads
  // entry 0 of the vector, which exists because the block has a split. Leaf
  // values are written in tree order.
  template <bool kRoot, bool kMasked>
  static uint32_t step(const FlatNode* nodes, uint32_t index, const float* x) {
    const FlatNode& n = nodes[index];
    const auto f = static_cast<int32_t>(n.featureId);
    const uint32_t isSplit = kMasked ? static_cast<uint32_t>(f != kLeaf) : 1u;
    const float v = kMasked ? x[f & -static_cast<int32_t>(isSplit)] : x[f];
    const uint32_t second = kRoot ? static_cast<uint32_t>(!(v <= n.value))
                                  : static_cast<uint32_t>(v > n.value);
    const uint32_t next = static_cast<uint32_t>(n.child) + second;
    return kMasked ? index ^ ((index ^ next) & (0u - isSplit)) : next;
  }

  template <bool kMasked>
  static void round(const FlatNode* const* base, uint32_t* index, const float* x, bool root) {
    if (root) {
#pragma GCC unroll 8
      for (size_t k = 0; k < kBlock; ++k) index[k] = step<true, kMasked>(base[k], index[k], x);
    } else {
#pragma GCC unroll 8
      for (size_t k = 0; k < kBlock; ++k) {
        __builtin_prefetch(base[k] + base[k][index[k]].child, 0, 3);
        index[k] = step<false, kMasked>(base[k], index[k], x);
      }
    }
  }

  void walkBlock(const FlatTree* block, const float* x, float* leaves) const {
    const FlatNode* base[kBlock];
    uint32_t index[kBlock];
    uint32_t rounds = 0;
    uint32_t unmasked = std::numeric_limits<uint32_t>::max();
    for (size_t k = 0; k < kBlock; ++k) {
      base[k] = block[k].nodes.data();
      if (block[k].hasEqualityFeature) {
        index[k] = static_cast<uint32_t>(equalityLeaf(base[k], x));
        unmasked = 0;
      } else {
        index[k] = 0;
        rounds = std::max(rounds, block[k].depth);
        unmasked = std::min(unmasked, block[k].leafDepth);
      }
    }
    unmasked = std::min(unmasked, rounds);
    uint32_t r = 0;
    for (; r < unmasked; ++r) round<false>(base, index, x, r == 0);
    for (; r < rounds; ++r) round<true>(base, index, x, r == 0);
    for (size_t k = 0; k < kBlock; ++k) leaves[k] = base[k][index[k]].value;
  }

  double sumInterleaved(const float* x, size_t first, size_t end) const {
    double sum = baseScore_;
    size_t i = first;
    for (; i + kBlock <= end; i += kBlock) {
      float leaves[kBlock];
      walkBlock(&trees_[i], x, leaves);
      for (size_t k = 0; k < kBlock; ++k) sum += static_cast<double>(leaves[k]);
    }
    for (; i < end; ++i) sum += static_cast<double>(leafValue(trees_[i], x));
    return sum;
  }

  static bool gatherable(const FlatTree& tree);
  void buildWalkCopy();

  // Rows that the compiled-tree walk of a block moves in lock step.
  static constexpr size_t kRowsInStep = 16;
  // Rows sorted by sub-model at a time.
  static constexpr size_t kWindow = 4 * kBlockRows;
  // Widest vector whose rows the compiled-tree walk of a block copies out by
  // feature; wider ones are walked a row at a time.
  static constexpr size_t kMaxBlockCopy = 4096;

  // One step of a row in a block copied out by feature: x points at the
  // row's value of feature 0, and feature f is kBlockRows floats further per
  // f; a leaf (feature -1) reads the row before feature 0, which exists, and
  // keeps its index. The rules are those of step().
  template <bool kRoot, bool kMasked>
  static uint32_t stepInBlock(const FlatNode* nodes, uint32_t index, const float* x) {
    const FlatNode& n = nodes[index];
    const auto f = static_cast<ptrdiff_t>(n.featureId);
    const float v = x[f * static_cast<ptrdiff_t>(kBlockRows)];
    const uint32_t second = kRoot ? static_cast<uint32_t>(!(v <= n.value)) : static_cast<uint32_t>(v > n.value);
    const uint32_t next = static_cast<uint32_t>(n.child) + second;
    return kMasked && f == kLeaf ? index : next;
  }

  // Adds the leaf of `tree` to sums[k] for rows[0, n). `byFeature` is the
  // block copied out by feature (byFeature[f * kBlockRows + k] is feature f
  // of row k, rows past n repeating row 0, up to the next multiple of
  // kRowsInStep), or null; with it the compiled nodes are walked by
  // kRowsInStep rows in lock step (rows that reach a leaf early stay there,
  // as in walkBlock()).
  void addTreeToRows(const FlatTree& tree, const float* const* rows, const float* byFeature, size_t n,
                     double* sums) const {
    const FlatNode* nodes = tree.nodes.data();
    if (byFeature == nullptr || tree.hasEqualityFeature || nodes[0].featureId == kLeaf) {
      for (size_t k = 0; k < n; ++k) sums[k] += static_cast<double>(leafValue(tree, rows[k]));
      return;
    }
    const uint32_t rounds = tree.depth;
    const uint32_t unmasked = std::min(tree.leafDepth, rounds);
    for (size_t r0 = 0; r0 < n; r0 += kRowsInStep) {
      const float* x = byFeature + r0;
      uint32_t index[kRowsInStep];
#pragma GCC unroll 16
      for (size_t k = 0; k < kRowsInStep; ++k) index[k] = stepInBlock<true, false>(nodes, 0, x + k);
      uint32_t r = 1;
      for (; r < unmasked; ++r) {
#pragma GCC unroll 16
        for (size_t k = 0; k < kRowsInStep; ++k) index[k] = stepInBlock<false, false>(nodes, index[k], x + k);
      }
      for (; r < rounds; ++r) {
#pragma GCC unroll 16
        for (size_t k = 0; k < kRowsInStep; ++k) index[k] = stepInBlock<false, true>(nodes, index[k], x + k);
      }
      const size_t m = std::min(kRowsInStep, n - r0);
      for (size_t k = 0; k < m; ++k) sums[r0 + k] += static_cast<double>(nodes[index[k]].value);
    }
  }

  // Copies rows[0, n) out by feature for addTreeToRows() into `buffer`
  // (kBlockRows * (requiredFeatures_ + 1) floats), after a row of zeros that
  // leaves read; returns the start of feature 0, or null when the rows are
  // too wide to copy.
  const float* copyByFeature(const float* const* rows, size_t n, float* buffer) const {
    if (requiredFeatures_ > kMaxBlockCopy) return nullptr;
    std::fill(buffer, buffer + kBlockRows, 0.0f);
    float* out = buffer + kBlockRows;
    const size_t filled = (n + kRowsInStep - 1) / kRowsInStep * kRowsInStep;
    for (size_t k = 0; k < filled; ++k) {
      const float* x = rows[k < n ? k : 0];
      for (size_t f = 0; f < requiredFeatures_; ++f) out[f * kBlockRows + k] = x[f];
    }
    return out;
  }

  bool takenByLayout(size_t tree) const {
    return complete_.taken[tree / kCompleteGroup] >> (tree % kCompleteGroup) & 1;
  }

  // Scores rows[0, n) (n <= kBlockRows), all of which select trees
  // [first, end), into sums[0, n). `keys` has room for the block's keys, or
  // for its rows copied by feature; it is empty for vectors wider than
  // kMaxBlockCopy, which no kernel lays out.
  // One row with the kernel in use.
  double scoreRow(const float* x) const {
    const auto [first, end] = selectModel(x);
    if (kernel_ == WalkKernel::kScalar && !complete_.empty()) return sumComplete(x, first, end);
    if (kernel_ == WalkKernel::kAvx512 && !walk_.empty()) return sumGathered(x, first, end);
    return sumInterleaved(x, first, end);
  }

  // Below this many rows a block costs more than its rows one at a time: the
  // vector block walk always fills all of its kBlockRows lanes.
  size_t fewestBlockRows() const { return kernel_ == WalkKernel::kAvx512 ? kBlockRows / 2 : 4; }

  void scoreBlock(const float* const* rows, size_t n, size_t first, size_t end, uint32_t* keys,
                  double* sums) const {
    std::fill(sums, sums + n, baseScore_);
    const size_t slots = requiredFeatures_ + 1;
    if (kernel_ == WalkKernel::kAvx512 && !complete_.empty()) {
      alignas(64) double lanes[kBlockRows];
      std::fill(lanes, lanes + kBlockRows, baseScore_);
      completeBlockKeys(rows, n, slots, keys);
      for (size_t i = first; i < end;) {
        if (!takenByLayout(i)) {
          addTreeToRows(trees_[i], rows, nullptr, n, lanes);
          ++i;
          continue;
        }
        size_t j = i + 1;
        while (j < end && takenByLayout(j)) ++j;
        sumCompleteRows(complete_, i, j, slots, keys, lanes);
        i = j;
      }
      std::copy(lanes, lanes + n, sums);
      return;
    }
    if (kernel_ == WalkKernel::kScalar && !complete_.empty()) {
      for (size_t k = 0; k < n; ++k) completeKeys(rows[k], slots, keys + 2 * slots * k);
      const size_t endGroup = (end + kCompleteGroup - 1) / kCompleteGroup;
      for (size_t g = first / kCompleteGroup; g < endGroup; ++g) {
        const size_t base = g * kCompleteGroup;
        if (complete_.taken[g] == kCompleteAllTaken && base >= first && base + kCompleteGroup <= end) {
          for (size_t k = 0; k < n; ++k) {
            sums[k] = thornvale::sumComplete(complete_, g, g + 1, keys + 2 * slots * k, sums[k]);
          }
          continue;
        }
        const size_t lo = std::max(first, base), hi = std::min(end, base + kCompleteGroup);
        for (size_t k = 0; k < n; ++k) {
          float leaves[kCompleteGroup];
          walkComplete(complete_, g, g + 1, keys + 2 * slots * k, leaves);
          for (size_t i = lo; i < hi; ++i) {
            if (takenByLayout(i)) sums[k] += static_cast<double>(leaves[i - base]);
            else sums[k] += static_cast<double>(leafValue(trees_[i], rows[k]));
          }
        }
      }
      return;
    }
    const float* byFeature = copyByFeature(rows, n, reinterpret_cast<float*>(keys));
    for (size_t i = first; i < end; ++i) addTreeToRows(trees_[i], rows, byFeature, n, sums);
  }

  // The features, the NaN slot at position requiredFeatures_, and NaN up to a
  // multiple of 32 entries (the vector kernel loads whole registers).
  using FeatureBuffer = float[(kMaxGatherFeatures + 32) / 32 * 32];
  size_t copyFeatures(const float* features, FeatureBuffer& x) const {
    const size_t used = requiredFeatures_;
    if (used != 0) std::copy(features, features + used, x);
    const size_t slots = used + 1;
    std::fill(x + used, x + (slots + 31) / 32 * 32, std::numeric_limits<float>::quiet_NaN());
    return slots;
  }

  // Groups of kCompleteGroup trees, walked a level at a time as complete
  // trees. Runs of groups that lie inside [first, end) and whose trees are
  // all in the layout are summed by the walk, so that the adds of one set of
  // lanes overlap the walk of the next (an eighth of the time on 500 trees
  // of depth 6); in other groups, trees that the layout does not take are
  // walked here.
  double sumComplete(const float* features, size_t first, size_t end) const {
    alignas(64) uint32_t keys[2 * (kMaxGatherFeatures + 1)];
    completeKeys(features, requiredFeatures_ + 1, keys);
    double sum = baseScore_;
    const size_t endGroup = (end + kCompleteGroup - 1) / kCompleteGroup;
    auto whole = [&](size_t g) {
      return complete_.taken[g] == kCompleteAllTaken && g * kCompleteGroup >= first &&
             (g + 1) * kCompleteGroup <= end;
    };
    for (size_t g = first / kCompleteGroup; g < endGroup;) {
      size_t run = g;
      while (run < endGroup && whole(run)) ++run;
      if (run != g) {
        sum = thornvale::sumComplete(complete_, g, run, keys, sum);
        g = run;
        continue;
      }
      float leaves[kCompleteGroup];
      walkComplete(complete_, g, g + 1, keys, leaves);
      const size_t base = g * kCompleteGroup;
      const size_t stop = std::min(end, base + kCompleteGroup);
      for (size_t i = std::max(first, base); i < stop; ++i) {
        const bool taken = complete_.taken[g] >> (i - base) & 1;
        sum += static_cast<double>(taken ? leaves[i - base] : leafValue(trees_[i], features));
      }
      ++g;
    }
    return sum;
  }

  // Groups of kWalkGroup consecutive trees go to the kernel; lanes of trees
  // that it does not take walk the constant tree at index 0, and those trees
  // are walked here instead.
  double sumGathered(const float* features, size_t first, size_t end) const {
    alignas(64) FeatureBuffer x;
    const size_t slots = copyFeatures(features, x);
    double sum = baseScore_;
    float leaves[kWalkGroup];
    for (size_t i = first; i < end; i += kWalkGroup) {
      // Lanes past `end` walk the trees (or padding) that follow, unused.
      const size_t n = std::min(kWalkGroup, end - i);
      uint32_t rounds = 1;
      for (size_t k = 0; k < n; ++k) rounds = std::max(rounds, walk_.depths[i + k]);
      walkGroup(kernel_, walk_.nodes.data(), walk_.roots.data() + i, walk_.rootNodes.data() + i,
                rounds, x, slots, leaves);
      for (size_t k = 0; k < n; ++k) {
        const float v = walk_.depths[i + k] != 0 ? leaves[k] : leafValue(trees_[i + k], features);
        sum += static_cast<double>(v);
      }
    }
    return sum;
  }

  std::vector<FlatTree> trees_;
  double baseScore_ = 0.0;
  FlatTree selector_;
  std::vector<uint32_t> modelIndexMap_;
  std::vector<bool> equalityMask_;
  std::vector<uint32_t> featureMapping_;
  bool remap_ = false;
  size_t requiredFeatures_ = 0;
  // The plain trees again, laid out for the kernel in use: walk nodes for the
  // vector kernel (FastTreeEnsembleSimd.h), complete trees for the scalar one
  // (CompleteTreeWalk.h). Empty until a kernel needs it, and when it cannot
  // take any tree of this forest.
  WalkForest walk_;
  CompleteForest complete_;
  WalkKernel kernel_;
};

template <typename FeatureIdT, typename NodeIndexT>
bool FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::init(const Forest* forest, bool remap) {
  if (forest == nullptr) return false;
  trees_.clear();
  walk_ = WalkForest{};
  complete_ = CompleteForest{};
  baseScore_ = forest->baseScore;
  featureMapping_ = forest->featureMapping;
  requiredFeatures_ = 0;
  if (remap && featureMapping_.empty()) {
    LOG(ERROR) << "Wanted to remap but featureMapping empty";
  }
  remap_ = remap && !featureMapping_.empty();
  buildEqualityMask(*forest, remap);

  CompileScratch scratch;
  trees_.reserve(forest->trees.size());
  for (size_t i = 0; i < forest->trees.size(); ++i) {
    const WeightedTree& entry = forest->trees[i];
    if (entry.weight == 0.0) continue;
    if (!entry.tree || !entry.tree->root) throw std::runtime_error(label(i) + " has no nodes");
    FlatTree flat;
    compileTree(*entry.tree->root, entry.weight, flat, i, scratch);
    trees_.push_back(std::move(flat));
  }

  selector_ = FlatTree{};
  const WeightedTree& selector = forest->modelSelector;
  if (selector.weight != 0.0 && selector.tree) {
    if (!selector.tree->root) throw std::runtime_error(label(kSelector) + " has no nodes");
    compileTree(*selector.tree->root, 1.0, selector_, kSelector, scratch);
  }
  buildWalkCopy();

  modelIndexMap_ = forest->modelIndexMap;
  for (size_t i = 1; i < modelIndexMap_.size(); ++i) {
    if (modelIndexMap_[i] < modelIndexMap_[i - 1]) {
      LOG(ERROR) << "modelIndexMap is not monotonically increasing!";
      return false;
    }
  }
  return true;
}

template <typename FeatureIdT, typename NodeIndexT>
void FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::unnormalizedScores(const float* rows, size_t numRows,
                                                                     size_t rowStride, double* out) const {
  if (numRows == 0) return;
  if (rowStride < requiredFeatures_) {
    throw std::invalid_argument("rows are " + std::to_string(rowStride) +
                                " entries apart but the compiled forest reads position " +
                                std::to_string(requiredFeatures_ - 1));
  }
  if (numRows < fewestBlockRows()) {
    for (size_t r = 0; r < numRows; ++r) out[r] = scoreRow(rows + r * rowStride);
    return;
  }
  const size_t slots = requiredFeatures_ + 1;
  std::vector<uint32_t> keys(
      requiredFeatures_ <= kMaxBlockCopy ? std::max(completeBlockKeyWords(slots), 2 * slots * kBlockRows) : 0);
  static_assert(sizeof(float) == sizeof(uint32_t), "the rows copied by feature fit the keys");
  // Rows of a window, sorted by the range of trees they select, go to the
  // walks in blocks of one range each.
  const float* row[kWindow];
  std::pair<size_t, size_t> range[kWindow];
  uint32_t order[kWindow];
  const float* block[kBlockRows];
  alignas(64) double sums[kBlockRows];
  for (size_t w = 0; w < numRows; w += kWindow) {
    const size_t count = std::min(kWindow, numRows - w);
    for (size_t k = 0; k < count; ++k) {
      row[k] = rows + (w + k) * rowStride;
      range[k] = selectModel(row[k]);
      order[k] = static_cast<uint32_t>(k);
    }
    if (!selector_.nodes.empty()) {
      std::stable_sort(order, order + count, [&](uint32_t a, uint32_t b) { return range[a] < range[b]; });
    }
    for (size_t k = 0; k < count;) {
      const std::pair<size_t, size_t> r = range[order[k]];
      size_t n = 0;
      for (; k < count && n < kBlockRows && range[order[k]] == r; ++k, ++n) block[n] = row[order[k]];
      scoreBlock(block, n, r.first, r.second, keys.data(), sums);
      for (size_t i = 0; i < n; ++i) out[w + order[k - n + i]] = sums[i];
    }
  }
}

template <typename FeatureIdT, typename NodeIndexT>
bool FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::gatherable(const FlatTree& tree) {
  return !tree.hasEqualityFeature && tree.depth <= kMaxGatherDepth &&
         tree.nodes.size() <= kWalkMaxDistance;
}

template <typename FeatureIdT, typename NodeIndexT>
void FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::buildWalkCopy() {
  if (requiredFeatures_ > kMaxGatherFeatures) return;
  const auto nanSlot = static_cast<uint32_t>(requiredFeatures_);
  if (kernel_ == WalkKernel::kAvx512 && walk_.empty()) {
    walk_ = buildWalkForest(trees_, kLeaf, nanSlot, gatherable);
  }
  // The block walk of the vector kernel walks complete trees.
  const bool blockWalk = kernel_ == WalkKernel::kAvx512 && completeBlockSupported();
  if ((kernel_ == WalkKernel::kScalar || blockWalk) && complete_.empty()) {
    complete_ = buildCompleteForest(trees_, kLeaf, nanSlot,
                                    [](const FlatTree& tree) { return !tree.hasEqualityFeature; });
  }
}

template <typename FeatureIdT, typename NodeIndexT>
void FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::buildEqualityMask(const Forest& forest,
                                                                    bool remap) {
  equalityMask_.clear();
  if (featureMapping_.empty()) return;  // no feature is an equality feature
  const uint64_t maskSize =
      uint64_t{*std::max_element(featureMapping_.begin(), featureMapping_.end())} + 1;
  // Only positions a split can address are ever looked up.
  const uint64_t addressable = remap ? uint64_t(kMaxFeatureId) + 1 : featureMapping_.size();
  std::vector<uint64_t> set;
  set.reserve(forest.equalityFeatures.size());
  for (uint32_t e : forest.equalityFeatures) {
    uint64_t position = e;
    if (remap) {
      if (e >= featureMapping_.size()) {
        throw std::range_error("equality feature entry " + std::to_string(e) +
                               " is outside the featureMapping of " +
                               std::to_string(featureMapping_.size()) + " entries");
      }
      position = featureMapping_[e];
    }
    if (position >= maskSize) {
      throw std::range_error("equality feature " + std::to_string(position) +
                             " is outside the equality mask of " + std::to_string(maskSize) +
                             " features");
    }
    if (position < addressable) set.push_back(position);
  }
  if (set.empty()) return;
  equalityMask_.assign(*std::max_element(set.begin(), set.end()) + 1, false);
  for (uint64_t position : set) equalityMask_[position] = true;
}

template <typename FeatureIdT, typename NodeIndexT>
void FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::throwBadPosition(int32_t featureId, size_t tree) const {
  if (remap_) {
    throw std::range_error("split in " + label(tree) + " tests feature id " + std::to_string(featureId) +
                           " after remapping; ids must be 0 to " + std::to_string(kMaxFeatureId));
  }
  throw std::range_error("split in " + label(tree) + " tests feature position " +
                         std::to_string(featureId) + ", outside the feature vector of " +
                         std::to_string(featureMapping_.size()) + " positions");
}

template <typename FeatureIdT, typename NodeIndexT>
int32_t FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::splitPosition(const LinearNode& split, size_t tree) const {
  int32_t id = split.pivotIndex;
  if (remap_) {
    if (id < 0 || static_cast<uint64_t>(id) >= featureMapping_.size()) {
      throw std::range_error("split in " + label(tree) + " tests feature position " + std::to_string(id) +
                             ", outside the featureMapping of " + std::to_string(featureMapping_.size()) +
                             " entries");
    }
    id = static_cast<int32_t>(featureMapping_[id]);
  }
  if (int64_t{id} > kMaxFeatureId) {
    throw std::range_error("feature id > max size. Use large type for FeatureIdT");
  }
  return checkedPosition(id, tree);
}

template <typename FeatureIdT, typename NodeIndexT>
size_t FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::claimChildren(std::vector<FlatNode>& nodes, size_t& used) {
  const size_t first = used;
  if (first >= kNodeIndexLimit) {
    throw std::range_error("node index > max size. Use large type for NodeIndexT");
  }
  // The buffer doubles ahead of need, so that most claims are a compare and
  // an add, and the children's slots are written in place later.
  if (first + 2 > nodes.size()) nodes.resize(2 * nodes.size());
  used = first + 2;
  return first;
}

template <typename FeatureIdT, typename NodeIndexT>
void FastTreeEnsembleOOP<FeatureIdT, NodeIndexT>::compileTree(const Node& root, double scale,
                                                              FlatTree& out, size_t tree,
                                                              CompileScratch& scratch) {
  std::vector<Pending>& pending = scratch.pending;
  std::vector<FlatNode>& nodes = scratch.nodes;  // nodes[0, used) hold this tree
  if (nodes.size() < 64) nodes.resize(64);
  size_t used = 1;
  out.hasEqualityFeature = false;
  out.depth = 0;
  out.leafDepth = std::numeric_limits<uint32_t>::max();
  // Depth first: go down each left spine at once, keeping right children for
  // later, so that left subtrees are laid out before right ones. A node's slot
  // is written when the walk reaches it.
  pending.assign(1, Pending{&root, 0, 0});
  while (!pending.empty()) {
    Pending p = pending.back();
    pending.pop_back();
    for (;;) {
      if (p.node == nullptr) throw std::runtime_error(label(tree) + " has a split without both children");
      out.depth = std::max(out.depth, p.depth);
      if (p.node->isLeaf()) {
        out.leafDepth = std::min(out.leafDepth, p.depth);
        const double value = static_cast<const ConstantNode*>(p.node)->value * scale;
        nodes[p.slot] = FlatNode{kLeaf, 0, static_cast<float>(value)};
        break;
      }
      const auto& split = *static_cast<const LinearNode*>(p.node);
      const int32_t position = splitPosition(split, tree);
      const size_t first = claimChildren(nodes, used);
      nodes[p.slot] = FlatNode{static_cast<FeatureIdT>(position), static_cast<NodeIndexT>(first),
                               static_cast<float>(split.pivotValue)};
      if (!out.hasEqualityFeature) out.hasEqualityFeature = isEquality(position);
      requiredFeatures_ = std::max<size_t>(requiredFeatures_, size_t(position) + 1);
      // The right child waits; the walk goes on with the left one. The work
      // item is written field by field: a whole temporary copied in would be
      // read back before its parts are stored, which stalls loads.
      const uint32_t below = p.depth == UINT32_MAX ? p.depth : p.depth + 1;
      Pending& right = pending.emplace_back();
      right.node = split.right.get();
      right.slot = first + 1;
      right.depth = below;
      p.node = split.left.get();
      p.slot = first;
      p.depth = below;
    }
  }
  out.nodes.assign(nodes.begin(), nodes.begin() + static_cast<ptrdiff_t>(used));
}

}  // namespace thornvale
