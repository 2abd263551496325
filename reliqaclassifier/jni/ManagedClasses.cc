#include "reliqaclassifier/jni/ManagedClasses.h"

#include "host/jni/Lookup.h"

namespace kestrova::reliqaclassifier::managed {

jclass classifierWrapperClass() {
  static const jclass cls = jni::findClassStatic(kClassifierWrapper);
  return cls;
}

jclass resultWrapperClass() {
  static const jclass cls = jni::findClassStatic(kResultWrapper);
  return cls;
}

jclass hybridClassBaseClass() {
  static const jclass cls = jni::findClassStatic(kHybridClassBase);
  return cls;
}

}  // namespace kestrova::reliqaclassifier::managed
