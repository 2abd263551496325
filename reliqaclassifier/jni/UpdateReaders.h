// Readers of the two managed update objects: model parameters
// (com.kestrova.sharefold.reliqaclassifier.models.ReliqaClassifierModelParams)
// and server features (...ReliqaClassifierServerFeatures).
//
// readModelParams copies "mSerializedModel", "mModelId" and "mThreshold"
// unchanged. readServerFeatures walks the "features" map through a
// com.kestrova.jni.MapIteratorHelper, in the map's iteration order: each key
// and value must be a java.lang.String (else ClassCastException "Tried to
// cast from <class> to java/lang/String."), the value is read as a number and
// the key as a feature id (ServerFeatureText.h); the first entry for an id
// wins, and a key out of the 32-bit range is dropped with a WARNING log.
//
// Nulls (the object, its strings, the map, a key or a value) are rejected
// with a Java NullPointerException naming them; nothing is returned then.
// Runs on the calling thread; identifiers are looked up once per process.
#pragma once

#include <jni.h>

#include "reliqaclassifier/ReliqaClassifierInput.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace kestrova::reliqaclassifier {

ReliqaClassifierModelParams readModelParams(jobject params);

thornvale::FeatureMap readServerFeatures(jobject serverFeatures);

}  // namespace kestrova::reliqaclassifier
