// Java primitive arrays.
//
// make_byte_array creates a new byte[] (a local reference); JPrimitiveArray is
// a non-owning view through which bytes are copied in and out. Allocation
// failures and bad regions raise the VM's exception as JniException.
#pragma once

#include <jni.h>

#include <string>

#include "host/jni/References.h"

namespace kestrova::jni {

template <typename ArrayT>
class JPrimitiveArray;

template <>
class JPrimitiveArray<jbyteArray> {
 public:
  explicit JPrimitiveArray(jbyteArray ref) noexcept : ref_(ref) {}

  jbyteArray get() const noexcept { return ref_; }
  jsize size() const;

  void setRegion(jsize start, jsize count, const jbyte* data);
  std::string toStdString() const;  // every byte of the array

 private:
  jbyteArray ref_;
};

LocalRef<jbyteArray> make_byte_array(jsize size);

// A new byte[] holding exactly `bytes`.
LocalRef<jbyteArray> make_byte_array(const std::string& bytes);

}  // namespace kestrova::jni
