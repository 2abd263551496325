// Copies the managed description of one candidate collection (a
// com.kestrova.sharefold.reliqaclassifier.models.ReliqaClassifierInput and the
// objects reachable from it) into a native ReliqaClassifierInput record.
//
// The reader only reads fields: it calls no Java method and keeps no
// reference. A null "locationInfo" gives an absent location and a null
// "assetCounts" ten zero counts; any other null (the input itself, its arrays
// and their elements, the metric objects, every string) is rejected with a
// Java NullPointerException naming it. Missing classes or fields raise the
// VM's own errors. Local references are released per array element, so the
// number of live references does not grow with the collection's size.
//
// Runs on the calling thread; field identifiers are looked up once per process.
#pragma once

#include <jni.h>

#include "reliqaclassifier/ReliqaClassifierInput.h"

namespace kestrova::reliqaclassifier {

ReliqaClassifierInput readReliqaClassifierInput(jobject input);

}  // namespace kestrova::reliqaclassifier
