// Entry point of libreliqaclassifier.so, its only exported symbols besides
// the weak alias JNI_OnLoad_Weak: registers the natives of the classifier
// wrapper and of the result wrapper.
#include <jni.h>

#include "host/jni/Environment.h"
#include "reliqaclassifier/jni/ReliqaClassifierHybrid.h"
#include "reliqaclassifier/jni/ReliqaClassifierResultHybrid.h"

namespace {

void registerNatives() {
  kestrova::reliqaclassifier::ReliqaClassifierHybrid::registerNatives();
  kestrova::reliqaclassifier::ReliqaClassifierResultHybrid::registerNatives();
}

}  // namespace

extern "C" JNIEXPORT jint JNI_OnLoad(JavaVM* vm, void*) {
  return kestrova::xplat::initialize(vm, &registerNatives);
}

extern "C" JNIEXPORT jint JNI_OnLoad_Weak(JavaVM* vm, void* reserved)
    __attribute__((weak, alias("JNI_OnLoad")));
