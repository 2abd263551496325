#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

#include <glog/logging.h>

#include <algorithm>
#include <sstream>
#include <stdexcept>
#include <string_view>

#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble-inl.h"

namespace thornvale {

namespace {

bool infoLogging() { return FLAGS_minloglevel <= google::GLOG_INFO; }

// Ids up to this use the direct lookup table (at most 256 KiB).
constexpr uint32_t kDenseIdLimit = 1u << 16;

template <typename List>
std::string joined(const List& items) {
  std::ostringstream out;
  bool first = true;
  for (const auto& item : items) {
    if (!first) out << ", ";
    out << item;
    first = false;
  }
  return out.str();
}

}  // namespace

BoostingModel::BoostingModel(const std::string& serializedModel, WalkKernel kernel) {
  forest_ = deserialize(std::string_view(serializedModel), nodes_);

  const std::vector<uint32_t> featureMapping = forest_->featureMapping;
  if (infoLogging()) LOG(INFO) << "featureMapping of a forest:\n" << joined(featureMapping);
  if (infoLogging()) LOG(INFO) << "inputKeys of a forest:\n" << joined(forest_->inputKeys);

  buildEnsemble(kernel);
  buildFeatureIndex(featureMapping);

  if (featureMapping.empty()) {
    constantScore_ = true;
    constantRawScore_ = ensemble_->unnormalizedScoreOfZeros();
  }
}

BoostingModel::~BoostingModel() {
  // nodes_ frees every node at once when it goes, right after forest_: the
  // trees let go of their nodes here so that they are not freed one by one.
  for (WeightedTree& entry : forest_->trees) {
    if (entry.tree) static_cast<void>(entry.tree->root.release());
  }
  if (forest_->modelSelector.tree) static_cast<void>(forest_->modelSelector.tree->root.release());
}

void BoostingModel::buildEnsemble(WalkKernel kernel) {
  const size_t keys = forest_->inputKeys.size();
  if (keys >= 1 && keys <= 32765) {
    LOG(INFO) << "Using 16 bit version";
    ensemble_ = std::make_unique<FastTreeEnsembleOOP<short, unsigned int>>(kernel);
  } else {
    if (keys == 0) {
      LOG(ERROR) << "Forest doesn't have input keys information. "
                 << "Falling back to safer 32 bit version";
    }
    LOG(INFO) << "Using 32 bit version";
    ensemble_ = std::make_unique<FastTreeEnsembleOOP<int, unsigned int>>(kernel);
  }
  // A decreasing modelIndexMap is logged by init(); the model is used as is.
  ensemble_->init(forest_.get(), false);
}

void BoostingModel::buildFeatureIndex(const std::vector<uint32_t>& featureMapping) {
  if (featureMapping.empty()) {
    LOG(WARNING) << "Feature metadata is not present in the forest"
                 << "Can't verify that number of features is less than"
                 << "int16_t maximum";
  }
  for (size_t i = 0; i < featureMapping.size(); ++i) {
    featureIndex_[featureMapping[i]] = static_cast<uint32_t>(i);
  }
  vectorLength_ = featureMapping.size();
  if (!featureMapping.empty()) {
    const uint32_t maxId = *std::max_element(featureMapping.begin(), featureMapping.end());
    if (maxId < kDenseIdLimit) {
      denseIndex_.assign(size_t{maxId} + 1, kNoPosition);
      for (size_t i = 0; i < featureMapping.size(); ++i) {
        denseIndex_[featureMapping[i]] = static_cast<uint32_t>(i);
      }
    }
  }
}

uint32_t BoostingModel::positionOf(int32_t id) const {
  const auto key = static_cast<uint32_t>(id);
  if (!denseIndex_.empty()) return key < denseIndex_.size() ? denseIndex_[key] : kNoPosition;
  const auto found = featureIndex_.find(key);
  return found == featureIndex_.end() ? kNoPosition : found->second;
}

void BoostingModel::fillVector(const FeatureMap& features, std::vector<float>& vector) const {
  vector.assign(vectorLength_, 0.0f);
  for (const auto& [id, value] : features) {
    const uint32_t position = positionOf(id);
    if (position != kNoPosition) vector[position] = static_cast<float>(value);
  }
}

std::vector<float> BoostingModel::featureVector(const FeatureMap& features) const {
  std::vector<float> vector;
  fillVector(features, vector);
  return vector;
}

double BoostingModel::rawScore(const FeatureMap& features) const {
  if (constantScore_) return constantRawScore_;
  std::vector<float> vector;
  fillVector(features, vector);
  return ensemble_->unnormalizedScore(vector);
}

void BoostingModel::rawScores(const float* vectors, size_t numRows, size_t stride, double* out) const {
  if (numRows == 0) return;
  if (stride < vectorLength_) {
    throw std::invalid_argument("feature vectors are " + std::to_string(stride) + " floats apart but hold " +
                                std::to_string(vectorLength_) + " features");
  }
  if (constantScore_) {
    std::fill(out, out + numRows, constantRawScore_);
    return;
  }
  ensemble_->unnormalizedScores(vectors, numRows, stride, out);
}

double BoostingModel::predict(const FeatureMap& features) const {
  const double raw = rawScore(features);
  if (infoLogging()) LOG(INFO) << "unormalized score: " << raw;
  return logistic(raw);
}

}  // namespace thornvale
