// Where the classifier keeps its model parameters and server features: store
// entries under the cache's prefix (Key* below), read and written through a
// CacheManager.
//
//   "model"           the serialized model text, byte for byte     default ""
//   "model_id"        the model identifier, byte for byte          default ""
//   "threshold"       the threshold as a number text ("0.7")       default 0.0
//   "server_features" the features as a compact JSON object        default {}
//
// Store failures are absorbed by the cache (logged; defaults read, writes
// skipped). Values that cannot be encoded or decoded throw: see CacheManager.h.
// Callers serialise the use of one cache manager (the classifier's lock).
#pragma once

#include <memory>
#include <string>

#include "reliqaclassifier/ReliqaClassifierInput.h"
#include "xplat/gbdtclassifier/GbdtClassifier/CacheManager.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace thornvale {
class BoostingModel;
}

namespace kestrova::reliqaclassifier {

// Every entry of a classifier is stored under "<prefix>_<key>"; a classifier
// made without a prefix uses this one.
inline constexpr char kDefaultKeyPrefix[] = "RELIQA";

inline constexpr char kModelKey[] = "model";
inline constexpr char kModelIdKey[] = "model_id";
inline constexpr char kThresholdKey[] = "threshold";
inline constexpr char kServerFeaturesKey[] = "server_features";

// Stores "model_id", then "threshold", then, only when the model text is not
// empty, "model". A non-finite threshold throws JsonPrintError after
// "model_id" was stored and before anything else is.
void storeModelParams(thornvale::CacheManager& cache, const ReliqaClassifierModelParams& params);

// Builds a model from the stored "model"; null when there is none (or it
// cannot be read from the store). Throws what the model's constructor throws
// for a text it rejects.
std::unique_ptr<thornvale::BoostingModel> loadModelFromCache(thornvale::CacheManager& cache);

std::string fetchModelId(thornvale::CacheManager& cache);

double fetchThreshold(thornvale::CacheManager& cache);

// Replaces the stored server features as a whole.
void storeServerFeatures(thornvale::CacheManager& cache, const thornvale::FeatureMap& features);

thornvale::FeatureMap fetchServerFeatures(thornvale::CacheManager& cache);

}  // namespace kestrova::reliqaclassifier
