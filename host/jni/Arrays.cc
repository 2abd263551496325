#include "host/jni/Arrays.h"

#include <limits>
#include <stdexcept>

#include "host/jni/Exceptions.h"

namespace kestrova::jni {

jsize JPrimitiveArray<jbyteArray>::size() const {
  return Environment::current()->GetArrayLength(ref_);
}

void JPrimitiveArray<jbyteArray>::setRegion(jsize start, jsize count, const jbyte* data) {
  JNIEnv* env = Environment::current();
  env->SetByteArrayRegion(ref_, start, count, data);
  throwPendingJniExceptionAsCppException();
}

std::string JPrimitiveArray<jbyteArray>::toStdString() const {
  JNIEnv* env = Environment::current();
  std::string bytes(static_cast<size_t>(env->GetArrayLength(ref_)), '\0');
  env->GetByteArrayRegion(ref_, 0, static_cast<jsize>(bytes.size()),
                          reinterpret_cast<jbyte*>(bytes.data()));
  throwPendingJniExceptionAsCppException();
  return bytes;
}

LocalRef<jbyteArray> make_byte_array(jsize size) {
  LocalRef<jbyteArray> array(Environment::current()->NewByteArray(size));
  throwCppExceptionIf(!array);
  return array;
}

LocalRef<jbyteArray> make_byte_array(const std::string& bytes) {
  if (bytes.size() > static_cast<size_t>(std::numeric_limits<jsize>::max())) {
    throw std::length_error("string too long for a Java byte array");
  }
  auto size = static_cast<jsize>(bytes.size());
  LocalRef<jbyteArray> array = make_byte_array(size);
  if (size > 0) {
    JPrimitiveArray<jbyteArray>(array.get())
        .setRegion(0, size, reinterpret_cast<const jbyte*>(bytes.data()));
  }
  return array;
}

}  // namespace kestrova::jni
