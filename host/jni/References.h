// Owning handles for JNI references.
//
// LocalRef<T> deletes a local reference when it goes out of scope, so that a
// native method that walks a large object graph keeps only a bounded number
// of local references alive. GlobalRef<T> does the same for a global
// reference. Both are move-only; release() hands the reference to the caller
// (for example as a native method's return value).
//
// Both use the environment of the calling thread (Environment::current), so a
// handle must be destroyed on the thread that made it (local references are
// thread-bound anyway). Destruction never throws; it is allowed while a Java
// exception is pending.
#pragma once

#include <jni.h>

#include <new>
#include <utility>

#include "host/jni/Environment.h"

namespace kestrova::jni {

template <typename T>
class LocalRef {
 public:
  LocalRef() noexcept = default;
  explicit LocalRef(T ref) noexcept : ref_(ref) {}
  LocalRef(LocalRef&& other) noexcept : ref_(other.release()) {}
  LocalRef& operator=(LocalRef&& other) noexcept {
    reset(other.release());
    return *this;
  }
  LocalRef(const LocalRef&) = delete;
  LocalRef& operator=(const LocalRef&) = delete;
  ~LocalRef() { reset(); }

  T get() const noexcept { return ref_; }
  explicit operator bool() const noexcept { return ref_ != nullptr; }

  T release() noexcept { return std::exchange(ref_, nullptr); }

  void reset(T ref = nullptr) noexcept {
    T old = std::exchange(ref_, ref);
    if (old != nullptr) {
      if (JNIEnv* env = Environment::currentOrNull()) {
        env->DeleteLocalRef(old);
      }
    }
  }

 private:
  T ref_ = nullptr;
};

template <typename T>
class GlobalRef {
 public:
  GlobalRef() noexcept = default;
  // Makes a new global reference to `ref`; null stays null. Throws
  // std::bad_alloc when the VM cannot create one.
  static GlobalRef make(JNIEnv* env, T ref) {
    GlobalRef result;
    if (ref != nullptr) {
      result.ref_ = static_cast<T>(env->NewGlobalRef(ref));
      if (result.ref_ == nullptr) {
        throw std::bad_alloc();
      }
    }
    return result;
  }
  GlobalRef(GlobalRef&& other) noexcept : ref_(std::exchange(other.ref_, nullptr)) {}
  GlobalRef& operator=(GlobalRef&& other) noexcept {
    reset();
    ref_ = std::exchange(other.ref_, nullptr);
    return *this;
  }
  GlobalRef(const GlobalRef&) = delete;
  GlobalRef& operator=(const GlobalRef&) = delete;
  ~GlobalRef() { reset(); }

  T get() const noexcept { return ref_; }
  explicit operator bool() const noexcept { return ref_ != nullptr; }

  // Gives up ownership: the reference is then never deleted by this handle.
  T release() noexcept { return std::exchange(ref_, nullptr); }

  void reset() noexcept {
    T old = std::exchange(ref_, nullptr);
    if (old != nullptr) {
      if (JNIEnv* env = Environment::currentOrNull()) {
        env->DeleteGlobalRef(old);
      }
    }
  }

 private:
  T ref_ = nullptr;
};

}  // namespace kestrova::jni
