// The outcome of one classification: score, verdict and four logging values
// ("score", "model_id", "feature_vector", "threshold").
//
// A plain movable value; the classifier returns it by value and keeps no
// reference to it, so it outlives the classifier that produced it. Immutable
// in practice: any number of threads may read one result at once.
#pragma once

#include <string>
#include <unordered_map>

namespace kestrova::reliqaclassifier {

struct ReliqaClassifierResult {
  bool isOverThreshold = false;  // score > threshold, strictly
  double score = 0.0;            // the model's probability, or 1.0 without a model
  std::unordered_map<std::string, std::string> loggingData;
};

}  // namespace kestrova::reliqaclassifier
