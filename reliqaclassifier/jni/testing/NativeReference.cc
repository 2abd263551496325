// libreliqa_jni_testsupport.so: natives of the JVM tests' NativeReference
// class. They expose what the binding reads (the input record, the server
// features) as canonical text, and classify through a fresh native classifier
// without the managed wrappers, so that the tests can compare the binding's
// answers with the native side's own. Doubles are written as the decimal value
// of their 64-bit pattern, so every comparison is bit for bit. It also makes a
// store that fails, in this library, so that its failures reach the classifier
// library from another copy of the C++ runtime.
#include <jni.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <ctime>
#include <iterator>
#include <map>
#include <memory>
#include <string>

#include "host/jni/Environment.h"
#include "host/jni/Lookup.h"
#include "host/jni/Exceptions.h"
#include "host/jni/Hybrid.h"
#include "host/jni/PersistentKeyValueStoreHybrid.h"
#include "host/jni/Strings.h"
#include "host/keystash/InMemoryKeyValueStore.h"
#include "host/keystash/testing/FaultInjectingKeyValueStore.h"
#include "reliqaclassifier/ReliqasClassifier.h"
#include "reliqaclassifier/jni/EntryPoint.h"
#include "reliqaclassifier/jni/InputReader.h"
#include "reliqaclassifier/jni/ManagedClasses.h"
#include "reliqaclassifier/jni/Peers.h"
#include "reliqaclassifier/jni/UpdateReaders.h"

namespace kestrova::reliqaclassifier {
namespace {

using mobile::xplat::keystash::FaultInjectingKeyValueStore;
using mobile::xplat::keystash::InMemoryKeyValueStore;
using mobile::xplat::keystash::PersistentKeyValueStoreHybrid;

constexpr auto kNativeReference = managed::join(managed::kModelsPackage, "NativeReference");

std::string bits(double value) {
  long long pattern;
  std::memcpy(&pattern, &value, sizeof pattern);
  return std::to_string(pattern);
}

std::string flag(bool value) { return value ? "1" : "0"; }

std::string describe(const ReliqaClassifierInput& input) {
  std::string text;
  text += "collectionID=" + input.collectionID + "\n";
  text += "timeSinceStory=" + bits(input.timeSinceStory) + "\n";
  if (input.locationInfo) {
    const LocationInfo& l = *input.locationInfo;
    text += "location=" + l.name + "|" + flag(l.isLandmark) + "|" + bits(l.longitude) + "|" +
            bits(l.latitude) + "\n";
  } else {
    text += "location=absent\n";
  }
  const AssetCounts& c = input.assetCounts;
  text += "counts=" + std::to_string(c.tileCount) + " " + std::to_string(c.totalAssetsCount) +
          " " + std::to_string(c.photosCount) + " " + std::to_string(c.burstCount) + " " +
          std::to_string(c.loopsCount) + " " + std::to_string(c.videosCount) + " " +
          std::to_string(c.totalAssetsWithinBurstsCount) + " " +
          std::to_string(c.totalAssetsWithinLoopsCount) + " " + std::to_string(c.facesCount) +
          " " + std::to_string(c.photosWithFacesCount) + "\n";
  for (const AssetDetail& a : input.assetDetails) {
    text += "asset=" + a.assetID + "|" + a.assetType + "|" +
            std::to_string(static_cast<long long>(a.creationDateSinceEpoch)) + "|" +
            std::to_string(static_cast<long long>(a.modificationDateSinceEpoch)) + "|" +
            bits(a.pixelWidth) + "|" + bits(a.pixelHeight) + "|" + bits(a.latitude) + "|" +
            bits(a.longitude) + "|" + bits(a.videoDuration) + "|" + std::to_string(a.isFavorite) +
            "|" + std::to_string(a.isHidden) + "|" + std::to_string(a.mediaSubtypes) + "|" +
            std::to_string(a.sourceType) + "|" + flag(a.blurrinessMetric.isCalculated) + "|" +
            bits(a.blurrinessMetric.value) + "|" + flag(a.darknessMetric.isCalculated) + "|" +
            bits(a.darknessMetric.value) + "\n";
  }
  for (const DuplicateInfo& d : input.duplicateInfos) {
    text += "dup=" + d.assetIdA + "|" + d.assetIdB + "|" + bits(d.dupeCoefficient) + "\n";
  }
  text += "extraCount=" + std::to_string(input.extraCount) + "\n";
  return text;
}

jstring toJava(const std::string& text) {
  return jni::JString::fromStdString(text).release();
}

// static native int timeBits()
jint timeBits(JNIEnv*, jclass) { return static_cast<jint>(sizeof(time_t) * 8); }

// static native String describeInput(ReliqaClassifierInput input)
jstring describeInput(JNIEnv* env, jclass, jobject input) {
  return entryPoint<jstring>(env, [&] { return toJava(describe(readReliqaClassifierInput(input))); });
}

// static native String describeServerFeatures(ReliqaClassifierServerFeatures features)
jstring describeServerFeatures(JNIEnv* env, jclass, jobject features) {
  return entryPoint<jstring>(env, [&] {
    thornvale::FeatureMap map = readServerFeatures(features);
    std::map<int32_t, double> sorted(map.begin(), map.end());
    std::string text;
    for (const auto& [id, value] : sorted) {
      text += std::to_string(id) + "=" + bits(value) + "\n";
    }
    return toJava(text);
  });
}

// static native String classifyDirectly(PersistentKeyValueStore store, ReliqaClassifierInput input)
jstring classifyDirectly(JNIEnv* env, jclass, jobject store, jobject input) {
  return entryPoint<jstring>(env, [&] {
    static const PeerClass peerClass = PeerClass::describe(store, managed::kStore);
    auto* storePeer = PersistentKeyValueStoreHybrid::fromNativePointer(findPeer(store, peerClass));
    ReliqasClassifier classifier(storePeer->store());
    ReliqaClassifierResult result = classifier.classify(readReliqaClassifierInput(input));
    std::string text = "score=" + bits(result.score) + "\n";
    text += "over=" + flag(result.isOverThreshold) + "\n";
    std::map<std::string, std::string> sorted(result.loggingData.begin(), result.loggingData.end());
    for (const auto& [key, value] : sorted) {
      text += key + "=" + value + "\n";
    }
    return toJava(text);
  });
}

// static native PersistentKeyValueStore failingStore()
// A managed store whose native store fails every fetch and store in the
// future's get(). The managed object is made without its constructor, which
// would open a database, and given the host's store peer over that store.
jobject failingStore(JNIEnv* env, jclass) {
  return entryPoint<jobject>(env, [env] {
    auto failing = std::make_shared<FaultInjectingKeyValueStore>(std::make_shared<InMemoryKeyValueStore>());
    failing->failFetches(FaultInjectingKeyValueStore::Failure::kInGet);
    failing->failStores(FaultInjectingKeyValueStore::Failure::kInGet);
    static const jclass storeClass = jni::findClassStatic(managed::kStore);
    static const jfieldID hybridDataField = jni::getFieldId(storeClass, "mHybridData", managed::kHybridDataType);
    jni::LocalRef<jobject> store(env->AllocObject(storeClass));
    jni::throwCppExceptionIf(!store);
    jni::LocalRef<jobject> hybridData = jni::detail::HybridData::create();
    jni::LocalRef<jobject> destructor = jni::detail::HybridData::getDestructor(hybridData.get());
    attachPeer(destructor.get(), std::make_unique<PersistentKeyValueStoreHybrid>(failing));
    env->SetObjectField(store.get(), hybridDataField, hybridData.get());
    jni::throwPendingJniExceptionAsCppException();
    return store.release();
  });
}

// static native long classifyNatively(PersistentKeyValueStore store, ReliqaClassifierInput input,
//                                     int iterations)
// For the JVM benchmark: reads `input` once, then classifies the native record
// `iterations` times with a fresh classifier over `store`'s native store, as
// classifyReliqa does after reading; returns the nanoseconds the loop took.
jlong classifyNatively(JNIEnv* env, jclass, jobject store, jobject input, jint iterations) {
  return entryPoint<jlong>(env, [&] {
    static const PeerClass peerClass = PeerClass::describe(store, managed::kStore);
    auto* storePeer = PersistentKeyValueStoreHybrid::fromNativePointer(findPeer(store, peerClass));
    ReliqasClassifier classifier(storePeer->store());
    const ReliqaClassifierInput record = readReliqaClassifierInput(input);
    const auto start = std::chrono::steady_clock::now();
    for (jint i = 0; i < iterations; ++i) {
      ReliqaClassifierResult result = classifier.classify(record);
      asm volatile("" : : "r"(&result) : "memory");  // the result is used
    }
    return static_cast<jlong>(
        std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::steady_clock::now() - start).count());
  });
}

// static native long readNatively(ReliqaClassifierInput input, int iterations)
// For the JVM benchmark: reads `input` into a native record `iterations`
// times; returns the nanoseconds the loop took.
jlong readNatively(JNIEnv* env, jclass, jobject input, jint iterations) {
  return entryPoint<jlong>(env, [&] {
    const auto start = std::chrono::steady_clock::now();
    for (jint i = 0; i < iterations; ++i) {
      ReliqaClassifierInput record = readReliqaClassifierInput(input);
      asm volatile("" : : "r"(&record) : "memory");
    }
    return static_cast<jlong>(
        std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::steady_clock::now() - start).count());
  });
}

// A registration that fails: the class has no such native.
void registerMissingNative() {
  static const JNINativeMethod methods[] = {
      {const_cast<char*>("noSuchNative"), const_cast<char*>("()V"),
       reinterpret_cast<void*>(&registerMissingNative)},
  };
  JNIEnv* env = jni::Environment::current();
  jni::LocalRef<jclass> cls = jni::findClassLocal(kNativeReference);
  jni::throwCppExceptionIf(env->RegisterNatives(cls.get(), methods, 1) != JNI_OK);
}

// static native void initializeWithFailingRegistration()
// Runs the layer's initialiser as JNI_OnLoad would, with a registration that
// fails. The initialiser must answer JNI_ERR and leave the VM's error pending,
// which this method then throws.
void initializeWithFailingRegistration(JNIEnv* env, jclass) {
  JavaVM* vm = nullptr;
  env->GetJavaVM(&vm);
  if (kestrova::xplat::initialize(vm, &registerMissingNative) != JNI_ERR) {
    env->ExceptionClear();
    env->ThrowNew(env->FindClass("java/lang/AssertionError"), "initialize did not fail");
  }
}

// A peer that holds nothing, for the attachment check below.
class EmptyPeer : public jni::HybridClass<EmptyPeer> {};

// static native void attachTwice()
// Attaches a second peer to a holder that already has one; the process must
// abort rather than lose track of the first peer.
void attachTwice(JNIEnv* env, jclass) {
  entryPoint<void>(env, [] {
    jni::LocalRef<jobject> hybridData = jni::detail::HybridData::create();
    jni::LocalRef<jobject> destructor = jni::detail::HybridData::getDestructor(hybridData.get());
    attachPeer(destructor.get(), std::make_unique<EmptyPeer>());
    attachPeer(destructor.get(), std::make_unique<EmptyPeer>());
  });
}

void registerNatives() {
  using managed::join;
  static constexpr auto kInputType = managed::typeOf(managed::kInput);
  static constexpr auto kDescribeInput = join("(", kInputType, ")", managed::kStringType);
  static constexpr auto kDescribeServerFeatures =
      join("(", managed::typeOf(managed::kServerFeatures), ")", managed::kStringType);
  static constexpr auto kClassifyDirectly =
      join("(", managed::kStoreType, kInputType, ")", managed::kStringType);
  static constexpr auto kClassifyNatively = join("(", managed::kStoreType, kInputType, "I)J");
  static constexpr auto kReadNatively = join("(", kInputType, "I)J");
  static constexpr auto kFailingStore = join("()", managed::kStoreType);
  static const JNINativeMethod methods[] = {
      {const_cast<char*>("timeBits"), const_cast<char*>("()I"), reinterpret_cast<void*>(&timeBits)},
      {const_cast<char*>("describeInput"), const_cast<char*>(kDescribeInput.text),
       reinterpret_cast<void*>(&describeInput)},
      {const_cast<char*>("describeServerFeatures"), const_cast<char*>(kDescribeServerFeatures.text),
       reinterpret_cast<void*>(&describeServerFeatures)},
      {const_cast<char*>("classifyDirectly"), const_cast<char*>(kClassifyDirectly.text),
       reinterpret_cast<void*>(&classifyDirectly)},
      {const_cast<char*>("initializeWithFailingRegistration"), const_cast<char*>("()V"),
       reinterpret_cast<void*>(&initializeWithFailingRegistration)},
      {const_cast<char*>("attachTwice"), const_cast<char*>("()V"),
       reinterpret_cast<void*>(&attachTwice)},
      {const_cast<char*>("classifyNatively"), const_cast<char*>(kClassifyNatively.text),
       reinterpret_cast<void*>(&classifyNatively)},
      {const_cast<char*>("readNatively"), const_cast<char*>(kReadNatively.text),
       reinterpret_cast<void*>(&readNatively)},
      {const_cast<char*>("failingStore"), const_cast<char*>(kFailingStore.text),
       reinterpret_cast<void*>(&failingStore)},
  };
  JNIEnv* env = jni::Environment::current();
  jni::LocalRef<jclass> cls = jni::findClassLocal(kNativeReference);
  jni::throwCppExceptionIf(env->RegisterNatives(cls.get(), methods, static_cast<jint>(std::size(methods))) != JNI_OK);
}

}  // namespace
}  // namespace kestrova::reliqaclassifier

extern "C" JNIEXPORT jint JNI_OnLoad(JavaVM* vm, void*) {
  return kestrova::xplat::initialize(vm, &kestrova::reliqaclassifier::registerNatives);
}
