// The outcome of one classification: score, verdict and four logging values
// ("score", "model_id", "feature_vector", "threshold").
//
// A plain movable value; the classifier returns it by value and keeps no
// reference to it, so it outlives the classifier that produced it. Immutable
// in practice: any number of threads may read one result at once.
#pragma once

#include <array>

#include "reliqaclassifier/LoggingData.h"

namespace kestrova::reliqaclassifier {

// The logging data keys, in the order the classifier inserts them.
inline constexpr char kScoreLoggingKey[] = "score";                  // number text of score
inline constexpr char kModelIdLoggingKey[] = "model_id";             // stored identifier, or ""
inline constexpr char kFeatureVectorLoggingKey[] = "feature_vector";  // compact JSON of the features
inline constexpr char kThresholdLoggingKey[] = "threshold";          // number text of the threshold
inline constexpr std::array<const char*, 4> kLoggingDataKeys = {
    kScoreLoggingKey, kModelIdLoggingKey, kFeatureVectorLoggingKey, kThresholdLoggingKey};

struct ReliqaClassifierResult {
  bool isOverThreshold = false;  // score > threshold, strictly
  double score = 0.0;            // the model's probability, or 1.0 without a model
  LoggingData loggingData;       // the four keys in the order of kLoggingDataKeys
};

}  // namespace kestrova::reliqaclassifier
