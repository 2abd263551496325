#include "host/jni/Exceptions.h"

#include <new>
#include <stdexcept>

#include <glog/logging.h>

#include "host/jni/Environment.h"
#include "host/jni/References.h"
#include "host/jni/Utf.h"

namespace kestrova::jni {
namespace {

// Throwable.toString() of `throwable`, or a fixed text when that fails. Must
// be called with no exception pending; leaves none pending.
std::string describe(JNIEnv* env, jthrowable throwable) {
  const char* fallback = "Java exception";
  LocalRef<jclass> throwableClass(env->FindClass("java/lang/Throwable"));
  if (!throwableClass) {
    env->ExceptionClear();
    return fallback;
  }
  jmethodID toString = env->GetMethodID(throwableClass.get(), "toString", "()Ljava/lang/String;");
  if (toString == nullptr) {
    env->ExceptionClear();
    return fallback;
  }
  LocalRef<jstring> text(static_cast<jstring>(env->CallObjectMethod(throwable, toString)));
  if (env->ExceptionCheck() || !text) {
    env->ExceptionClear();
    return fallback;
  }
  jsize length = env->GetStringLength(text.get());
  std::u16string units(static_cast<size_t>(length), u'\0');
  env->GetStringRegion(text.get(), 0, length, reinterpret_cast<jchar*>(units.data()));
  return utf16ToUtf8(units);
}

// A new, not yet thrown, instance of `className` built with its (String)
// constructor. Returns null with the VM's exception pending on failure.
jthrowable newThrowable(JNIEnv* env, const char* className, const char* message) {
  LocalRef<jclass> cls(env->FindClass(className));
  if (!cls) {
    return nullptr;
  }
  jmethodID constructor = env->GetMethodID(cls.get(), "<init>", "(Ljava/lang/String;)V");
  if (constructor == nullptr) {
    return nullptr;
  }
  std::u16string units = utf8ToUtf16(message);
  LocalRef<jstring> text(
      env->NewString(reinterpret_cast<const jchar*>(units.data()), static_cast<jsize>(units.size())));
  if (!text) {
    return nullptr;
  }
  auto throwable = static_cast<jthrowable>(env->NewObject(cls.get(), constructor, text.get()));
  if (env->ExceptionCheck()) {
    env->DeleteLocalRef(throwable);
    return nullptr;
  }
  return throwable;
}

// Makes a new exception pending. Whatever happens, some exception is pending
// afterwards: the requested one, or the VM's error that prevented it.
void raise(JNIEnv* env, const char* className, const char* message) noexcept {
  try {
    if (env->ExceptionCheck()) {
      env->ExceptionClear();
    }
    LocalRef<jthrowable> throwable(newThrowable(env, className, message));
    if (throwable) {
      env->Throw(throwable.get());
      return;
    }
  } catch (...) {
    // Allocation of the message failed; fall through.
  }
  if (!env->ExceptionCheck()) {
    env->ThrowNew(env->FindClass("java/lang/OutOfMemoryError"), "while reporting a native error");
  }
}

}  // namespace

JniException::JniException(jthrowable throwable) {
  JNIEnv* env = Environment::current();
  auto global = static_cast<jthrowable>(env->NewGlobalRef(throwable));
  if (global == nullptr) {
    throw std::bad_alloc();
  }
  throwable_ = std::shared_ptr<_jobject>(global, [](jobject ref) {
    if (JNIEnv* current = Environment::currentOrNull()) {
      current->DeleteGlobalRef(ref);
    }
  });
  what_ = describe(env, global);
}

JniException::~JniException() = default;

const char* JniException::what() const noexcept {
  return what_.c_str();
}

jthrowable JniException::getThrowable() const noexcept {
  return static_cast<jthrowable>(throwable_.get());
}

void throwPendingJniExceptionAsCppException() {
  JNIEnv* env = Environment::current();
  if (!env->ExceptionCheck()) {
    return;
  }
  LocalRef<jthrowable> throwable(env->ExceptionOccurred());
  env->ExceptionClear();
  throw JniException(throwable.get());
}

void throwCppExceptionIf(bool failed) {
  // Always asks the VM, so that checked JNI sees every call that may raise
  // followed by an exception check; an exception pending after a call that
  // reported success is raised as well.
  throwPendingJniExceptionAsCppException();
  if (failed) {
    throw std::runtime_error("a JNI call failed without raising a Java exception");
  }
}

void throwNewJavaException(const char* throwableName, const char* message) {
  JNIEnv* env = Environment::current();
  LocalRef<jthrowable> throwable(newThrowable(env, throwableName, message));
  throwCppExceptionIf(!throwable);
  throw JniException(throwable.get());
}

void translatePendingCppExceptionToJavaException() noexcept {
  JNIEnv* env = Environment::currentOrNull();
  if (env == nullptr) {
    LOG(ERROR) << "native exception on a thread without a JNI environment; dropped";
    return;
  }
  try {
    throw;
  } catch (const JniException& e) {
    if (env->ExceptionCheck()) {
      env->ExceptionClear();
    }
    if (env->Throw(e.getThrowable()) != JNI_OK) {
      raise(env, "com/kestrova/jni/CppException", e.what());
    }
  } catch (const std::bad_alloc& e) {
    raise(env, "java/lang/OutOfMemoryError", e.what());
  } catch (const std::out_of_range& e) {
    raise(env, "java/lang/IndexOutOfBoundsException", e.what());
  } catch (const std::invalid_argument& e) {
    raise(env, "java/lang/IllegalArgumentException", e.what());
  } catch (const std::exception& e) {
    raise(env, "com/kestrova/jni/CppException", e.what());
  } catch (...) {
    raise(env, "com/kestrova/jni/CppException", "unknown native exception");
  }
}

}  // namespace kestrova::jni
