// Native peer of the Java class com.kestrova.keystash.PersistentKeyValueStore.
//
// The peer holds a share of one native PersistentKeyValueStore. JNI libraries
// that are handed the Java store object find this peer through the object's
// "mHybridData" and copy the share, so the native store lives on after the
// Java store is closed for as long as anybody still uses it.
//
// The peer itself is immutable. The store it shares serialises its own calls,
// so classifiers that copied the share may use it from different threads at
// once.
#pragma once

#include <memory>

#include "host/jni/Api.h"
#include "host/jni/Hybrid.h"
#include "host/keystash/PersistentKeyValueStore.h"

namespace kestrova::mobile::xplat::keystash {

class KESTROVA_JNI_API PersistentKeyValueStoreHybrid
    : public jni::HybridClass<PersistentKeyValueStoreHybrid> {
 public:
  static constexpr const char* kJavaClass = "com/kestrova/keystash/PersistentKeyValueStore";

  explicit PersistentKeyValueStoreHybrid(std::shared_ptr<PersistentKeyValueStore> store);
  ~PersistentKeyValueStoreHybrid() override;

  const std::shared_ptr<PersistentKeyValueStore>& store() const noexcept { return store_; }

  // Registers the natives of the Java class; called from JNI_OnLoad.
  static void registerNatives();

 private:
  std::shared_ptr<PersistentKeyValueStore> store_;
};

}  // namespace kestrova::mobile::xplat::keystash
