// The frame around every native method of the classifier library.
//
// entryPoint<R>(env, body) makes `env` the thread's current environment for
// the duration of the call, runs `body`, and returns its value. An exception
// that escapes `body` becomes a pending Java exception (see
// host/jni/Exceptions.h for the mapping) and the method returns the zero value
// of R: null, 0.0, false or nothing.
#pragma once

#include <jni.h>

#include <type_traits>

#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"

namespace kestrova::reliqaclassifier {

template <typename R, typename Body>
R entryPoint(JNIEnv* env, Body&& body) noexcept {
  jni::ThreadScope scope(env);
  try {
    return body();
  } catch (...) {
    jni::translatePendingCppExceptionToJavaException();
  }
  if constexpr (!std::is_void_v<R>) {
    return R{};
  }
}

}  // namespace kestrova::reliqaclassifier
