// Names of the Java classes that the classifier library works with, their JNI
// type signatures, and the process-wide class references of those it
// registers natives on or creates.
//
// Each package is spelled once; class names and signatures are joined from it
// at compile time with join(), which the binding's files also use for their
// method signatures.
//
// Each class is looked up once, on first use, through the class loader of the
// calling native method (or of the code that loads the library), and kept for
// the life of the process. Lookups are thread-safe; a failed lookup raises the
// VM's NoClassDefFoundError and is retried on the next call.
#pragma once

#include <jni.h>

#include <cstddef>

namespace kestrova::reliqaclassifier::managed {

// A string constant joined at compile time; converts to the C string that JNI
// takes.
template <size_t N>
struct JoinedName {
  char text[N];
  constexpr operator const char*() const { return text; }
};

namespace detail {
template <typename T>
struct NameLength;
template <size_t N>
struct NameLength<char[N]> {
  static constexpr size_t value = N - 1;
};
template <size_t N>
struct NameLength<JoinedName<N>> {
  static constexpr size_t value = N - 1;
};
}  // namespace detail

// The parts (string literals, char arrays, JoinedNames) one after another.
template <typename... Parts>
constexpr JoinedName<(detail::NameLength<Parts>::value + ... + 1)> join(const Parts&... parts) {
  JoinedName<(detail::NameLength<Parts>::value + ... + 1)> joined{};
  size_t at = 0;
  const char* const starts[] = {parts...};
  const size_t lengths[] = {detail::NameLength<Parts>::value...};
  for (size_t part = 0; part < sizeof...(Parts); ++part) {
    for (size_t i = 0; i < lengths[part]; ++i) joined.text[at++] = starts[part][i];
  }
  return joined;
}

// "Lcom/example/Name;" for the class "com/example/Name".
template <typename Name>
constexpr auto typeOf(const Name& className) {
  return join("L", className, ";");
}

// The classifier's own classes.
inline constexpr char kModelsPackage[] = "com/kestrova/sharefold/reliqaclassifier/models/";

inline constexpr auto kClassifierWrapper =
    join(kModelsPackage, "ReliqaClassifier$ReliqaClassifierWrapper");
inline constexpr auto kResultWrapper =
    join(kModelsPackage, "ReliqaClassifierResult$ReliqaClassifierResultWrapper");
inline constexpr auto kInput = join(kModelsPackage, "ReliqaClassifierInput");
inline constexpr auto kLocationInfo = join(kModelsPackage, "LocationInfo");
inline constexpr auto kAssetCounts = join(kModelsPackage, "AssetCounts");
inline constexpr auto kAssetDetail = join(kModelsPackage, "AssetDetail");
inline constexpr auto kOptionalImageMetricValue = join(kModelsPackage, "OptionalImageMetricValue");
inline constexpr auto kDuplicateInfo = join(kModelsPackage, "DuplicateInfo");
inline constexpr auto kModelParams = join(kModelsPackage, "ReliqaClassifierModelParams");
inline constexpr auto kServerFeatures = join(kModelsPackage, "ReliqaClassifierServerFeatures");

// The host application's classes.
inline constexpr char kStore[] = "com/kestrova/keystash/PersistentKeyValueStore";
inline constexpr char kHostJniPackage[] = "com/kestrova/jni/";
inline constexpr auto kHybridData = join(kHostJniPackage, "HybridData");
inline constexpr auto kHybridClassBase = join(kHostJniPackage, "HybridClassBase");
inline constexpr auto kMapIteratorHelper = join(kHostJniPackage, "MapIteratorHelper");

// JNI type signatures.
inline constexpr auto kHybridDataType = typeOf(kHybridData);
inline constexpr auto kDestructorType = typeOf(join(kHybridData, "$Destructor"));
inline constexpr auto kStoreType = typeOf(kStore);
inline constexpr char kStringType[] = "Ljava/lang/String;";

jclass classifierWrapperClass();
jclass resultWrapperClass();
jclass hybridClassBaseClass();

}  // namespace kestrova::reliqaclassifier::managed
