#include "reliqaclassifier/jni/InputReader.h"

#include <string>
#include <utility>
#include <vector>

#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"
#include "host/jni/Lookup.h"
#include "host/jni/References.h"
#include "host/jni/Strings.h"
#include "reliqaclassifier/jni/ManagedClasses.h"
#include "reliqaclassifier/jni/NullChecks.h"

namespace kestrova::reliqaclassifier {
namespace {

using jni::LocalRef;

// Types of the fields that hold the input's nested objects.
constexpr auto kLocationInfoType = managed::typeOf(managed::kLocationInfo);
constexpr auto kAssetCountsType = managed::typeOf(managed::kAssetCounts);
constexpr auto kAssetDetailArrayType = managed::join("[", managed::typeOf(managed::kAssetDetail));
constexpr auto kDuplicateInfoArrayType =
    managed::join("[", managed::typeOf(managed::kDuplicateInfo));
constexpr auto kOptionalImageMetricValueType = managed::typeOf(managed::kOptionalImageMetricValue);

struct InputFields {
  jfieldID collectionID, timeSinceStory, locationInfo, assetCounts, assetDetails, duplicateInfos;

  static const InputFields& get() {
    static const InputFields fields = [] {
      LocalRef<jclass> cls = jni::findClassLocal(managed::kInput);
      InputFields f;
      f.collectionID = jni::getFieldId(cls.get(), "collectionID", managed::kStringType);
      f.timeSinceStory = jni::getFieldId(cls.get(), "timeSinceStory", "D");
      f.locationInfo = jni::getFieldId(cls.get(), "locationInfo", kLocationInfoType);
      f.assetCounts = jni::getFieldId(cls.get(), "assetCounts", kAssetCountsType);
      f.assetDetails = jni::getFieldId(cls.get(), "assetDetails", kAssetDetailArrayType);
      f.duplicateInfos = jni::getFieldId(cls.get(), "duplicateInfos", kDuplicateInfoArrayType);
      return f;
    }();
    return fields;
  }
};

struct LocationInfoFields {
  jfieldID name, isLandmark, longitude, latitude;

  static const LocationInfoFields& get() {
    static const LocationInfoFields fields = [] {
      LocalRef<jclass> cls = jni::findClassLocal(managed::kLocationInfo);
      LocationInfoFields f;
      f.name = jni::getFieldId(cls.get(), "name", managed::kStringType);
      f.isLandmark = jni::getFieldId(cls.get(), "isLandmark", "Z");
      f.longitude = jni::getFieldId(cls.get(), "longitude", "D");
      f.latitude = jni::getFieldId(cls.get(), "latitude", "D");
      return f;
    }();
    return fields;
  }
};

struct AssetCountsFields {
  jfieldID tileCount, totalAssetsCount, photosCount, burstCount, loopsCount, videosCount,
      totalAssetsWithinBurstsCount, totalAssetsWithinLoopsCount, facesCount, photosWithFacesCount;

  static const AssetCountsFields& get() {
    static const AssetCountsFields fields = [] {
      LocalRef<jclass> cls = jni::findClassLocal(managed::kAssetCounts);
      auto field = [&](const char* name) { return jni::getFieldId(cls.get(), name, "I"); };
      AssetCountsFields f;
      f.tileCount = field("tileCount");
      f.totalAssetsCount = field("totalAssetsCount");
      f.photosCount = field("photosCount");
      f.burstCount = field("burstCount");
      f.loopsCount = field("loopsCount");
      f.videosCount = field("videosCount");
      f.totalAssetsWithinBurstsCount = field("totalAssetsWithinBurstsCount");
      f.totalAssetsWithinLoopsCount = field("totalAssetsWithinLoopsCount");
      f.facesCount = field("facesCount");
      f.photosWithFacesCount = field("photosWithFacesCount");
      return f;
    }();
    return fields;
  }
};

struct AssetDetailFields {
  jfieldID assetID, assetType, creationDateSinceEpoch, modificationDateSinceEpoch, pixelWidth,
      pixelHeight, latitude, longitude, videoDuration, isFavorite, isHidden, mediaSubtypes,
      sourceType, blurrinessMetric, darknessMetric;

  static const AssetDetailFields& get() {
    static const AssetDetailFields fields = [] {
      LocalRef<jclass> cls = jni::findClassLocal(managed::kAssetDetail);
      auto field = [&](const char* name, const char* type) {
        return jni::getFieldId(cls.get(), name, type);
      };
      AssetDetailFields f;
      f.assetID = field("assetID", managed::kStringType);
      f.assetType = field("assetType", managed::kStringType);
      f.creationDateSinceEpoch = field("creationDateSinceEpoch", "J");
      f.modificationDateSinceEpoch = field("modificationDateSinceEpoch", "J");
      f.pixelWidth = field("pixelWidth", "D");
      f.pixelHeight = field("pixelHeight", "D");
      f.latitude = field("latitude", "D");
      f.longitude = field("longitude", "D");
      f.videoDuration = field("videoDuration", "D");
      f.isFavorite = field("isFavorite", "I");
      f.isHidden = field("isHidden", "I");
      f.mediaSubtypes = field("mediaSubtypes", "I");
      f.sourceType = field("sourceType", "I");
      f.blurrinessMetric = field("blurrinessMetric", kOptionalImageMetricValueType);
      f.darknessMetric = field("darknessMetric", kOptionalImageMetricValueType);
      return f;
    }();
    return fields;
  }
};

struct OptionalImageMetricValueFields {
  jfieldID isCalculated, value;

  static const OptionalImageMetricValueFields& get() {
    static const OptionalImageMetricValueFields fields = [] {
      LocalRef<jclass> cls = jni::findClassLocal(managed::kOptionalImageMetricValue);
      OptionalImageMetricValueFields f;
      f.isCalculated = jni::getFieldId(cls.get(), "isCalculated", "Z");
      f.value = jni::getFieldId(cls.get(), "value", "D");
      return f;
    }();
    return fields;
  }
};

struct DuplicateInfoFields {
  jfieldID assetIdA, assetIdB, dupeCoefficient;

  static const DuplicateInfoFields& get() {
    static const DuplicateInfoFields fields = [] {
      LocalRef<jclass> cls = jni::findClassLocal(managed::kDuplicateInfo);
      DuplicateInfoFields f;
      f.assetIdA = jni::getFieldId(cls.get(), "assetIdA", managed::kStringType);
      f.assetIdB = jni::getFieldId(cls.get(), "assetIdB", managed::kStringType);
      f.dupeCoefficient = jni::getFieldId(cls.get(), "dupeCoefficient", "D");
      return f;
    }();
    return fields;
  }
};

std::string readString(JNIEnv* env, jobject object, jfieldID field, const ObjectPath& path,
                       const char* name) {
  LocalRef<jstring> text(static_cast<jstring>(env->GetObjectField(object, field)));
  if (!text) {
    throwNullPointer(path.field(name));
  }
  return jni::JString(text.get()).toStdString();
}

LocalRef<jobject> readObject(JNIEnv* env, jobject object, jfieldID field, const ObjectPath& path,
                             const char* name) {
  LocalRef<jobject> value(env->GetObjectField(object, field));
  if (!value) {
    throwNullPointer(path.field(name));
  }
  return value;
}

LocationInfo readLocationInfo(JNIEnv* env, jobject object, const ObjectPath& path) {
  const auto& f = LocationInfoFields::get();
  LocationInfo location;
  location.name = readString(env, object, f.name, path, "name");
  location.isLandmark = env->GetBooleanField(object, f.isLandmark) != JNI_FALSE;
  location.longitude = env->GetDoubleField(object, f.longitude);
  location.latitude = env->GetDoubleField(object, f.latitude);
  return location;
}

AssetCounts readAssetCounts(JNIEnv* env, jobject object) {
  const auto& f = AssetCountsFields::get();
  AssetCounts counts;
  counts.tileCount = env->GetIntField(object, f.tileCount);
  counts.totalAssetsCount = env->GetIntField(object, f.totalAssetsCount);
  counts.photosCount = env->GetIntField(object, f.photosCount);
  counts.burstCount = env->GetIntField(object, f.burstCount);
  counts.loopsCount = env->GetIntField(object, f.loopsCount);
  counts.videosCount = env->GetIntField(object, f.videosCount);
  counts.totalAssetsWithinBurstsCount = env->GetIntField(object, f.totalAssetsWithinBurstsCount);
  counts.totalAssetsWithinLoopsCount = env->GetIntField(object, f.totalAssetsWithinLoopsCount);
  counts.facesCount = env->GetIntField(object, f.facesCount);
  counts.photosWithFacesCount = env->GetIntField(object, f.photosWithFacesCount);
  return counts;
}

OptionalImageMetricValue readOptionalImageMetricValue(JNIEnv* env, jobject object) {
  const auto& f = OptionalImageMetricValueFields::get();
  OptionalImageMetricValue metric;
  metric.isCalculated = env->GetBooleanField(object, f.isCalculated) != JNI_FALSE;
  metric.value = env->GetDoubleField(object, f.value);
  return metric;
}

AssetDetail readAssetDetail(JNIEnv* env, jobject object, const ObjectPath& path) {
  const auto& f = AssetDetailFields::get();
  AssetDetail asset;
  asset.creationDateSinceEpoch = recordDateOf(env->GetLongField(object, f.creationDateSinceEpoch));
  asset.modificationDateSinceEpoch = recordDateOf(env->GetLongField(object, f.modificationDateSinceEpoch));
  LocalRef<jobject> blurriness =
      readObject(env, object, f.blurrinessMetric, path, "blurrinessMetric");
  LocalRef<jobject> darkness = readObject(env, object, f.darknessMetric, path, "darknessMetric");
  asset.assetID = readString(env, object, f.assetID, path, "assetID");
  asset.assetType = readString(env, object, f.assetType, path, "assetType");
  asset.pixelWidth = env->GetDoubleField(object, f.pixelWidth);
  asset.pixelHeight = env->GetDoubleField(object, f.pixelHeight);
  asset.latitude = env->GetDoubleField(object, f.latitude);
  asset.longitude = env->GetDoubleField(object, f.longitude);
  asset.videoDuration = env->GetDoubleField(object, f.videoDuration);
  asset.isFavorite = env->GetIntField(object, f.isFavorite);
  asset.isHidden = env->GetIntField(object, f.isHidden);
  asset.mediaSubtypes = env->GetIntField(object, f.mediaSubtypes);
  asset.sourceType = env->GetIntField(object, f.sourceType);
  asset.blurrinessMetric = readOptionalImageMetricValue(env, blurriness.get());
  asset.darknessMetric = readOptionalImageMetricValue(env, darkness.get());
  return asset;
}

DuplicateInfo readDuplicateInfo(JNIEnv* env, jobject object, const ObjectPath& path) {
  const auto& f = DuplicateInfoFields::get();
  DuplicateInfo duplicate;
  duplicate.assetIdA = readString(env, object, f.assetIdA, path, "assetIdA");
  duplicate.assetIdB = readString(env, object, f.assetIdB, path, "assetIdB");
  duplicate.dupeCoefficient = env->GetDoubleField(object, f.dupeCoefficient);
  return duplicate;
}

// Reads every element of the array field `name` of `input` with `read`.
template <typename Record, typename Reader>
std::vector<Record> readArray(JNIEnv* env, jobject input, jfieldID field, const char* name,
                              Reader read) {
  const ObjectPath inputPath("ReliqaClassifierInput");
  LocalRef<jobjectArray> array(static_cast<jobjectArray>(env->GetObjectField(input, field)));
  if (!array) {
    throwNullPointer(inputPath.field(name));
  }
  std::string base = inputPath.field(name);
  std::vector<Record> records;
  for (jsize i = 0; i < env->GetArrayLength(array.get()); ++i) {
    LocalRef<jobject> element(env->GetObjectArrayElement(array.get(), i));
    jni::throwPendingJniExceptionAsCppException();
    ObjectPath path(base.c_str(), i);
    if (!element) {
      throwNullPointer(path.str());
    }
    records.push_back(read(env, element.get(), path));
  }
  return records;
}

}  // namespace

ReliqaClassifierInput readReliqaClassifierInput(jobject input) {
  JNIEnv* env = jni::Environment::current();
  const ObjectPath path("ReliqaClassifierInput");
  if (input == nullptr) {
    throwNullPointer(path.str());
  }
  const auto& f = InputFields::get();
  std::vector<AssetDetail> assets =
      readArray<AssetDetail>(env, input, f.assetDetails, "assetDetails", readAssetDetail);
  std::vector<DuplicateInfo> duplicates =
      readArray<DuplicateInfo>(env, input, f.duplicateInfos, "duplicateInfos", readDuplicateInfo);

  ReliqaClassifierInput record;
  record.collectionID = readString(env, input, f.collectionID, path, "collectionID");
  record.timeSinceStory = env->GetDoubleField(input, f.timeSinceStory);
  LocalRef<jobject> location(env->GetObjectField(input, f.locationInfo));
  if (location) {
    record.locationInfo = readLocationInfo(env, location.get(), ObjectPath("ReliqaClassifierInput.locationInfo"));
  }
  LocalRef<jobject> counts(env->GetObjectField(input, f.assetCounts));
  if (counts) {
    record.assetCounts = readAssetCounts(env, counts.get());
  }
  record.assetDetails = std::move(assets);
  record.duplicateInfos = std::move(duplicates);
  return record;
}

}  // namespace kestrova::reliqaclassifier
