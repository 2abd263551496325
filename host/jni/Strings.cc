#include "host/jni/Strings.h"

#include "host/jni/Exceptions.h"
#include "host/jni/Utf.h"

namespace kestrova::jni {

std::string JString::toStdString() const {
  if (ref_ == nullptr) {
    throwNewJavaException("java/lang/NullPointerException", "null string");
  }
  JNIEnv* env = Environment::current();
  jsize length = env->GetStringLength(ref_);
  std::u16string units(static_cast<size_t>(length), u'\0');
  static_assert(sizeof(jchar) == sizeof(char16_t));
  env->GetStringRegion(ref_, 0, length, reinterpret_cast<jchar*>(units.data()));
  throwPendingJniExceptionAsCppException();
  return utf16ToUtf8(units);
}

LocalRef<jstring> JString::fromStdString(std::string_view utf8) {
  std::u16string units = utf8ToUtf16(utf8);
  JNIEnv* env = Environment::current();
  LocalRef<jstring> result(
      env->NewString(reinterpret_cast<const jchar*>(units.data()), static_cast<jsize>(units.size())));
  throwCppExceptionIf(!result);
  return result;
}

}  // namespace kestrova::jni
