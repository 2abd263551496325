#include "host/jni/Lookup.h"

#include "host/jni/Exceptions.h"

namespace kestrova::jni {

jclass findClassStatic(const char* name) {
  LocalRef<jclass> local = findClassLocal(name);
  auto global = static_cast<jclass>(Environment::current()->NewGlobalRef(local.get()));
  if (global == nullptr) {
    throw std::bad_alloc();
  }
  return global;
}

LocalRef<jclass> findClassLocal(const char* name) {
  LocalRef<jclass> cls(Environment::current()->FindClass(name));
  throwCppExceptionIf(!cls);
  return cls;
}

jfieldID getFieldId(jclass cls, const char* name, const char* signature) {
  jfieldID field = Environment::current()->GetFieldID(cls, name, signature);
  throwCppExceptionIf(field == nullptr);
  return field;
}

jmethodID getMethodId(jclass cls, const char* name, const char* signature) {
  jmethodID method = Environment::current()->GetMethodID(cls, name, signature);
  throwCppExceptionIf(method == nullptr);
  return method;
}

}  // namespace kestrova::jni
