// ReliqaClassifierResultHybrid: the native peer of a managed result wrapper
// (ReliqaClassifierResult$ReliqaClassifierResultWrapper), and the wrapper's
// four natives, which read the result: "getScore",
// "getValueFromLoggingDataWithKey", "getAllKeysFromLoggingData" and
// "getIsOverThreshold". Strings leave as byte arrays holding exactly the
// native bytes.
//
// The peer holds its own copy of one classification result and never changes
// it, so any number of threads may read it at once; it does not depend on the
// classifier that produced it.
#pragma once

#include <jni.h>

#include "host/jni/Hybrid.h"
#include "host/jni/References.h"
#include "reliqaclassifier/ReliqaClassifierResult.h"

namespace kestrova::reliqaclassifier {

class ReliqaClassifierResultHybrid : public jni::HybridClass<ReliqaClassifierResultHybrid> {
 public:
  explicit ReliqaClassifierResultHybrid(ReliqaClassifierResult result);
  ~ReliqaClassifierResultHybrid() override;

  const ReliqaClassifierResult& result() const noexcept { return result_; }

  // A new managed result wrapper owning a peer that holds `result`.
  static jni::LocalRef<jobject> newWrapper(ReliqaClassifierResult result);

  static void registerNatives();

 private:
  const ReliqaClassifierResult result_;
};

}  // namespace kestrova::reliqaclassifier
