// Lookups of classes, fields and methods.
//
// Every lookup that fails raises the VM's own error (NoClassDefFoundError,
// NoSuchFieldError, NoSuchMethodError) as a JniException. Class names are in
// slash form ("java/lang/String"). Classes are resolved through the class
// loader of the calling native method (or of the code loading the library,
// inside JNI_OnLoad).
//
// Callers keep what they look up for the life of the process, typically in a
// function-local static, so each lookup happens once.
#pragma once

#include <jni.h>

#include "host/jni/References.h"

namespace kestrova::jni {

// A global reference that is never released.
jclass findClassStatic(const char* name);

LocalRef<jclass> findClassLocal(const char* name);

jfieldID getFieldId(jclass cls, const char* name, const char* signature);
jmethodID getMethodId(jclass cls, const char* name, const char* signature);

}  // namespace kestrova::jni
