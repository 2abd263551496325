#include "reliqaclassifier/jni/Peers.h"

#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"
#include "host/jni/Lookup.h"
#include "host/jni/References.h"
#include "reliqaclassifier/jni/ManagedClasses.h"

namespace kestrova::reliqaclassifier {
namespace {

[[noreturn]] void throwNoPeer() {
  jni::throwNewJavaException("java/lang/NullPointerException", "java.lang.NullPointerException");
}

}  // namespace

PeerClass PeerClass::describe(jobject object, const char* className) {
  JNIEnv* env = jni::Environment::current();
  PeerClass result;
  jni::LocalRef<jclass> objectClass(env->GetObjectClass(object));
  result.derivesFromHybridClassBase =
      env->IsAssignableFrom(objectClass.get(), managed::hybridClassBaseClass());
  if (result.derivesFromHybridClassBase) {
    result.destructorField =
        jni::getFieldId(objectClass.get(), "mDestructor", managed::kDestructorType);
  } else {
    result.hybridDataField =
        jni::getFieldId(jni::findClassLocal(className).get(), "mHybridData", managed::kHybridDataType);
  }
  return result;
}

jlong findPeer(jobject object, const PeerClass& peerClass) {
  JNIEnv* env = jni::Environment::current();
  jni::LocalRef<jobject> destructor;
  if (peerClass.derivesFromHybridClassBase) {
    destructor.reset(env->GetObjectField(object, peerClass.destructorField));
  } else {
    jni::LocalRef<jobject> hybridData(env->GetObjectField(object, peerClass.hybridDataField));
    if (!hybridData) {
      throwNoPeer();
    }
    destructor = jni::detail::HybridData::getDestructor(hybridData.get());
  }
  jlong address = destructor ? jni::detail::HybridData::getNativePointer(destructor.get()) : 0;
  if (address == 0) {
    throwNoPeer();
  }
  return address;
}

void attachPeer(jobject destructor, std::unique_ptr<jni::BaseHybridClass> peer) {
  jni::detail::HybridData::setNativePointer(destructor, std::move(peer));
}

}  // namespace kestrova::reliqaclassifier
