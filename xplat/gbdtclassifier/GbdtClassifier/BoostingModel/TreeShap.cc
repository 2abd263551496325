#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/TreeShap.h"

#include <algorithm>
#include <cmath>
#include <cstring>
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


// Trees whose paths test more distinct positions take the published walk.
constexpr uint32_t kMaxPolynomialPositions = 32;

// P_n(x) and P_{n-1}(x), Legendre polynomials by their three-term recurrence.
std::pair<double, double> legendre(size_t n, double x) {
  double previous = 1.0;
  double current = x;
  for (size_t k = 1; k < n; ++k) {
    const double next = (static_cast<double>(2 * k + 1) * x * current - static_cast<double>(k) * previous) /
                        static_cast<double>(k + 1);
    previous = current;
    current = next;
  }
  return {current, previous};
}

// The n nodes and weights of Gauss-Legendre quadrature on [-1, 1]: roots
// bracketed on a grid and bisected to the last bit. Only + - * / of doubles,
// so every platform gets the same bits.
void gaussLegendre(size_t n, std::vector<double>& nodes, std::vector<double>& weights) {
  nodes.clear();
  weights.clear();
  const size_t steps = 64 * n * n;
  double a = -1.0;
  double fa = legendre(n, a).first;
  for (size_t s = 1; s <= steps && nodes.size() < n; ++s) {
    double b = -1.0 + 2.0 * static_cast<double>(s) / static_cast<double>(steps);
    double fb = legendre(n, b).first;
    const double nextA = b;
    const double nextFa = fb;
    if ((fa < 0.0) != (fb < 0.0)) {
      double lo = a, flo = fa, hi = b;
      for (;;) {
        const double mid = lo + (hi - lo) / 2.0;
        if (mid <= lo || mid >= hi) break;
        const double fm = legendre(n, mid).first;
        if (fm == 0.0) {
          lo = hi = mid;
          break;
        }
        if ((fm < 0.0) == (flo < 0.0)) {
          lo = mid;
          flo = fm;
        } else {
          hi = mid;
        }
      }
      const double x = std::abs(flo) <= std::abs(legendre(n, hi).first) ? lo : hi;
      const auto [p, q] = legendre(n, x);
      const double derivative = static_cast<double>(n) * (x * p - q) / (x * x - 1.0);
      nodes.push_back(x);
      weights.push_back(2.0 / ((1.0 - x * x) * derivative * derivative));
    }
    a = nextA;
    fa = nextFa;
  }
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
  // The walk over a tree's path: its nodes, and for each the edge into it
  // that last tested the parent's position before (restored on the way up).
  struct OnPath {
    uint32_t node;
    uint32_t replaced;
  };
  std::vector<OnPath> path;
  std::vector<uint32_t> parent;
  std::vector<uint32_t> lastEdge(numPositions_, kNone);
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

    const auto size = static_cast<uint32_t>(tree.nodes.size());
    ShapTree shapTree{static_cast<uint32_t>(nodes_.size()), size, tree.depth, 0, tree.equalityWalk, 0.0};
    parent.assign(size, kNone);
    for (uint32_t i = 0; i < size; ++i) {
      const PreorderNode& n = tree.nodes[i];
      ShapNode s{kLeaf, 0, 0.0f, false, 1.0, 1.0, {0.0}};
      if (n.node->isLeaf()) {
        s.value = static_cast<double>(static_cast<float>(
            static_cast<const ConstantNode*>(n.node)->value * entry.weight));
      } else {
        s.position = n.position;
        s.right = n.right;
        s.threshold = n.threshold;
        s.equality = n.equality;
        s.sameEdge = kNone;
        parent[i + 1] = i;
        parent[n.right] = i;
      }
      if (parent[i] != kNone) {
        const uint32_t p = parent[i];
        const double c = cover[p];
        s.share = c == 0.0 ? 0.5 : cover[i] / c;
        if (!std::isfinite(s.share)) {
          throw std::invalid_argument(where + ", node " + std::to_string(p) +
                                      ": a child's cover divided by this node's cover " +
                                      std::to_string(c) + " overflows");
        }
      }
      nodes_.push_back(s);
    }
    ShapNode* nodes = nodes_.data() + shapTree.first;

    // Down the tree in pre-order: each edge's merged share of its position,
    // each split's nearest edge on its own position, and the most distinct
    // positions on a path.
    uint32_t distinct = 0;
    uint32_t mostDistinct = 0;
    path.clear();
    for (uint32_t i = 0; i < size; ++i) {
      while (!path.empty() && path.back().node != parent[i]) {
        const uint32_t up = path.back().node;
        lastEdge[static_cast<size_t>(nodes[parent[up]].position)] = path.back().replaced;
        if (path.back().replaced == kNone) --distinct;
        path.pop_back();
      }
      if (i != 0) {
        auto& slot = lastEdge[static_cast<size_t>(nodes[parent[i]].position)];
        nodes[i].zero = nodes[i].share * (slot == kNone ? 1.0 : nodes[slot].zero);
        if (slot == kNone) ++distinct;
        path.push_back({i, slot});
        slot = i;
      } else {
        path.push_back({i, kNone});
      }
      if (nodes[i].position == kLeaf) {
        mostDistinct = std::max(mostDistinct, distinct);
      } else {
        nodes[i].sameEdge = lastEdge[static_cast<size_t>(nodes[i].position)];
      }
    }
    while (path.size() > 1) {  // leave lastEdge clear for the next tree
      const uint32_t up = path.back().node;
      lastEdge[static_cast<size_t>(nodes[parent[up]].position)] = path.back().replaced;
      path.pop_back();
    }
    if (mostDistinct > kMaxPolynomialPositions) {
      shapTree.points = kPublished;
    } else {
      shapTree.points = (mostDistinct + 1) / 2;
      if (rules_.size() <= shapTree.points) rules_.resize(shapTree.points + 1);
      Quadrature& rule = rules_[shapTree.points];
      if (shapTree.points > 0 && rule.point.empty()) {
        gaussLegendre(shapTree.points, rule.point, rule.weight);
        for (size_t q = 0; q < shapTree.points; ++q) {
          rule.point[q] = 0.5 + 0.5 * rule.point[q];
          rule.weight[q] = 0.5 * rule.weight[q];
          rule.unknownFactor.push_back(-rule.weight[q] / (1.0 - rule.point[q]));
        }
      }
    }

    // Cover-weighted mean of the leaves.
    std::vector<std::pair<uint32_t, double>> pending{{0, 1.0}};
    while (!pending.empty()) {
      const auto [i, share] = pending.back();
      pending.pop_back();
      const ShapNode& s = nodes[i];
      if (s.position == kLeaf) {
        shapTree.expectation += share * s.value;
        continue;
      }
      pending.emplace_back(s.right, share * nodes[s.right].share);
      pending.emplace_back(i + 1, share * nodes[i + 1].share);
    }
    trees_.push_back(shapTree);
  }

  const WeightedTree& selector = forest.modelSelector;
  if (!constantScore_ && selector.weight != 0.0 && selector.tree && selector.tree->root) {
    layOut(selector.tree->root.get(), {}, tree);
    for (const PreorderNode& n : tree.nodes) {
      ShapNode s{kLeaf, n.right, n.threshold, false, 1.0, 1.0, {0.0}};
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

size_t TreeShap::tableBytes() const {
  size_t bytes = (nodes_.capacity() + selector_.capacity()) * sizeof(ShapNode) +
                 trees_.capacity() * sizeof(ShapTree) + modelIndexMap_.capacity() * sizeof(uint32_t);
  for (const Quadrature& rule : rules_) bytes += 3 * rule.point.capacity() * sizeof(double);
  return bytes + rules_.capacity() * sizeof(Quadrature);
}

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
  const auto [first, end] = selectTrees(row);
  explainBlock<1>(&row, first, end, &contributions, scratch);
  double bias = baseScore_;
  for (size_t t = first; t < end; ++t) bias += trees_[t].expectation;
  return bias;
}

void TreeShap::explainRows(const float* rows, size_t numRows, size_t stride, double* out) const {
  checkStride(numRows, stride, numPositions_, "explain");
  const size_t width = numPositions_ + 1;
  if (constantScore_) {
    for (size_t r = 0; r < numRows; ++r) out[r * width + numPositions_] = constantRawScore_;
    return;
  }
  // Rows that select the same trees go side by side.
  std::vector<std::pair<std::pair<size_t, size_t>, size_t>> order(numRows);
  for (size_t r = 0; r < numRows; ++r) order[r] = {selectTrees(rows + r * stride), r};
  if (!selector_.empty()) std::sort(order.begin(), order.end());
  Scratch scratch;
  std::vector<double> discarded(numPositions_);
  size_t i = 0;
  while (i < numRows) {
    const auto [first, end] = order[i].first;
    size_t group = i;
    while (group < numRows && order[group].first == order[i].first) ++group;
    for (; i < group;) {
      const size_t take = std::min(kBlock, group - i);
      double bias = baseScore_;
      for (size_t t = first; t < end; ++t) bias += trees_[t].expectation;
      if (take < 3) {
        for (size_t k = 0; k < take; ++k, ++i) {
          const float* row = rows + order[i].second * stride;
          double* o = out + order[i].second * width;
          explainBlock<1>(&row, first, end, &o, scratch);
          o[numPositions_] = bias;
        }
        continue;
      }
      // A short block repeats its last row into the spare lanes.
      const float* blockRows[kBlock];
      double* blockOut[kBlock];
      for (size_t k = 0; k < kBlock; ++k) {
        const size_t r = order[i + std::min(k, take - 1)].second;
        blockRows[k] = rows + r * stride;
        blockOut[k] = k < take ? out + r * width : discarded.data();
      }
      explainBlock<kBlock>(blockRows, first, end, blockOut, scratch);
      for (size_t k = 0; k < take; ++k) blockOut[k][numPositions_] = bias;
      i += take;
    }
  }
}

template <size_t K>
void TreeShap::explainBlock(const float* const* rows, size_t first, size_t end, double* const* out,
                            Scratch& scratch) const {
  std::vector<double>& lanes = scratch.lanes;
  lanes.assign(numPositions_ * K, 0.0);
  for (size_t t = first; t < end; ++t) {
    const ShapTree& tree = trees_[t];
    if (tree.points == 0) continue;
    if (tree.points == kPublished) {
      for (size_t l = 0; l < K; ++l) explainTreePublished(tree, rows[l], lanes.data() + l, K, scratch);
      continue;
    }
    explainTreeInLanes<K>(tree, rows, scratch);
  }
  for (size_t l = 0; l < K; ++l) {
    for (size_t p = 0; p < numPositions_; ++p) out[l][p] = lanes[p * K + l];
  }
}

namespace {

// Rows side by side: K doubles that arithmetic treats lane by lane, each lane
// exactly as a double alone (one rounding per operation, no contraction).
template <size_t K>
struct LaneTraits {
  typedef double Lanes __attribute__((vector_size(K * sizeof(double))));
};
template <>
struct LaneTraits<1> {
  using Lanes = double;
};

template <size_t K>
using Lanes = typename LaneTraits<K>::Lanes;

// Loads and stores that need no alignment. These stay within this file, so
// the note that wide vectors pass differently without AVX-512 is moot.
#if defined(__clang__)
#pragma clang diagnostic ignored "-Wpsabi"
#elif defined(__GNUC__)
#pragma GCC diagnostic ignored "-Wpsabi"
#endif
template <typename V>
inline V loadLanes(const double* p) {
  V v;
  std::memcpy(&v, p, sizeof v);
  return v;
}

template <typename V>
inline void storeLanes(double* p, const V& v) {
  std::memcpy(p, &v, sizeof v);
}

}  // namespace

// The polynomial walk over one tree for K rows in lanes. Arrays are indexed
// [node][point][lane]; `products` holds, on the way down, each node's product
// over the positions on its path of (o y + z (1 - y)) at the points, and once
// a split's children have theirs, it collects the leaf sums that the split's
// deeper namesakes take away from the edge into it.
template <size_t K>
void TreeShap::explainTreeInLanes(const ShapTree& tree, const float* const* rows, Scratch& scratch) const {
  using V = Lanes<K>;
  const ShapNode* nodes = nodes_.data() + tree.first;
  const size_t size = tree.size;
  const size_t points = tree.points;
  const Quadrature& rule = rules_[points];
  const double* y = rule.point.data();
  const size_t cells = size * points * K;
  if (scratch.products.size() < cells) {
    scratch.products.resize(cells);
    scratch.sums.resize(cells);
  }
  if (scratch.known.size() < size * K) scratch.known.resize(size * K);
  if (scratch.inverses.size() < size * points * 2) scratch.inverses.resize(size * points * 2);
  double* const product = scratch.products.data();
  double* const sum = scratch.sums.data();
  double* const known = scratch.known.data();
  double* const inverse = scratch.inverses.data();
  double* const lanes = scratch.lanes.data();

  // Per node and point, the inverse of its factor for a row that takes the
  // node's branches, 1 / (y + z (1 - y)), and for one that does not,
  // 1 / (z (1 - y)) (0 when z is 0: everything below is 0 then).
  for (size_t c = 1; c < size; ++c) {
    const double z = nodes[c].zero;
    // Kept finite, so that multiplying it by 0 gives 0: a z this small
    // leaves nothing of the path anyway.
    const double inverseZero = z == 0.0 ? 0.0 : std::min(1.0 / z, 1e300);
    for (size_t q = 0; q < points; ++q) {
      const double unknown = 1.0 - y[q];
      inverse[(c * points + q) * 2] = 1.0 / (y[q] + z * unknown);
      inverse[(c * points + q) * 2 + 1] = inverseZero / unknown;
    }
  }

  // Down: each child's product is its parent's without the factor of the
  // parent's position, times the merged factor of that position. Known is 1
  // or 0, so known * y + z (1 - y) is exactly one of the two factors, and
  // k * a + (1 - k) * b exactly a or b: choices are made by arithmetic, not
  // by branches, as rows in lanes go every which way.
  std::fill(product, product + points * K, 1.0);
  for (size_t s = 0; s < size; ++s) {
    const ShapNode& n = nodes[s];
    if (n.position == kLeaf) continue;
    const size_t left = s + 1;
    const size_t right = n.right;
    const uint32_t e = n.sameEdge;
    double was[K];
    for (size_t l = 0; l < K; ++l) {
      const float x = rows[l][n.position];
      const bool goes = goesRight(tree.equalityWalk, s == 0, n.equality, x, n.threshold);
      was[l] = e == kNone ? 1.0 : known[e * K + l];
      known[right * K + l] = was[l] != 0.0 && goes ? 1.0 : 0.0;
      known[left * K + l] = was[l] != 0.0 && !goes ? 1.0 : 0.0;
    }
    const V before = loadLanes<V>(was);
    const V knownLeft = loadLanes<V>(known + left * K);
    const V knownRight = loadLanes<V>(known + right * K);
    const double zeroLeft = nodes[left].zero;
    const double zeroRight = nodes[right].zero;
    for (size_t q = 0; q < points; ++q) {
      const double unknown = 1.0 - y[q];
      double* const p = product + (s * points + q) * K;
      V base = loadLanes<V>(p);
      if (e != kNone) {
        const double takenInverse = inverse[(e * points + q) * 2];
        const double missedInverse = inverse[(e * points + q) * 2 + 1];
        base = base * (before * takenInverse + (1.0 - before) * missedInverse);
      }
      storeLanes(product + (left * points + q) * K, base * (knownLeft * y[q] + zeroLeft * unknown));
      storeLanes(product + (right * points + q) * K, base * (knownRight * y[q] + zeroRight * unknown));
      std::fill(p, p + K, 0.0);
    }
  }

  // Up: a split's children are done before it. The edge into child c adds
  // (o - z) * sum_q w_q R(y_q) / factor(y_q) to the split's position, R being
  // the sum of the leaves below c whose last test of that position is this
  // edge; (o - z) / factor is (1 - z) / (y + z (1 - y)) for o = 1 and
  // -1 / (1 - y) for o = 0.
  for (size_t s = size; s-- > 0;) {
    const ShapNode& n = nodes[s];
    if (n.position == kLeaf) continue;
    double* const out = lanes + static_cast<size_t>(n.position) * K;
    for (const size_t c : {s + 1, static_cast<size_t>(n.right)}) {
      const ShapNode& child = nodes[c];
      const bool leaf = child.position == kLeaf;
      const V knownChild = loadLanes<V>(known + c * K);
      V total = loadLanes<V>(out) * 0.0;
      for (size_t q = 0; q < points; ++q) {
        double* const sc = sum + (c * points + q) * K;
        const V pc = loadLanes<V>(product + (c * points + q) * K);
        // For a row that takes the edge's branches, and for one that does not.
        const double taken = rule.weight[q] * (1.0 - child.zero) * inverse[(c * points + q) * 2];
        const double missed = rule.unknownFactor[q];
        V r;
        if (leaf) {
          r = child.value * pc;
          storeLanes(sc, r);
        } else {
          r = loadLanes<V>(sc) + pc;
        }
        total += r * (knownChild * taken + (1.0 - knownChild) * missed);
      }
      storeLanes(out, loadLanes<V>(out) + total);
    }
    for (size_t q = 0; q < points; ++q) {
      const V whole = loadLanes<V>(sum + ((s + 1) * points + q) * K) + loadLanes<V>(sum + (n.right * points + q) * K);
      storeLanes(sum + (s * points + q) * K, whole);
      if (n.sameEdge != kNone) {
        double* const r = product + (n.sameEdge * points + q) * K;
        storeLanes(r, loadLanes<V>(r) - whole);
      }
    }
  }
}

// Path-dependent tree SHAP as published, walked with an explicit stack. Each
// visited node holds the path of unique positions from the root: for each,
// the share of the expectation that reaches this far when the position is
// unknown (zero) or known (one: 1 if the row took the branches, 0 otherwise),
// and the permutation weights of the subsets along the path. A node's path is
// a copy of its parent's, extended by the split that leads to it; when a
// position repeats, its earlier entry is unwound and merged into the new one.
// Contributions go to contributions[position * stride].
void TreeShap::explainTreePublished(const ShapTree& tree, const float* row, double* contributions,
                                    size_t stride, Scratch& scratch) const {
  using PathEntry = Scratch::PathEntry;
  using Frame = Scratch::Frame;
  const ShapNode* nodes = nodes_.data() + tree.first;
  std::vector<PathEntry>& paths = scratch.paths;
  std::vector<Frame>& frames = scratch.frames;
  frames.clear();
  // Frame: the node, where its parent's path lies (pathStart, pathLength
  // entries) and the entry that the edge into the node adds.
  frames.push_back({0, 0, 0, 1.0, 1.0, -1});
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

    const ShapNode& node = nodes[f.node];
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
        contributions[static_cast<size_t>(m[i].position) * stride] +=
            total * (m[i].one - m[i].zero) * node.value;
      }
      continue;
    }

    const float x = readPosition(row, numPositions_, node.position);
    const bool right = goesRight(tree.equalityWalk, f.node == 0, node.equality, x, node.threshold);
    const uint32_t hot = right ? node.right : f.node + 1;
    const uint32_t cold = right ? f.node + 1 : node.right;
    const double hotShare = nodes[hot].share;
    const double coldShare = nodes[cold].share;

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
