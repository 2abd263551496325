// The Java VM and the JNI environment of the calling thread.
//
// `kestrova::xplat::initialize` is called from a library's JNI_OnLoad: it
// remembers the VM for the life of the process and runs the library's
// registration callback once. Native methods construct a `ThreadScope` from
// the JNIEnv* they received; while it lives, `Environment::current()` returns
// that environment on this thread. Outside any scope the environment is asked
// from the VM, which works for every thread the VM knows.
//
// The VM and the scopes are kept by libkestrova_host.so for every library of
// the process; `initialize` and `current` are compiled into each library (see
// Api.h).
//
// Thread-safety: all functions may be called from any thread. ThreadScope is
// bound to the thread that created it and must be destroyed on it.
#pragma once

#include <jni.h>

#include "host/jni/Api.h"

namespace kestrova::xplat {

// Remembers `vm`, runs `registerNatives` once with the VM's environment
// current, and returns JNI_VERSION_1_6. If the callback throws, the failure is
// left pending as a Java exception and JNI_ERR is returned, so that the Java
// call loading the library fails with that exception. A second, different VM
// is refused (logged, JNI_ERR).
jint initialize(JavaVM* vm, void (*registerNatives)());

}  // namespace kestrova::xplat

namespace kestrova::jni {

class Environment {
 public:
  // The JNIEnv* of the calling thread. Throws std::runtime_error when the
  // layer was never initialised or the thread is unknown to the VM.
  static JNIEnv* current();

  // As current(), but nullptr instead of throwing. For destructors.
  KESTROVA_JNI_API static JNIEnv* currentOrNull() noexcept;

  // The VM given to initialize(), or nullptr.
  KESTROVA_JNI_API static JavaVM* vm() noexcept;
};

class ThreadScope {
 public:
  KESTROVA_JNI_API explicit ThreadScope(JNIEnv* env) noexcept;
  KESTROVA_JNI_API ~ThreadScope();

  ThreadScope(const ThreadScope&) = delete;
  ThreadScope& operator=(const ThreadScope&) = delete;

 private:
  JNIEnv* previous_;
};

namespace detail {

// Makes `vm` the process's VM. False (logged) when another VM came first.
KESTROVA_JNI_API bool attachVm(JavaVM* vm) noexcept;

}  // namespace detail
}  // namespace kestrova::jni
