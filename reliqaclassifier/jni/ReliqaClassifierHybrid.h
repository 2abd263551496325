// ReliqaClassifierHybrid: the native peer of a managed classifier wrapper
// (ReliqaClassifier$ReliqaClassifierWrapper), and the wrapper's five natives.
//
// The peer shares ownership of one ReliqasClassifier, created over a share of
// the native store of the managed PersistentKeyValueStore given to
// "initHybrid". The managed holder owns the peer; destroying the peer releases
// its share of the classifier. The peer only forwards: the classifier
// serialises its own operations, so natives may run on any thread at once.
#pragma once

#include <memory>

#include "host/jni/Hybrid.h"
#include "host/jni/PersistentKeyValueStoreHybrid.h"
#include "reliqaclassifier/ReliqasClassifier.h"

namespace kestrova::reliqaclassifier {

class ReliqaClassifierHybrid : public jni::HybridClass<ReliqaClassifierHybrid> {
 public:
  explicit ReliqaClassifierHybrid(
      const mobile::xplat::keystash::PersistentKeyValueStoreHybrid& store);
  ~ReliqaClassifierHybrid() override;

  ReliqasClassifier& classifier() const noexcept { return *classifier_; }

  // Registers "initHybrid", "currentlyUsedModelId", "setModelParams",
  // "setServerFeatures" and "classifyReliqa" on the wrapper class.
  static void registerNatives();

 private:
  std::shared_ptr<ReliqasClassifier> classifier_;
};

}  // namespace kestrova::reliqaclassifier
