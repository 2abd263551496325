// The layer's fatal assertion, for broken invariants that no caller can
// recover from (a peer attached twice).
#pragma once

#include "host/jni/Api.h"

namespace kestrova {

// Writes the printf-style diagnostic through the fatal log and aborts.
[[noreturn]] KESTROVA_JNI_API void assertInternal(const char* format, ...)
    __attribute__((format(printf, 1, 2)));

}  // namespace kestrova
