#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/TreeShap.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <stdexcept>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

namespace thornvale {
namespace {

constexpr uint32_t kMissing = std::numeric_limits<uint32_t>::max();

// One node of a tree laid out in pre-order, as the compiled walk sees it.
struct PreorderNode {
  const Node* node;
  int32_t position;  // split: vector position; -1 for a leaf
  uint32_t right;    // split: index of the right child, kMissing when absent
  bool hasLeft;      // split: the left child (next index) is present
  float threshold;   // split: pivotValue rounded to float
  bool equality;     // split: tests an equality feature
};

struct PreorderTree {
  std::vector<PreorderNode> nodes;
  bool equalityWalk = false;  // some split tests an equality feature
  uint32_t depth = 0;
};

// Equality features by position; empty without a featureMapping, as in the
// compiled forest.
std::vector<bool> equalityPositions(const Forest& forest) {
  std::vector<bool> mask;
  if (forest.featureMapping.empty()) return mask;
  mask.assign(forest.featureMapping.size(), false);
  for (uint32_t e : forest.equalityFeatures) {
    if (e < mask.size()) mask[e] = true;
  }
  return mask;
}

// Lays out `root` in pre-order. Absent children (possible only in trees that
// scoring skips) are left out and marked.
void layOut(const Node* root, const std::vector<bool>& equality, PreorderTree& out) {
  out.nodes.clear();
  out.equalityWalk = false;
  out.depth = 0;
  if (root == nullptr) return;
  struct Pending {
    const Node* node;
    uint32_t parent;
    bool isRight;
    uint32_t depth;
  };
  std::vector<Pending> pending{{root, kMissing, false, 0}};
  while (!pending.empty()) {
    const Pending p = pending.back();
    pending.pop_back();
    const auto index = static_cast<uint32_t>(out.nodes.size());
    if (p.parent != kMissing) {
      if (p.isRight) {
        out.nodes[p.parent].right = index;
      } else {
        out.nodes[p.parent].hasLeft = true;
      }
    }
    out.depth = std::max(out.depth, p.depth);
    if (p.node->isLeaf()) {
      out.nodes.push_back({p.node, -1, kMissing, false, 0.0f, false});
      continue;
    }
    const auto& s = static_cast<const LinearNode&>(*p.node);
    const int32_t position = s.pivotIndex;
    const bool eq = position >= 0 && static_cast<size_t>(position) < equality.size() &&
                    equality[static_cast<size_t>(position)];
    out.equalityWalk = out.equalityWalk || eq;
    out.nodes.push_back({p.node, position, kMissing, false, static_cast<float>(s.pivotValue), eq});
    if (s.right) pending.push_back({s.right.get(), index, true, p.depth + 1});
    if (s.left) pending.push_back({s.left.get(), index, false, p.depth + 1});
  }
}

// Whether the compiled walk takes the right (second) child for `x`. A plain
// tree tests !(x <= t) at the root and x > t below it, so NaN goes right at
// the root and left deeper down; a tree with an equality feature tests
// x != t at equality splits and x > t everywhere else.
bool goesRight(bool equalityWalk, bool isRoot, bool equality, float x, float t) {
  if (equalityWalk) return equality ? x != t : x > t;
  return isRoot ? !(x <= t) : x > t;
}

float readPosition(const float* row, size_t numPositions, int32_t position) {
  return position >= 0 && static_cast<size_t>(position) < numPositions
             ? row[static_cast<size_t>(position)]
             : 0.0f;
}

void checkStride(size_t numRows, size_t stride, size_t length, const char* what) {
  if (numRows > 0 && stride < length) {
    throw std::invalid_argument(std::string(what) + ": rows are " + std::to_string(stride) +
                                " entries apart but a feature vector has " + std::to_string(length));
  }
}

// Selector leaf value as a model number: truncation toward zero, NaN and
// negative values give 0, values past the range the largest value.
uint32_t modelNumber(float v) {
  if (!(v >= 1.0f)) return 0;
  if (v >= 4294967296.0f) return std::numeric_limits<uint32_t>::max();
  return static_cast<uint32_t>(v);
}

}  // namespace

TreeCovers backgroundCovers(const BoostingModel& model, const float* rows, size_t numRows,
                            size_t stride) {
  const size_t length = model.vectorLength();
  checkStride(numRows, stride, length, "background covers");
  const Forest& forest = model.getForest();
  const std::vector<bool> equality = equalityPositions(forest);
  TreeCovers covers(forest.trees.size());
  PreorderTree tree;
  for (size_t t = 0; t < forest.trees.size(); ++t) {
    const WeightedTree& entry = forest.trees[t];
    layOut(entry.tree ? entry.tree->root.get() : nullptr, equality, tree);
    std::vector<double>& cover = covers[t];
    cover.assign(tree.nodes.size(), 0.0);
    if (tree.nodes.empty()) continue;
    for (size_t r = 0; r < numRows; ++r) {
      const float* row = rows + r * stride;
      uint32_t i = 0;
      while (i != kMissing) {
        cover[i] += 1.0;
        const PreorderNode& n = tree.nodes[i];
        if (n.node->isLeaf()) break;
        const float x = readPosition(row, length, n.position);
        if (goesRight(tree.equalityWalk, i == 0, n.equality, x, n.threshold)) {
          i = n.right;
        } else {
          i = n.hasLeft ? i + 1 : kMissing;
        }
      }
    }
  }
  return covers;
}

TreeShap::TreeShap(const BoostingModel& model, const TreeCovers& covers)
    : numPositions_(model.vectorLength()), constantScore_(model.hasConstantScore()) {
  const Forest& forest = model.getForest();
  if (covers.size() != forest.trees.size()) {
    throw std::invalid_argument("covers are given for " + std::to_string(covers.size()) +
                                " trees but the model has " + std::to_string(forest.trees.size()));
  }
  if (constantScore_) constantRawScore_ = model.getEnsemble().unnormalizedScoreOfZeros();
  baseScore_ = forest.baseScore;
  modelIndexMap_ = forest.modelIndexMap;
  const std::vector<bool> equality = equalityPositions(forest);
  PreorderTree tree;
  for (size_t t = 0; t < forest.trees.size(); ++t) {
    const WeightedTree& entry = forest.trees[t];
    layOut(entry.tree ? entry.tree->root.get() : nullptr, equality, tree);
    const std::vector<double>& cover = covers[t];
    const std::string where = "covers of tree " + std::to_string(t);
    if (cover.size() != tree.nodes.size()) {
      throw std::invalid_argument(where + ": the tree has " + std::to_string(tree.nodes.size()) +
                                  " nodes but " + std::to_string(cover.size()) +
                                  " covers were given (one per node, in pre-order)");
    }
    for (size_t i = 0; i < cover.size(); ++i) {
      if (!std::isfinite(cover[i]) || cover[i] < 0.0) {
        throw std::invalid_argument(where + ", node " + std::to_string(i) + ": cover " +
                                    std::to_string(cover[i]) + " is not a finite number >= 0");
      }
    }
    // Trees that scoring drops are only checked; a dropped tree with an
    // absent node never reaches the lines below.
    if (entry.weight == 0.0 || constantScore_) continue;

    ShapTree shapTree{static_cast<uint32_t>(nodes_.size()), tree.depth, tree.equalityWalk, 0.0};
    for (size_t i = 0; i < tree.nodes.size(); ++i) {
      const PreorderNode& n = tree.nodes[i];
      ShapNode s{kLeaf, 0, 0.0f, false, 0.0, 0.0, 0.0};
      if (n.node->isLeaf()) {
        s.value = static_cast<double>(static_cast<float>(
            static_cast<const ConstantNode*>(n.node)->value * entry.weight));
      } else {
        s.position = n.position;
        s.right = shapTree.first + n.right;
        s.threshold = n.threshold;
        s.equality = n.equality;
        const double c = cover[i];
        if (c == 0.0) {
          s.leftShare = 0.5;
          s.rightShare = 0.5;
        } else {
          s.leftShare = cover[i + 1] / c;
          s.rightShare = cover[n.right] / c;
          if (!std::isfinite(s.leftShare) || !std::isfinite(s.rightShare)) {
            throw std::invalid_argument(where + ", node " + std::to_string(i) +
                                        ": a child's cover divided by this node's cover " +
                                        std::to_string(c) + " overflows");
          }
        }
      }
      nodes_.push_back(s);
    }
    // Cover-weighted mean of the leaves.
    std::vector<std::pair<uint32_t, double>> pending{{shapTree.first, 1.0}};
    while (!pending.empty()) {
      const auto [i, share] = pending.back();
      pending.pop_back();
      const ShapNode& s = nodes_[i];
      if (s.position == kLeaf) {
        shapTree.expectation += share * s.value;
        continue;
      }
      pending.emplace_back(s.right, share * s.rightShare);
      pending.emplace_back(i + 1, share * s.leftShare);
    }
    trees_.push_back(shapTree);
  }

  const WeightedTree& selector = forest.modelSelector;
  if (!constantScore_ && selector.weight != 0.0 && selector.tree && selector.tree->root) {
    layOut(selector.tree->root.get(), {}, tree);
    for (const PreorderNode& n : tree.nodes) {
      ShapNode s{kLeaf, n.right, n.threshold, false, 0.0, 0.0, 0.0};
      if (n.node->isLeaf()) {
        s.value = static_cast<double>(static_cast<float>(static_cast<const ConstantNode*>(n.node)->value));
      } else {
        s.position = n.position;
      }
      selector_.push_back(s);
    }
  }
}

TreeShap::~TreeShap() = default;

std::pair<size_t, size_t> TreeShap::selectTrees(const float* row) const {
  const size_t n = trees_.size();
  if (selector_.empty()) return {0, n};
  uint32_t i = 0;
  while (selector_[i].position != kLeaf) {
    const ShapNode& s = selector_[i];
    const float x = readPosition(row, numPositions_, s.position);
    i = goesRight(false, i == 0, false, x, s.threshold) ? s.right : i + 1;
  }
  const uint64_t k = modelIndexMap_.size();
  // A model number past the last boundary selects the last sub-model.
  const uint64_t m = std::min<uint64_t>(modelNumber(static_cast<float>(selector_[i].value)), k);
  const size_t first = m == 0 ? 0 : std::min<size_t>(modelIndexMap_[m - 1], n);
  const size_t end = m >= k ? n : std::min<size_t>(modelIndexMap_[m], n);
  return {first, std::max(first, end)};
}

double TreeShap::explain(const float* row, double* contributions, Scratch& scratch) const {
  if (constantScore_) return constantRawScore_;
  std::fill(contributions, contributions + numPositions_, 0.0);
  const auto [first, end] = selectTrees(row);
  double bias = baseScore_;
  for (size_t t = first; t < end; ++t) {
    bias += trees_[t].expectation;
    explainTree(trees_[t], row, contributions, scratch);
  }
  return bias;
}

void TreeShap::explainRows(const float* rows, size_t numRows, size_t stride, double* out) const {
  checkStride(numRows, stride, numPositions_, "explain");
  Scratch scratch;
  const size_t width = numPositions_ + 1;
  for (size_t r = 0; r < numRows; ++r) {
    double* o = out + r * width;
    o[numPositions_] = explain(rows + r * stride, o, scratch);
  }
}

// Path-dependent tree SHAP, walked with an explicit stack. Each visited node
// holds the path of unique positions from the root: for each, the share of
// the expectation that reaches this far when the position is unknown (zero)
// or known (one: 1 if the row took the branches, 0 otherwise), and the
// permutation weights of the subsets along the path. A node's path is a copy
// of its parent's, extended by the split that leads to it; when a position
// repeats, its earlier entry is unwound and merged into the new one.
void TreeShap::explainTree(const ShapTree& tree, const float* row, double* contributions,
                           Scratch& scratch) const {
  using PathEntry = Scratch::PathEntry;
  using Frame = Scratch::Frame;
  std::vector<PathEntry>& paths = scratch.paths;
  std::vector<Frame>& frames = scratch.frames;
  frames.clear();
  // Frame: the node, where its parent's path lies (pathStart, pathLength
  // entries) and the entry that the edge into the node adds.
  frames.push_back({tree.first, 0, 0, 1.0, 1.0, -1});
  while (!frames.empty()) {
    const Frame f = frames.back();
    frames.pop_back();
    const uint32_t l = f.pathLength;
    const size_t start = f.pathStart + l;
    if (paths.size() < start + l + 1) paths.resize(std::max(start + l + 1, 2 * paths.size()));
    PathEntry* m = paths.data() + start;
    std::copy(paths.data() + f.pathStart, paths.data() + f.pathStart + l, m);

    // Extend the path by the edge into this node.
    m[l] = {f.position, f.zero, f.one, l == 0 ? 1.0 : 0.0};
    const double lp1 = static_cast<double>(l) + 1.0;
    for (uint32_t i = l; i-- > 0;) {
      m[i + 1].weight += f.one * m[i].weight * (static_cast<double>(i) + 1.0) / lp1;
      m[i].weight = f.zero * m[i].weight * static_cast<double>(l - i) / lp1;
    }

    const ShapNode& node = nodes_[f.node];
    if (node.position == kLeaf) {
      for (uint32_t i = 1; i <= l; ++i) {
        // Sum of the path weights with entry i unwound.
        const double one = m[i].one;
        const double zero = m[i].zero;
        double next = m[l].weight;
        double total = 0.0;
        for (uint32_t j = l; j-- > 0;) {
          const double lj = static_cast<double>(l - j) / lp1;
          if (one != 0.0) {
            const double t = next * lp1 / ((static_cast<double>(j) + 1.0) * one);
            total += t;
            next = m[j].weight - t * zero * lj;
          } else {
            total += (m[j].weight / zero) / lj;
          }
        }
        contributions[m[i].position] += total * (m[i].one - m[i].zero) * node.value;
      }
      continue;
    }

    const float x = readPosition(row, numPositions_, node.position);
    const bool right = goesRight(tree.equalityWalk, f.node == tree.first, node.equality, x,
                                 node.threshold);
    const uint32_t hot = right ? node.right : f.node + 1;
    const uint32_t cold = right ? f.node + 1 : node.right;
    const double hotShare = right ? node.rightShare : node.leftShare;
    const double coldShare = right ? node.leftShare : node.rightShare;

    double zero = 1.0;
    double one = 1.0;
    uint32_t length = l + 1;
    for (uint32_t k = 1; k <= l; ++k) {
      if (m[k].position != node.position) continue;
      zero = m[k].zero;
      one = m[k].one;
      // Unwind entry k.
      double next = m[l].weight;
      for (uint32_t j = l; j-- > 0;) {
        if (one != 0.0) {
          const double t = m[j].weight;
          m[j].weight = next * lp1 / ((static_cast<double>(j) + 1.0) * one);
          next = t - m[j].weight * zero * static_cast<double>(l - j) / lp1;
        } else {
          m[j].weight = m[j].weight * lp1 / (zero * static_cast<double>(l - j));
        }
      }
      for (uint32_t j = k; j < l; ++j) {
        m[j].position = m[j + 1].position;
        m[j].zero = m[j + 1].zero;
        m[j].one = m[j + 1].one;
      }
      length = l;
      break;
    }
    // A child whose entry has no share either way adds nothing.
    if (zero * coldShare != 0.0) {
      frames.push_back({cold, length, start, zero * coldShare, 0.0, node.position});
    }
    if (zero * hotShare != 0.0 || one != 0.0) {
      frames.push_back({hot, length, start, zero * hotShare, one, node.position});
    }
  }
}

}  // namespace thornvale
