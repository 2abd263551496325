#include "reliqaclassifier/ModelParamsPersistence.h"

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

namespace kestrova::reliqaclassifier {

using thornvale::CacheManager;
using thornvale::FeatureMap;

void storeModelParams(CacheManager& cache, const ReliqaClassifierModelParams& params) {
  cache.store(kModelIdKey, params.mModelId);
  cache.store(kThresholdKey, params.mThreshold);
  if (!params.mSerializedModel.empty()) cache.store(kModelKey, params.mSerializedModel);
}

std::unique_ptr<thornvale::BoostingModel> loadModelFromCache(CacheManager& cache) {
  const std::string serializedModel = cache.fetch(kModelKey, std::string());
  if (serializedModel.empty()) return nullptr;
  return std::make_unique<thornvale::BoostingModel>(serializedModel);
}

std::string fetchModelId(CacheManager& cache) { return cache.fetch(kModelIdKey, std::string()); }

double fetchThreshold(CacheManager& cache) { return cache.fetch(kThresholdKey, 0.0); }

void storeServerFeatures(CacheManager& cache, const FeatureMap& features) {
  cache.store(kServerFeaturesKey, features);
}

FeatureMap fetchServerFeatures(CacheManager& cache) {
  return cache.fetch(kServerFeaturesKey, FeatureMap());
}

}  // namespace kestrova::reliqaclassifier
