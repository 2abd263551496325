#include "host/jni/PersistentKeyValueStoreHybrid.h"

#include <string>

#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"
#include "host/jni/Lookup.h"
#include "host/jni/Strings.h"
#include "host/keystash/SqliteKeyValueStore.h"

namespace kestrova::mobile::xplat::keystash {
namespace {

// static native HybridData initHybrid(String databasePath)
jobject initHybrid(JNIEnv* env, jclass, jstring databasePath) {
  jni::ThreadScope scope(env);
  try {
    if (databasePath == nullptr) {
      jni::throwNewJavaException("java/lang/NullPointerException", "databasePath is null");
    }
    std::string path = jni::JString(databasePath).toStdString();
    auto peer = std::make_unique<PersistentKeyValueStoreHybrid>(
        std::make_shared<SqliteKeyValueStore>(path));
    jni::LocalRef<jobject> hybridData = jni::detail::HybridData::create();
    jni::LocalRef<jobject> destructor = jni::detail::HybridData::getDestructor(hybridData.get());
    jni::detail::HybridData::setNativePointer(destructor.get(), std::move(peer));
    return hybridData.release();
  } catch (...) {
    jni::translatePendingCppExceptionToJavaException();
    return nullptr;
  }
}

}  // namespace

PersistentKeyValueStoreHybrid::PersistentKeyValueStoreHybrid(
    std::shared_ptr<PersistentKeyValueStore> store)
    : store_(std::move(store)) {}

PersistentKeyValueStoreHybrid::~PersistentKeyValueStoreHybrid() = default;

void PersistentKeyValueStoreHybrid::registerNatives() {
  JNIEnv* env = jni::Environment::current();
  jni::LocalRef<jclass> cls = jni::findClassLocal(kJavaClass);
  const JNINativeMethod methods[] = {
      {const_cast<char*>("initHybrid"),
       const_cast<char*>("(Ljava/lang/String;)Lcom/kestrova/jni/HybridData;"),
       reinterpret_cast<void*>(&initHybrid)},
  };
  jni::throwCppExceptionIf(env->RegisterNatives(cls.get(), methods, 1) != JNI_OK);
}

}  // namespace kestrova::mobile::xplat::keystash
