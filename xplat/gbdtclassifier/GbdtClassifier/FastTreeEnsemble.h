// FastTreeEnsemble<float>: the interface of a compiled forest, a Forest laid
// out flat for fast scoring. Its implementation, FastTreeEnsembleOOP, is in
// FastTreeEnsemble-inl.h, as the 16-bit forest <short, unsigned int> and the
// 32-bit forest <int, unsigned int>.
//
// init() compiles a Forest once: leaf values carry the tree weight
// (float(double(value) * weight)), trees of weight zero (+0 or -0) are
// dropped, and an optional selector tree picks per input which consecutive
// range of trees (a sub-model) is summed.
//
// Scoring: sum = baseScore (double), plus each selected tree's leaf value
// widened to double, in tree order; score() is logistic(sum). Features and
// thresholds are compared as floats. A plain tree (and the selector) goes to
// the second child at the root unless x <= t, and below the root when x > t,
// so NaN goes second at the root and first deeper down. A tree that tests an
// equality feature is walked with x != t (second child) at equality splits
// and x > t at the others, the root included.
//
// Errors: init() returns false for a null forest and (after an ERROR log) for
// a decreasing modelIndexMap; it throws std::range_error when a split's
// feature id passes the type's limit ("feature id > max size. Use large type
// for FeatureIdT"), when a child index would not fit ("node index > max
// size. Use large type for NodeIndexT"), and, when featureMapping is not
// empty, for a split position outside [0, featureMapping.size()) or an
// equality feature at or beyond the largest featureMapping entry plus one.
// With an empty featureMapping every position is accepted (up to the limit;
// a negative one is kept as position 0) and unnormalizedScoreOfZeros() gives
// the one score such a model can have. It throws std::runtime_error for a
// tree with an absent node. Scoring a vector shorter than
// requiredFeatures() throws std::invalid_argument, and so does scoring rows
// whose stride is shorter.
//
// unnormalizedScores() scores a block of rows at once: out[r] is, bit for
// bit, unnormalizedScore() of row r. It walks each group of trees over many
// rows while the group's nodes are in cache, and adds every row's leaves in
// tree order, as the one-row walk does.
//
// Remapping (init with remap = true) translates each split position through
// featureMapping; the vector is then indexed by feature id, and the equality
// mask holds bits up to the largest equality feature id.
//
// Threads: init() once, then any number of threads may score concurrently.
#pragma once

#include <cmath>
#include <cstddef>
#include <vector>

namespace thornvale {

struct Forest;

// The logistic of a raw score, as every score of the engine computes it.
inline double logistic(double rawScore) { return 1.0 / (std::exp(-rawScore) + 1.0); }

template <typename FeatureT>
class FastTreeEnsemble {
 public:
  FastTreeEnsemble() = default;
  FastTreeEnsemble(const FastTreeEnsemble&) = delete;
  FastTreeEnsemble& operator=(const FastTreeEnsemble&) = delete;

  virtual bool init(const Forest* forest, bool remap) = 0;
  virtual double unnormalizedScore(const std::vector<FeatureT>& features) const = 0;
  virtual double score(const std::vector<FeatureT>& features) const = 0;
  virtual ~FastTreeEnsemble() = default;

  // Raw scores of `numRows` rows: row r starts at rows + r * rowStride and
  // is read up to requiredFeatures() (rowStride >= requiredFeatures()), and
  // out[r] gets unnormalizedScore() of that row, bit for bit. The caller owns
  // both arrays; `out` has numRows entries. Throws std::invalid_argument for
  // a stride below requiredFeatures() when there are rows.
  virtual void unnormalizedScores(const FeatureT* rows, size_t numRows, size_t rowStride,
                                  double* out) const = 0;

  // The same sum as unnormalizedScore(), bit for bit, walking one tree after
  // another.
  virtual double unnormalizedScoreOneByOne(const std::vector<FeatureT>& features) const = 0;
  // The raw score when every feature position reads 0.0.
  virtual double unnormalizedScoreOfZeros() const = 0;
  // Compiled trees (those of non-zero weight).
  virtual size_t numTrees() const = 0;
  // Smallest vector length that scoring accepts: the largest split position + 1.
  virtual size_t requiredFeatures() const = 0;
  // 16 or 32: the width of a compiled feature id.
  virtual int featureIdBits() const = 0;
};

}  // namespace thornvale
