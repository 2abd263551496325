// Names of the Java classes that the classifier library works with, and the
// process-wide class references of those it registers natives on or creates.
//
// Each class is looked up once, on first use, through the class loader of the
// calling native method (or of the code that loads the library), and kept for
// the life of the process. Lookups are thread-safe; a failed lookup raises the
// VM's NoClassDefFoundError and is retried on the next call.
#pragma once

#include <jni.h>

namespace kestrova::reliqaclassifier::managed {

#define RELIQA_MODELS "com/kestrova/sharefold/reliqaclassifier/models/"

inline constexpr const char* kClassifierWrapper =
    RELIQA_MODELS "ReliqaClassifier$ReliqaClassifierWrapper";
inline constexpr const char* kResultWrapper =
    RELIQA_MODELS "ReliqaClassifierResult$ReliqaClassifierResultWrapper";
inline constexpr const char* kInput = RELIQA_MODELS "ReliqaClassifierInput";
inline constexpr const char* kLocationInfo = RELIQA_MODELS "LocationInfo";
inline constexpr const char* kAssetCounts = RELIQA_MODELS "AssetCounts";
inline constexpr const char* kAssetDetail = RELIQA_MODELS "AssetDetail";
inline constexpr const char* kOptionalImageMetricValue = RELIQA_MODELS "OptionalImageMetricValue";
inline constexpr const char* kDuplicateInfo = RELIQA_MODELS "DuplicateInfo";
inline constexpr const char* kModelParams = RELIQA_MODELS "ReliqaClassifierModelParams";
inline constexpr const char* kServerFeatures = RELIQA_MODELS "ReliqaClassifierServerFeatures";

#undef RELIQA_MODELS

inline constexpr const char* kStore = "com/kestrova/keystash/PersistentKeyValueStore";
inline constexpr const char* kHybridClassBase = "com/kestrova/jni/HybridClassBase";
inline constexpr const char* kMapIteratorHelper = "com/kestrova/jni/MapIteratorHelper";

// JNI type signatures.
inline constexpr const char* kHybridDataType = "Lcom/kestrova/jni/HybridData;";
inline constexpr const char* kDestructorType = "Lcom/kestrova/jni/HybridData$Destructor;";
inline constexpr const char* kStringType = "Ljava/lang/String;";

jclass classifierWrapperClass();
jclass resultWrapperClass();
jclass hybridClassBaseClass();

}  // namespace kestrova::reliqaclassifier::managed
