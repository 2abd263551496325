// Entry point of libkestrova_host.so: registers the natives of the host's own
// Java classes (peer destruction and the persistent store).
#include <jni.h>

#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"
#include "host/jni/Hybrid.h"
#include "host/jni/Lookup.h"
#include "host/jni/PersistentKeyValueStoreHybrid.h"

namespace {

// HybridData.Destructor: private static native void deleteNative(long nativePointer)
void deleteNative(JNIEnv* env, jclass, jlong nativePointer) {
  kestrova::jni::ThreadScope scope(env);
  // Peers' destructors do not throw; a destructor that did would terminate.
  delete kestrova::jni::detail::peerFromNativePointer(nativePointer);
}

void registerHostNatives() {
  using namespace kestrova::jni;
  JNIEnv* env = Environment::current();
  LocalRef<jclass> destructor = findClassLocal("com/kestrova/jni/HybridData$Destructor");
  const JNINativeMethod methods[] = {
      {const_cast<char*>("deleteNative"), const_cast<char*>("(J)V"),
       reinterpret_cast<void*>(&deleteNative)},
  };
  throwCppExceptionIf(env->RegisterNatives(destructor.get(), methods, 1) != JNI_OK);
  kestrova::mobile::xplat::keystash::PersistentKeyValueStoreHybrid::registerNatives();
}

}  // namespace

extern "C" JNIEXPORT jint JNI_OnLoad(JavaVM* vm, void*) {
  return kestrova::xplat::initialize(vm, &registerHostNatives);
}
