// Crossing between Java exceptions and C++ exceptions.
//
// Native code that calls into the VM turns a pending Java exception into a
// C++ `JniException` (which keeps the Java throwable alive through a global
// reference) and lets it unwind like any other exception. At the boundary back
// to Java, `translatePendingCppExceptionToJavaException()` (called inside a
// catch handler) makes the matching Java exception pending:
//
//   JniException            the carried Java throwable itself
//   std::bad_alloc          java.lang.OutOfMemoryError
//   std::out_of_range       java.lang.IndexOutOfBoundsException
//   std::invalid_argument   java.lang.IllegalArgumentException
//   other std::exception    com.kestrova.jni.CppException
//   anything else           com.kestrova.jni.CppException "unknown native exception"
//
// The message of a translated exception is what() of the C++ exception.
// Everything here uses the calling thread's environment (Environment::current)
// and is compiled into each library that uses it, so the exception handled by
// translatePendingCppExceptionToJavaException() is one its own runtime threw
// (see Api.h).
#pragma once

#include <jni.h>

#include <cstdio>
#include <exception>
#include <memory>
#include <string>

namespace kestrova::jni {

class JniException : public std::exception {
 public:
  // Keeps `throwable` (any kind of reference) through a new global reference.
  explicit JniException(jthrowable throwable);
  ~JniException() override;

  // "<class name>: <message>" of the carried throwable.
  const char* what() const noexcept override;

  // The carried throwable (a global reference owned by this object).
  jthrowable getThrowable() const noexcept;

 private:
  std::shared_ptr<_jobject> throwable_;
  std::string what_;
};

// Raises the pending Java exception, if any, as a JniException; otherwise,
// when `failed`, a std::runtime_error. Call it right after a JNI call that may
// raise, with that call's failure indication.
void throwCppExceptionIf(bool failed);

// If a Java exception is pending, clears it and throws it as a JniException.
void throwPendingJniExceptionAsCppException();

// Throws a JniException carrying a new Java exception of class
// `throwableName` (slash form) with `message` (UTF-8).
[[noreturn]] void throwNewJavaException(const char* throwableName,
                                                         const char* message);

// As above with a printf-style message; at least one argument is required.
template <typename Arg, typename... Args>
[[noreturn]] void throwNewJavaException(const char* throwableName, const char* format,
                                        Arg arg, Args... args) {
  int length = std::snprintf(nullptr, 0, format, arg, args...);
  std::string message(length > 0 ? static_cast<size_t>(length) : 0, '\0');
  if (length > 0) {
    std::snprintf(message.data(), message.size() + 1, format, arg, args...);
  }
  throwNewJavaException(throwableName, message.c_str());
}

// To be called inside a catch handler: makes the Java exception that matches
// the exception being handled pending on the current thread (table above).
// Never throws; if even that fails, the VM's own error stays pending.
void translatePendingCppExceptionToJavaException() noexcept;

}  // namespace kestrova::jni
