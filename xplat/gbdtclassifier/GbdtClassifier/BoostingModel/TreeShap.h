// TreeShap: exact per-feature contributions (Shapley values) to the raw
// score of a BoostingModel, by path-dependent tree SHAP.
//
// For a row x (a feature vector as BoostingModel::featureVector() gives it,
// vectorLength() floats), explain() writes one contribution per vector
// position and returns a bias such that bias + sum(contributions) is the raw
// score that scoring gives for x, up to rounding. It explains exactly what
// scoring sums: the trees of non-zero weight, each leaf worth its compiled
// value float(value * weight) widened to double, and, when the model has a
// selector, only the trees of the sub-model that x selects. The selector tree
// itself is not explained: the choice of sub-model is taken as given, and its
// features get no share for it. Each row takes exactly the branches that the
// compiled walk takes (floats compared with float thresholds; in a plain tree
// NaN goes right at the root and left below it; in a tree that tests an
// equality feature NaN goes left at ordinary splits and right at equality
// splits, which send x != t right).
//
// The value of a coalition S of positions is the cover-weighted expectation
// of each tree: at a split on a position in S the row's branch is followed,
// at any other split both children are followed, each weighted by
// cover(child) / cover(split). A split whose cover is 0 weights both children
// by 1/2, so nothing is divided by zero and the bias stays the same for every
// row. The bias is baseScore plus each selected tree's expectation over the
// empty coalition. Covers need not add up (a child may hold more than its
// parent, as float hessians sometimes do); they must be finite and >= 0, and
// every ratio cover(child) / cover(split) must be finite.
//
// Covers: TreeCovers holds, for every entry of the model's
// getForest().trees (zero-weight trees included; they contribute nothing),
// one cover per node in pre-order (split, its left subtree, then its right
// subtree); a tree without a root has none. backgroundCovers() counts how
// many background rows reach each node, following the branches that scoring
// takes.
//
// A model without featureMapping has no positions and one constant score:
// explain() writes nothing and returns that score as the bias.
//
// Ownership: a TreeShap copies what it needs from the model and does not keep
// a reference to it; rows and output arrays stay the caller's.
//
// Threads: immutable after construction. Any number of threads may call the
// const methods at once, each with its own Scratch. explain() allocates only
// when its Scratch is first used (or meets a deeper tree); explainRows()
// allocates one Scratch per call.
//
// Errors: the constructor throws std::invalid_argument, naming the tree and
// the node, for covers of the wrong shape, a cover that is negative, NaN or
// infinite, or a child-to-split ratio that overflows. explainRows() and
// backgroundCovers() throw std::invalid_argument for a stride shorter than
// vectorLength() when there are rows. Nothing else throws except
// std::bad_alloc. No step recurses per tree level.
#pragma once

#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

namespace thornvale {

class BoostingModel;

// One vector per entry of Forest::trees, one cover per node in pre-order.
using TreeCovers = std::vector<std::vector<double>>;

// Covers counted over `numRows` background rows: row r is rows[r * stride,
// r * stride + vectorLength()), stride >= vectorLength(). A node's cover is
// the number of rows that reach it.
TreeCovers backgroundCovers(const BoostingModel& model, const float* rows, size_t numRows,
                            size_t stride);

class TreeShap {
 public:
  // Working memory of explain(); one per thread. Reused from call to call.
  class Scratch {
   public:
    Scratch() = default;

   private:
    friend class TreeShap;
    struct PathEntry {
      int32_t position;  // -1 for the entry the root starts with
      double zero;       // share of the path when the position is unknown
      double one;        // 1 when the row's own branch was taken, else 0
      double weight;     // permutation weight
    };
    struct Frame {
      uint32_t node;
      uint32_t pathLength;  // unique positions on the path, before this node
      size_t pathStart;     // offset of the parent's path in `paths`
      double zero;
      double one;
      int32_t position;
    };
    std::vector<PathEntry> paths;
    std::vector<Frame> frames;
  };

  // Throws std::invalid_argument for covers that do not fit the model (see
  // the header comment).
  TreeShap(const BoostingModel& model, const TreeCovers& covers);
  ~TreeShap();
  TreeShap(const TreeShap&) = delete;
  TreeShap& operator=(const TreeShap&) = delete;

  // Number of contributions per row: the model's vectorLength().
  size_t numContributions() const { return numPositions_; }

  // Writes numContributions() contributions of `row` (vectorLength() floats)
  // to `contributions` and returns the bias.
  double explain(const float* row, double* contributions, Scratch& scratch) const;

  // Explains `numRows` rows: row r is rows[r * stride, r * stride +
  // numContributions()). out has numRows * (numContributions() + 1) entries;
  // row r's contributions come first, then its bias.
  void explainRows(const float* rows, size_t numRows, size_t stride, double* out) const;

 private:
  struct ShapNode {
    int32_t position;    // split: vector position; kLeaf for a leaf
    uint32_t right;      // split: index of the right child (left is next)
    float threshold;     // split: compiled threshold
    bool equality;       // split: an equality split (x != t goes right)
    double leftShare;    // split: cover(left) / cover(split)
    double rightShare;   // split: cover(right) / cover(split)
    double value;        // leaf: compiled value, widened
  };
  struct ShapTree {
    uint32_t first;        // first node in nodes_
    uint32_t depth;        // splits on the longest path
    bool equalityWalk;     // the tree tests an equality feature
    double expectation;    // cover-weighted mean of the leaves
  };
  static constexpr int32_t kLeaf = -1;

  std::pair<size_t, size_t> selectTrees(const float* row) const;
  void explainTree(const ShapTree& tree, const float* row, double* contributions,
                   Scratch& scratch) const;

  size_t numPositions_ = 0;
  bool constantScore_ = false;
  double constantRawScore_ = 0.0;
  double baseScore_ = 0.0;
  std::vector<ShapNode> nodes_;
  std::vector<ShapTree> trees_;  // the trees of non-zero weight, in order
  // The selector, as plain splits without shares; empty without one.
  std::vector<ShapNode> selector_;
  std::vector<uint32_t> modelIndexMap_;
};

}  // namespace thornvale
