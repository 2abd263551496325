// Java strings as standard UTF-8 byte strings (see Utf.h for the encoding).
//
// JString is a non-owning view of a jstring; conversions use the calling
// thread's environment. A null string is rejected with a Java
// NullPointerException (thrown as JniException); callers that want a more
// precise message check for null first.
#pragma once

#include <jni.h>

#include <string>
#include <string_view>

#include "host/jni/References.h"

namespace kestrova::jni {

class JString {
 public:
  explicit JString(jstring ref) noexcept : ref_(ref) {}

  jstring get() const noexcept { return ref_; }

  std::string toStdString() const;

  // A new Java string from UTF-8 bytes.
  static LocalRef<jstring> fromStdString(std::string_view utf8);

 private:
  jstring ref_;
};

}  // namespace kestrova::jni
