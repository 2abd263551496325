#include "reliqaclassifier/jni/ReliqaClassifierHybrid.h"

#include "host/jni/Arrays.h"
#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"
#include "host/jni/References.h"
#include "reliqaclassifier/jni/EntryPoint.h"
#include "reliqaclassifier/jni/InputReader.h"
#include "reliqaclassifier/jni/ManagedClasses.h"
#include "reliqaclassifier/jni/NullChecks.h"
#include "reliqaclassifier/jni/Peers.h"
#include "reliqaclassifier/jni/ReliqaClassifierResultHybrid.h"
#include "reliqaclassifier/jni/UpdateReaders.h"

namespace kestrova::reliqaclassifier {
namespace {

using mobile::xplat::keystash::PersistentKeyValueStoreHybrid;

const PersistentKeyValueStoreHybrid& storePeer(jobject store) {
  static const PeerClass peerClass = PeerClass::describe(store, managed::kStore);
  return *PersistentKeyValueStoreHybrid::fromNativePointer(findPeer(store, peerClass));
}

ReliqaClassifierHybrid& classifierPeer(jobject self) {
  static const PeerClass peerClass = PeerClass::describe(self, managed::kClassifierWrapper);
  return *ReliqaClassifierHybrid::fromNativePointer(findPeer(self, peerClass));
}

// static native HybridData initHybrid(PersistentKeyValueStore store)
jobject initHybrid(JNIEnv* env, jclass, jobject store) {
  return entryPoint<jobject>(env, [&] {
    if (store == nullptr) {
      throwNullPointer("PersistentKeyValueStore");
    }
    auto peer = std::make_unique<ReliqaClassifierHybrid>(storePeer(store));
    jni::LocalRef<jobject> hybridData = jni::detail::HybridData::create();
    attachPeer(jni::detail::HybridData::getDestructor(hybridData.get()).get(), std::move(peer));
    return hybridData.release();
  });
}

// native byte[] currentlyUsedModelId()
jbyteArray currentlyUsedModelId(JNIEnv* env, jobject self) {
  return entryPoint<jbyteArray>(env, [&] {
    ReliqaClassifierHybrid& peer = classifierPeer(self);
    return jni::make_byte_array(peer.classifier().currentlyUsedModelId()).release();
  });
}

// native void setModelParams(ReliqaClassifierModelParams params)
void setModelParams(JNIEnv* env, jobject self, jobject params) {
  entryPoint<void>(env, [&] {
    ReliqaClassifierHybrid& peer = classifierPeer(self);
    peer.classifier().setModelParams(readModelParams(params));
  });
}

// native void setServerFeatures(ReliqaClassifierServerFeatures features)
void setServerFeatures(JNIEnv* env, jobject self, jobject features) {
  entryPoint<void>(env, [&] {
    ReliqaClassifierHybrid& peer = classifierPeer(self);
    peer.classifier().setServerFeatures(readServerFeatures(features));
  });
}

// native ReliqaClassifierResultWrapper classifyReliqa(ReliqaClassifierInput input)
jobject classifyReliqa(JNIEnv* env, jobject self, jobject input) {
  return entryPoint<jobject>(env, [&] {
    ReliqaClassifierHybrid& peer = classifierPeer(self);
    ReliqaClassifierResult result = peer.classifier().classify(readReliqaClassifierInput(input));
    return ReliqaClassifierResultHybrid::newWrapper(std::move(result)).release();
  });
}

}  // namespace

ReliqaClassifierHybrid::ReliqaClassifierHybrid(const PersistentKeyValueStoreHybrid& store)
    : classifier_(std::make_shared<ReliqasClassifier>(store.store())) {}

ReliqaClassifierHybrid::~ReliqaClassifierHybrid() = default;

void ReliqaClassifierHybrid::registerNatives() {
  using managed::join;
  using managed::typeOf;
  static constexpr auto kInitHybrid = join("(", managed::kStoreType, ")", managed::kHybridDataType);
  static constexpr auto kSetModelParams = join("(", typeOf(managed::kModelParams), ")V");
  static constexpr auto kSetServerFeatures = join("(", typeOf(managed::kServerFeatures), ")V");
  static constexpr auto kClassifyReliqa =
      join("(", typeOf(managed::kInput), ")", typeOf(managed::kResultWrapper));
  static const JNINativeMethod methods[] = {
      {const_cast<char*>("initHybrid"), const_cast<char*>(kInitHybrid.text),
       reinterpret_cast<void*>(&initHybrid)},
      {const_cast<char*>("currentlyUsedModelId"), const_cast<char*>("()[B"),
       reinterpret_cast<void*>(&currentlyUsedModelId)},
      {const_cast<char*>("setModelParams"), const_cast<char*>(kSetModelParams.text),
       reinterpret_cast<void*>(&setModelParams)},
      {const_cast<char*>("setServerFeatures"), const_cast<char*>(kSetServerFeatures.text),
       reinterpret_cast<void*>(&setServerFeatures)},
      {const_cast<char*>("classifyReliqa"), const_cast<char*>(kClassifyReliqa.text),
       reinterpret_cast<void*>(&classifyReliqa)},
  };
  JNIEnv* env = jni::Environment::current();
  jni::throwCppExceptionIf(
      env->RegisterNatives(managed::classifierWrapperClass(), methods, 5) != JNI_OK);
}

}  // namespace kestrova::reliqaclassifier
