// The HybridData helpers of Hybrid.h, compiled into each library.
#include "host/jni/Hybrid.h"

#include "host/jni/Assert.h"
#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"
#include "host/jni/Lookup.h"

namespace kestrova::jni {

namespace detail {
namespace {

constexpr const char* kHybridData = "com/kestrova/jni/HybridData";
constexpr const char* kDestructor = "com/kestrova/jni/HybridData$Destructor";

jclass hybridDataClass() {
  static const jclass cls = findClassStatic(kHybridData);
  return cls;
}

jfieldID nativePointerField() {
  static const jfieldID field = getFieldId(findClassLocal(kDestructor).get(), "mNativePointer", "J");
  return field;
}

}  // namespace

LocalRef<jobject> HybridData::create() {
  static const jmethodID constructor = getMethodId(hybridDataClass(), "<init>", "()V");
  LocalRef<jobject> hybridData(Environment::current()->NewObject(hybridDataClass(), constructor));
  throwCppExceptionIf(!hybridData);
  return hybridData;
}

LocalRef<jobject> HybridData::getDestructor(jobject hybridData) {
  static const jfieldID field =
      getFieldId(hybridDataClass(), "mDestructor", "Lcom/kestrova/jni/HybridData$Destructor;");
  LocalRef<jobject> destructor(Environment::current()->GetObjectField(hybridData, field));
  throwPendingJniExceptionAsCppException();
  return destructor;
}

jlong HybridData::getNativePointer(jobject destructor) {
  return Environment::current()->GetLongField(destructor, nativePointerField());
}

void HybridData::setNativePointer(jobject destructor, std::unique_ptr<BaseHybridClass> peer) {
  JNIEnv* env = Environment::current();
  jfieldID field = nativePointerField();
  if (peer != nullptr && env->GetLongField(destructor, field) != 0) {
    assertInternal("Fatal error (%s:%d): Attempt to set C++ native pointer twice", __FILE__,
                   __LINE__);
  }
  env->SetLongField(destructor, field, toNativePointer(peer.get()));
  throwPendingJniExceptionAsCppException();
  peer.release();  // owned by the Java destructor object from now on
}

}  // namespace detail
}  // namespace kestrova::jni
