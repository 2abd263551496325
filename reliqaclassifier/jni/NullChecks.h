// Rejection of null references that the Java side must not pass.
//
// The binding reads managed objects without trusting them: every reference it
// is about to follow is checked first, and a null is reported as a Java
// NullPointerException whose message names the place, for example
// "ReliqaClassifierInput.assetDetails[3] is null", before anything reaches the
// classifier.
#pragma once

#include <string>

#include "host/jni/Exceptions.h"

namespace kestrova::reliqaclassifier {

// The place of a managed object in the graph being read:
// "ReliqaClassifierInput.assetDetails[3]", "ReliqaClassifierInput.locationInfo".
class ObjectPath {
 public:
  explicit ObjectPath(const char* base, long index = -1) : base_(base), index_(index) {}

  std::string str() const {
    std::string text = base_;
    if (index_ >= 0) {
      text += '[' + std::to_string(index_) + ']';
    }
    return text;
  }

  std::string field(const char* name) const { return str() + '.' + name; }

 private:
  const char* base_;
  long index_;
};

[[noreturn]] inline void throwNullPointer(const std::string& what) {
  jni::throwNewJavaException("java/lang/NullPointerException", (what + " is null").c_str());
}

}  // namespace kestrova::reliqaclassifier
