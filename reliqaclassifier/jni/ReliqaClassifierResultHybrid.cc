#include "reliqaclassifier/jni/ReliqaClassifierResultHybrid.h"

#include <limits>
#include <stdexcept>
#include <string>
#include <vector>

#include "host/jni/Arrays.h"
#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"
#include "host/jni/Lookup.h"
#include "host/jni/Strings.h"
#include "reliqaclassifier/jni/EntryPoint.h"
#include "reliqaclassifier/jni/ManagedClasses.h"
#include "reliqaclassifier/jni/NullChecks.h"
#include "reliqaclassifier/jni/Peers.h"

namespace kestrova::reliqaclassifier {
namespace {

const ReliqaClassifierResult& resultOf(jobject self) {
  static const PeerClass peerClass = PeerClass::describe(self, managed::kResultWrapper);
  return ReliqaClassifierResultHybrid::fromNativePointer(findPeer(self, peerClass))->result();
}

jclass byteArrayClass() {
  static const jclass cls = jni::findClassStatic("[B");
  return cls;
}

// native double getScore()
jdouble getScore(JNIEnv* env, jobject self) {
  return entryPoint<jdouble>(env, [&] { return resultOf(self).score; });
}

// native boolean getIsOverThreshold()
jboolean getIsOverThreshold(JNIEnv* env, jobject self) {
  return entryPoint<jboolean>(
      env, [&] { return static_cast<jboolean>(resultOf(self).isOverThreshold ? JNI_TRUE : JNI_FALSE); });
}

// native byte[] getValueFromLoggingDataWithKey(String key)
jbyteArray getValueFromLoggingDataWithKey(JNIEnv* env, jobject self, jstring key) {
  return entryPoint<jbyteArray>(env, [&] {
    if (key == nullptr) {
      throwNullPointer("logging data key");
    }
    std::string name = jni::JString(key).toStdString();
    return jni::make_byte_array(resultOf(self).loggingData.at(name)).release();
  });
}

// native byte[][] getAllKeysFromLoggingData()
jobjectArray getAllKeysFromLoggingData(JNIEnv* env, jobject self) {
  return entryPoint<jobjectArray>(env, [&] {
    const ReliqaClassifierResult& result = resultOf(self);
    std::vector<std::string> keys;
    keys.reserve(result.loggingData.size());
    for (const auto& entry : result.loggingData) {
      keys.push_back(entry.first);
    }
    if (keys.size() > static_cast<size_t>(std::numeric_limits<jsize>::max())) {
      throw std::length_error("too many logging keys for a Java array");
    }
    jni::LocalRef<jobjectArray> array(
        env->NewObjectArray(static_cast<jsize>(keys.size()), byteArrayClass(), nullptr));
    jni::throwCppExceptionIf(!array);
    for (size_t i = 0; i < keys.size(); ++i) {
      jni::LocalRef<jbyteArray> bytes = jni::make_byte_array(keys[i]);
      env->SetObjectArrayElement(array.get(), static_cast<jsize>(i), bytes.get());
      jni::throwPendingJniExceptionAsCppException();
    }
    return array.release();
  });
}

}  // namespace

ReliqaClassifierResultHybrid::ReliqaClassifierResultHybrid(ReliqaClassifierResult result)
    : result_(std::move(result)) {}

ReliqaClassifierResultHybrid::~ReliqaClassifierResultHybrid() = default;

jni::LocalRef<jobject> ReliqaClassifierResultHybrid::newWrapper(ReliqaClassifierResult result) {
  JNIEnv* env = jni::Environment::current();
  jclass cls = managed::resultWrapperClass();
  static const bool derivesFromHybridClassBase =
      env->IsAssignableFrom(cls, managed::hybridClassBaseClass());
  auto peer = std::make_unique<ReliqaClassifierResultHybrid>(std::move(result));

  if (derivesFromHybridClassBase) {
    static const jmethodID constructor = jni::getMethodId(cls, "<init>", "()V");
    static const jfieldID destructorField =
        jni::getFieldId(cls, "mDestructor", managed::kDestructorType);
    jni::LocalRef<jobject> wrapper(env->NewObject(cls, constructor));
    jni::throwCppExceptionIf(!wrapper);
    jni::LocalRef<jobject> destructor(env->GetObjectField(wrapper.get(), destructorField));
    if (!destructor) {
      throw std::logic_error("a new result wrapper has no destructor object");
    }
    attachPeer(destructor.get(), std::move(peer));
    return wrapper;
  }

  static constexpr auto kConstructor = managed::join("(", managed::kHybridDataType, ")V");
  static const jmethodID constructor = jni::getMethodId(cls, "<init>", kConstructor);
  jni::LocalRef<jobject> hybridData = jni::detail::HybridData::create();
  attachPeer(jni::detail::HybridData::getDestructor(hybridData.get()).get(), std::move(peer));
  jni::LocalRef<jobject> wrapper(env->NewObject(cls, constructor, hybridData.get()));
  jni::throwCppExceptionIf(!wrapper);
  return wrapper;
}

void ReliqaClassifierResultHybrid::registerNatives() {
  static const JNINativeMethod methods[] = {
      {const_cast<char*>("getScore"), const_cast<char*>("()D"),
       reinterpret_cast<void*>(&getScore)},
      {const_cast<char*>("getValueFromLoggingDataWithKey"),
       const_cast<char*>("(Ljava/lang/String;)[B"),
       reinterpret_cast<void*>(&getValueFromLoggingDataWithKey)},
      {const_cast<char*>("getAllKeysFromLoggingData"), const_cast<char*>("()[[B"),
       reinterpret_cast<void*>(&getAllKeysFromLoggingData)},
      {const_cast<char*>("getIsOverThreshold"), const_cast<char*>("()Z"),
       reinterpret_cast<void*>(&getIsOverThreshold)},
  };
  JNIEnv* env = jni::Environment::current();
  jni::throwCppExceptionIf(
      env->RegisterNatives(managed::resultWrapperClass(), methods, 4) != JNI_OK);
}

}  // namespace kestrova::reliqaclassifier
