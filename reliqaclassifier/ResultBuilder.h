// Builds the result of one classification from the merged feature map (the
// stored server features plus the computed features they do not replace).
//
// In this order: the score is model->predict(features), or 1.0 without a
// model; the model identifier and the threshold are read from `modelParamsCache`;
// isOverThreshold is score > threshold (false for equal values and for NaN);
// loggingData gets "score", "model_id", "feature_vector" and "threshold".
// Throws JsonPrintError when a feature is NaN or infinite (no result then),
// and whatever predict or the two reads throw. Runs under the classifier's
// lock; `model` may be null.
#pragma once

#include "reliqaclassifier/ReliqaClassifierResult.h"
#include "xplat/gbdtclassifier/GbdtClassifier/CacheManager.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace thornvale {
class BoostingModel;
}

namespace kestrova::reliqaclassifier {

ReliqaClassifierResult buildResult(const thornvale::FeatureMap& features, const thornvale::BoostingModel* model,
                                   thornvale::CacheManager& modelParamsCache);

}  // namespace kestrova::reliqaclassifier
