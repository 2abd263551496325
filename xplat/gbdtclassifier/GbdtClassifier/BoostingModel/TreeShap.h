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
// Method: for one leaf of value v whose path tests d distinct positions, the
// share of position i is
//   v * (o_i - z_i) * integral over y in [0, 1] of prod_{j != i} (o_j y + z_j (1 - y)),
// where z_j is the product of the shares of the path's edges that test j and
// o_j is 1 when the row takes all of them, else 0. The integrand is a
// polynomial of degree below d, so a Gauss-Legendre rule of ceil(d / 2)
// points integrates it exactly. A walk down the tree carries each node's
// product at those points, a walk up sums the leaves and hands each edge its
// share: O(nodes x points) per tree and row, with rows side by side in lanes.
// Every row's arithmetic is the same in a lane as alone, so explainRows() and
// explain() agree to the bit. A tree whose paths test more than 32 distinct
// positions takes the published path-by-path walk, O(leaves x depth^2).
//
// A model without featureMapping has no positions and one constant score:
// explain() writes nothing and returns that score as the bias.
//
// Ownership: a TreeShap copies what it needs from the model and does not keep
// a reference to it; rows and output arrays stay the caller's.
//
// Threads: immutable after construction. Any number of threads may call the
// const methods at once, each with its own Scratch. explain() allocates only
// when its Scratch is first used (or meets a larger tree); explainRows()
// allocates one Scratch and a row order per call.
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
    // The published walk (deep trees).
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
    // The polynomial walk, for a block of rows in lanes.
    std::vector<double> products;   // per node, point and lane
    std::vector<double> sums;       // per node, point and lane
    std::vector<double> known;      // per node and lane: 1 or 0
    std::vector<double> inverses;   // per node and point: two factors
    std::vector<double> lanes;      // per position and lane: contributions
  };

  // Throws std::invalid_argument for covers that do not fit the model (see
  // the header comment).
  TreeShap(const BoostingModel& model, const TreeCovers& covers);
  ~TreeShap();
  TreeShap(const TreeShap&) = delete;
  TreeShap& operator=(const TreeShap&) = delete;

  // Number of contributions per row: the model's vectorLength().
  size_t numContributions() const { return numPositions_; }

  // Bytes held for explaining: the per-node tables and quadrature rules.
  size_t tableBytes() const;

  // Writes numContributions() contributions of `row` (vectorLength() floats)
  // to `contributions` and returns the bias.
  double explain(const float* row, double* contributions, Scratch& scratch) const;

  // Explains `numRows` rows: row r is rows[r * stride, r * stride +
  // numContributions()). out has numRows * (numContributions() + 1) entries;
  // row r's contributions come first, then its bias. Gives the same bits as
  // explain() row by row.
  void explainRows(const float* rows, size_t numRows, size_t stride, double* out) const;

 private:
  static constexpr size_t kBlock = 8;  // rows explained together

  struct ShapNode {
    int32_t position;  // split: vector position; kLeaf for a leaf
    uint32_t right;    // split: the right child, counted from the tree's root
    float threshold;   // split: compiled threshold
    bool equality;     // split: an equality split (x != t goes right)
    double share;      // cover(node) / cover(parent); 1/2 each under a zero cover
    double zero;       // product of the shares of the edges on the path that
                       // test the parent's position, down to this node
    union {
      double value;       // leaf: compiled value, widened
      uint32_t sameEdge;  // split: nearest node at or above this one whose
                          // parent tests this node's position, or kNone
    };
  };
  struct ShapTree {
    uint32_t first;      // first node in nodes_
    uint32_t size;       // its nodes
    uint32_t depth;      // splits on the longest path
    uint32_t points;     // quadrature points; 0 without splits; kPublished
    bool equalityWalk;   // the tree tests an equality feature
    double expectation;  // cover-weighted mean of the leaves
  };
  // Gauss-Legendre rule on [0, 1].
  struct Quadrature {
    std::vector<double> point;
    std::vector<double> weight;
    std::vector<double> unknownFactor;  // -weight / (1 - point)
  };
  static constexpr int32_t kLeaf = -1;
  static constexpr uint32_t kNone = 0xffffffffu;
  static constexpr uint32_t kPublished = 0xffffffffu;

  std::pair<size_t, size_t> selectTrees(const float* row) const;
  template <size_t K>
  void explainBlock(const float* const* rows, size_t first, size_t end, double* const* out,
                    Scratch& scratch) const;
  template <size_t K>
  void explainTreeInLanes(const ShapTree& tree, const float* const* rows, Scratch& scratch) const;
  void explainTreePublished(const ShapTree& tree, const float* row, double* contributions,
                            size_t stride, Scratch& scratch) const;

  size_t numPositions_ = 0;
  bool constantScore_ = false;
  double constantRawScore_ = 0.0;
  double baseScore_ = 0.0;
  std::vector<ShapNode> nodes_;
  std::vector<ShapTree> trees_;  // the trees of non-zero weight, in order
  std::vector<Quadrature> rules_;  // by number of points
  // The selector, as plain splits without shares; empty without one.
  std::vector<ShapNode> selector_;
  std::vector<uint32_t> modelIndexMap_;
};

}  // namespace thornvale
