#include "reliqaclassifier/ReliqasClassifier.h"

#include <utility>

#include "reliqaclassifier/FeatureExtraction.h"
#include "reliqaclassifier/ModelParamsPersistence.h"
#include "reliqaclassifier/ResultBuilder.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

namespace kestrova::reliqaclassifier {

ReliqasClassifier::ReliqasClassifier(std::shared_ptr<PersistentKeyValueStore> store)
    : ReliqasClassifier(std::move(store), kDefaultKeyPrefix) {}

ReliqasClassifier::ReliqasClassifier(std::shared_ptr<PersistentKeyValueStore> store, const std::string& keyPrefix)
    : modelParamsCache(store, keyPrefix),
      serverFeaturesCache(store, keyPrefix),
      model(loadModelFromCache(modelParamsCache)) {}

ReliqasClassifier::~ReliqasClassifier() = default;

ReliqaClassifierResult ReliqasClassifier::classify(const ReliqaClassifierInput& input) {
  FeatureMap features = extractFeatures(input);  // outside the lock: pure and reentrant
  sync::MutexLock lock(mutex);
  // A server feature replaces the computed feature of its id. (Same content as
  // inserting the computed features into the server's map where absent, without
  // copying the computed ones.)
  for (const auto& [id, value] : fetchServerFeatures(serverFeaturesCache)) features.insert_or_assign(id, value);
  return buildResult(features, model.get(), modelParamsCache);
}

void ReliqasClassifier::setModelParams(const ReliqaClassifierModelParams& params) {
  sync::MutexLock lock(mutex);
  storeModelParams(modelParamsCache, params);
  if (!params.mSerializedModel.empty()) {
    // Read back from the store, not from `params`: the model in use is always
    // the stored one. A text the reader rejects throws here and leaves the
    // previous model in place.
    model = loadModelFromCache(modelParamsCache);
  }
}

void ReliqasClassifier::setServerFeatures(const FeatureMap& features) {
  sync::MutexLock lock(mutex);
  storeServerFeatures(serverFeaturesCache, features);
}

std::string ReliqasClassifier::currentlyUsedModelId() {
  sync::MutexLock lock(mutex);
  return fetchModelId(modelParamsCache);
}

}  // namespace kestrova::reliqaclassifier
