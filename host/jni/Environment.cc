#include "host/jni/Environment.h"

#include <atomic>
#include <stdexcept>

#include <glog/logging.h>

#include "host/jni/Exceptions.h"

namespace kestrova::jni {
namespace {

// The one VM of the process; set once by initialize() and never cleared.
std::atomic<JavaVM*> theVm{nullptr};

thread_local JNIEnv* scopedEnv = nullptr;

}  // namespace

JNIEnv* Environment::currentOrNull() noexcept {
  if (scopedEnv != nullptr) {
    return scopedEnv;
  }
  JavaVM* vm = theVm.load(std::memory_order_acquire);
  if (vm == nullptr) {
    return nullptr;
  }
  void* env = nullptr;
  if (vm->GetEnv(&env, JNI_VERSION_1_6) != JNI_OK) {
    return nullptr;
  }
  return static_cast<JNIEnv*>(env);
}

JNIEnv* Environment::current() {
  if (JNIEnv* env = currentOrNull()) {
    return env;
  }
  if (vm() == nullptr) {
    throw std::runtime_error("the JNI support layer has not been initialised by JNI_OnLoad");
  }
  throw std::runtime_error("the calling thread is not attached to the Java VM");
}

JavaVM* Environment::vm() noexcept {
  return theVm.load(std::memory_order_acquire);
}

ThreadScope::ThreadScope(JNIEnv* env) noexcept : previous_(scopedEnv) {
  scopedEnv = env;
}

ThreadScope::~ThreadScope() {
  scopedEnv = previous_;
}

}  // namespace kestrova::jni

namespace kestrova::xplat {

jint initialize(JavaVM* vm, void (*registerNatives)()) {
  JavaVM* expected = nullptr;
  if (!jni::theVm.compare_exchange_strong(expected, vm, std::memory_order_acq_rel) &&
      expected != vm) {
    LOG(ERROR) << "JNI support layer initialised with a second Java VM; keeping the first";
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
