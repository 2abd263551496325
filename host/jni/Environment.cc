// The layer's process-wide state, kept in libkestrova_host.so.
#include "host/jni/Environment.h"

#include <atomic>

#include <glog/logging.h>

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

JavaVM* Environment::vm() noexcept {
  return theVm.load(std::memory_order_acquire);
}

ThreadScope::ThreadScope(JNIEnv* env) noexcept : previous_(scopedEnv) {
  scopedEnv = env;
}

ThreadScope::~ThreadScope() {
  scopedEnv = previous_;
}

namespace detail {

bool attachVm(JavaVM* vm) noexcept {
  JavaVM* expected = nullptr;
  if (!theVm.compare_exchange_strong(expected, vm, std::memory_order_acq_rel) && expected != vm) {
    LOG(ERROR) << "JNI support layer initialised with a second Java VM; keeping the first";
    return false;
  }
  return true;
}

}  // namespace detail
}  // namespace kestrova::jni
