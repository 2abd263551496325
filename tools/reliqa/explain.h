// Per-feature explanations of scores (`reliqa explain`).
//
// ScoreExplainer explains what a model makes of a feature map: the raw score
// and the score exactly as BoostingModel::rawScore() and predict() give them
// (so as `reliqa score` prints them), and a bias and one contribution per
// feature id of the model (the ids of its featureMapping), by tree SHAP with
// the given covers. A contribution is the sum over the vector positions that
// the id is mapped to (an id that appears twice in featureMapping has two
// positions). bias + the contributions equals the raw score up to rounding.
//
// json() writes one explanation as one line of compact JSON:
//   {"bias":B,"contributions":{"ID":C,...},"raw_score":R,"score":S}
// with every feature id of the model in "contributions", by ascending id
// (signed), and numbers in the shortest text that reads back to the same
// double. A model without featureMapping has no contributions: its bias is
// its one raw score.
//
// waterfallSvg() draws one explanation: the bias, then the `shown` largest
// contributions by absolute value (ties by ascending id; contributions of 0
// are never drawn on their own), the others summed into one bar ("N other
// features"), and the raw score with the score beside it. A feature is
// labelled by its id, and by its input key where the model has one input key
// per featureMapping entry (inputKeys[i] names position i) and that key is
// not just the id again.
//
// CoverCounter counts background covers a block of rows at a time, so its
// memory does not grow with the number of rows.
//
// Ownership: both classes keep a reference to the model, which must outlive
// them. Not thread-safe (each keeps working memory); one per thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/TreeShap.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace thornvale {
class BoostingModel;
}

namespace reliqa::tool {

struct Explanation {
  double bias = 0.0;
  std::vector<double> contributions;  // one per featureIds() entry
  double rawScore = 0.0;
  double score = 0.0;
};

class ScoreExplainer {
 public:
  // Throws std::invalid_argument when the covers do not fit the model.
  ScoreExplainer(const thornvale::BoostingModel& model, const thornvale::TreeCovers& covers);

  // The model's feature ids, distinct and ascending.
  const std::vector<int32_t>& featureIds() const { return ids_; }

  Explanation explain(const thornvale::FeatureMap& features);

  // Throws thornvale::JsonPrintError for a value that is not finite.
  std::string json(const Explanation& e) const;

  std::string waterfallSvg(const Explanation& e, const std::string& title, size_t shown = 12) const;

 private:
  const thornvale::BoostingModel& model_;
  thornvale::TreeShap shap_;
  thornvale::TreeShap::Scratch scratch_;
  std::vector<int32_t> ids_;
  std::vector<size_t> idOfPosition_;  // index into ids_ of each vector position
  std::vector<std::string> names_;    // one per ids_ entry; empty for none
  std::vector<double> positions_;     // contributions by position, reused
};

class CoverCounter {
 public:
  explicit CoverCounter(const thornvale::BoostingModel& model);

  void add(const thornvale::FeatureMap& row);
  size_t rows() const { return rows_; }
  // The covers of every row added so far.
  thornvale::TreeCovers covers();

 private:
  void countBlock();

  const thornvale::BoostingModel& model_;
  std::vector<float> block_;
  size_t blockRows_ = 0;
  size_t rows_ = 0;
  thornvale::TreeCovers counts_;
};

}  // namespace reliqa::tool
