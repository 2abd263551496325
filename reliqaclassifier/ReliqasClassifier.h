// ReliqasClassifier: the one object through which a host uses the system.
//
// Holds the loaded boosted-tree model and two cache managers over the host's
// persistent store (keys "<prefix>_model", "_model_id", "_threshold",
// "_server_features"). Only the model lives in memory; identifier, threshold and
// server features are read from the store on every use, so updates are seen by
// the next call and survive a restart of the process.
//
// Thread-safety: every operation may be called from any thread at any time.
// One mutex serialises store access, model replacement and scoring; feature
// extraction runs outside it.
//
// Errors: store failures never reach the caller (logged, defaults used).
// Undecodable stored values, a stored model that the reader rejects (in the
// constructor and in setModelParams), allocation failures of feature
// extraction and non-finite values met while writing JSON leave as exceptions.
#pragma once

#include <memory>
#include <string>

#include "host/sync/Mutex.h"
#include "reliqaclassifier/ReliqaClassifierInput.h"
#include "reliqaclassifier/ReliqaClassifierResult.h"
#include "xplat/gbdtclassifier/GbdtClassifier/CacheManager.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace thornvale {
class BoostingModel;
}

namespace kestrova::reliqaclassifier {

using thornvale::FeatureMap;
using kestrova::mobile::xplat::keystash::PersistentKeyValueStore;

class ReliqasClassifier {
 public:
  // Key prefix kDefaultKeyPrefix ("RELIQA"). `store` may be empty: every store access is then
  // logged as "cache not initiated" and defaults are used.
  explicit ReliqasClassifier(std::shared_ptr<PersistentKeyValueStore> store);
  ReliqasClassifier(std::shared_ptr<PersistentKeyValueStore> store, const std::string& keyPrefix);
  ~ReliqasClassifier();

  ReliqasClassifier(const ReliqasClassifier&) = delete;
  ReliqasClassifier& operator=(const ReliqasClassifier&) = delete;

  ReliqaClassifierResult classify(const ReliqaClassifierInput& input);
  void setModelParams(const ReliqaClassifierModelParams& params);
  void setServerFeatures(const FeatureMap& features);
  std::string currentlyUsedModelId();

 private:
  // Every use of the caches, of the store through them, and of `model` holds
  // the mutex (checked by clang's -Wthread-safety).
  sync::Mutex mutex;
  thornvale::CacheManager modelParamsCache GUARDED_BY(mutex);     // "model", "model_id", "threshold"
  thornvale::CacheManager serverFeaturesCache GUARDED_BY(mutex);  // "server_features"
  std::unique_ptr<thornvale::BoostingModel> model GUARDED_BY(mutex);  // null without a model
};

}  // namespace kestrova::reliqaclassifier
