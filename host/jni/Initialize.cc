// The parts of Environment.h that may throw, compiled into each library.
#include <stdexcept>

#include <glog/logging.h>

#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"

namespace kestrova::jni {

JNIEnv* Environment::current() {
  if (JNIEnv* env = currentOrNull()) {
    return env;
  }
  if (vm() == nullptr) {
    throw std::runtime_error("the JNI support layer has not been initialised by JNI_OnLoad");
  }
  throw std::runtime_error("the calling thread is not attached to the Java VM");
}

}  // namespace kestrova::jni

namespace kestrova::xplat {

jint initialize(JavaVM* vm, void (*registerNatives)()) {
  if (!jni::detail::attachVm(vm)) {
    return JNI_ERR;
  }
  void* env = nullptr;
  if (vm->GetEnv(&env, JNI_VERSION_1_6) != JNI_OK) {
    LOG(ERROR) << "JNI_OnLoad called on a thread without a JNI 1.6 environment";
    return JNI_ERR;
  }
  jni::ThreadScope scope(static_cast<JNIEnv*>(env));
  try {
    registerNatives();
  } catch (...) {
    jni::translatePendingCppExceptionToJavaException();
    return JNI_ERR;
  }
  return JNI_VERSION_1_6;
}

}  // namespace kestrova::xplat
