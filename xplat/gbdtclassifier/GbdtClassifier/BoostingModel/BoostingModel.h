// BoostingModel: a serialized boosted-tree model, read, compiled and ready to
// score feature maps.
//
// The constructor reads the model text (deserialize), logs its featureMapping
// and inputKeys at INFO, compiles it into the 16-bit forest when it has 1 to
// 32765 input keys and into the 32-bit forest otherwise, and indexes the
// feature vector: the feature whose id is featureMapping[i] goes to position
// i (a repeated id keeps its last position; the vector is as long as
// featureMapping). It throws what the reader throws (std::runtime_error for
// malformed text) and std::range_error when the compiled forest cannot hold
// the model or a split addresses a position outside the vector; no model
// exists then.
//
// predict() places the map's known features into a float vector (others
// read 0.0, unknown ids are ignored), walks the trees once, logs the raw
// score at INFO ("unormalized score: ...", formatted only when INFO is on)
// and returns its logistic. rawScore() is the same sum without the log. A
// model without featureMapping cannot see any feature, so its one raw score
// is computed at construction and returned for every map.
//
// rawScores() scores many rows that are already feature vectors (what
// featureVector() gives, vectorLength() floats in featureMapping order),
// a block at a time (FastTreeEnsemble::unnormalizedScores()): out[r] is, bit
// for bit, rawScore() of the map whose vector row r is. A model without
// featureMapping fills its constant score. It throws std::invalid_argument
// when the stride is shorter than vectorLength() and there are rows.
//
// Owns its Forest and compiled forest. The Forest's nodes live in the
// model's own arena and are freed with it all at once, without their
// destructors. getForest()'s const does not reach through the Forest's
// pointers, but no node may be taken out of it (it would not outlive the
// model) or put into it (it would never be freed). Immutable after
// construction: predict(), rawScore() and rawScores() may run on several
// threads at once.
//
// The compiled forest is seen through its interface (FastTreeEnsemble.h);
// its implementation (FastTreeEnsemble-inl.h) is compiled in
// BoostingModel.cc alone.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/NodeArena.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"
#include "xplat/gbdtclassifier/GbdtClassifier/WalkKernel.h"

namespace thornvale {

class BoostingModel {
 public:
  // The compiled forest scores with `kernel`.
  explicit BoostingModel(const std::string& serializedModel, WalkKernel kernel = bestWalkKernel());
  ~BoostingModel();
  BoostingModel(const BoostingModel&) = delete;
  BoostingModel& operator=(const BoostingModel&) = delete;

  // Probability in [0, 1]: the logistic of rawScore(features).
  double predict(const FeatureMap& features) const;
  // baseScore plus the leaf values of the selected trees.
  double rawScore(const FeatureMap& features) const;
  // The float vector that `features` become (empty for a model without
  // featureMapping).
  std::vector<float> featureVector(const FeatureMap& features) const;
  // Length of featureVector(): the number of featureMapping entries.
  size_t vectorLength() const { return vectorLength_; }
  // Raw scores of `numRows` feature vectors: row r is vectors[r * stride,
  // r * stride + vectorLength()), stride >= vectorLength(); out has numRows
  // entries. Both arrays stay the caller's.
  void rawScores(const float* vectors, size_t numRows, size_t stride, double* out) const;

  const Forest& getForest() const { return *forest_; }
  const FastTreeEnsemble<float>& getEnsemble() const { return *ensemble_; }
  bool uses16BitForest() const { return ensemble_->featureIdBits() == 16; }
  size_t treesKept() const { return ensemble_->numTrees(); }
  size_t treesDropped() const { return forest_->trees.size() - ensemble_->numTrees(); }
  const std::unordered_map<uint32_t, uint32_t>& getFeatureIndex() const { return featureIndex_; }
  // True when the model has no featureMapping and so one score for all maps.
  bool hasConstantScore() const { return constantScore_; }

 private:
  static constexpr uint32_t kNoPosition = UINT32_MAX;

  void buildEnsemble(WalkKernel kernel);
  void buildFeatureIndex(const std::vector<uint32_t>& featureMapping);
  uint32_t positionOf(int32_t id) const;
  void fillVector(const FeatureMap& features, std::vector<float>& vector) const;

  NodeArena nodes_{NodeArena::Lifetime::kArena};  // every node of forest_
  std::unique_ptr<Forest> forest_;
  std::unique_ptr<FastTreeEnsemble<float>> ensemble_;
  std::unordered_map<uint32_t, uint32_t> featureIndex_;
  // Direct lookup table mirroring featureIndex_ when the ids are small.
  std::vector<uint32_t> denseIndex_;
  size_t vectorLength_ = 0;
  bool constantScore_ = false;
  double constantRawScore_ = 0.0;
};

}  // namespace thornvale
