// Plain value records through which one candidate collection and one set of
// model parameters enter the classifier.
//
// The host binding (or the command-line tool) fills them; nothing on the native
// side changes them afterwards. No field is range-checked anywhere. A
// default-constructed record has every number 0, every flag false, every string
// and vector empty and every optional absent. Strings are byte strings.
#pragma once

#include <cstdint>
#include <ctime>
#include <optional>
#include <string>
#include <vector>

namespace kestrova::reliqaclassifier {

// Where the collection was taken.
struct LocationInfo {
  std::string name;
  bool isLandmark = false;
  double longitude = 0.0;
  double latitude = 0.0;
};

// Ten signed 32-bit counts. The declaration order is binding: feature ids 3 to
// 12 follow it (note that videosCount comes before loopsCount).
struct AssetCounts {
  int32_t tileCount = 0;
  int32_t totalAssetsCount = 0;
  int32_t photosCount = 0;
  int32_t burstCount = 0;
  int32_t videosCount = 0;
  int32_t loopsCount = 0;
  int32_t totalAssetsWithinBurstsCount = 0;
  int32_t totalAssetsWithinLoopsCount = 0;
  int32_t facesCount = 0;
  int32_t photosWithFacesCount = 0;
};

// An image metric that may not have been calculated; `value` is read only
// when `isCalculated` is true.
struct OptionalImageMetricValue {
  bool isCalculated = false;
  double value = 0.0;
};

// A date as the app hands it over (a 64-bit count of seconds since the Unix
// epoch) as the records hold it: a plain integral conversion, so where time_t
// has 32 bits only the low 32 bits are kept and dates from 2038 on wrap.
inline time_t recordDateOf(int64_t managedSeconds) { return static_cast<time_t>(managedSeconds); }

// One photo or video of the collection. Dates are seconds since the Unix
// epoch (see recordDateOf); a modification date of -1 means "unknown".
struct AssetDetail {
  std::string assetID;
  std::string assetType;
  time_t creationDateSinceEpoch = 0;
  double pixelWidth = 0.0;
  double pixelHeight = 0.0;
  double latitude = 0.0;
  double longitude = 0.0;
  double videoDuration = 0.0;
  time_t modificationDateSinceEpoch = 0;
  int32_t isFavorite = 0;
  int32_t isHidden = 0;
  int32_t mediaSubtypes = 0;
  int32_t sourceType = 0;
  OptionalImageMetricValue blurrinessMetric;
  OptionalImageMetricValue darknessMetric;
};

// Two assets judged to be near-duplicates.
struct DuplicateInfo {
  std::string assetIdA;
  std::string assetIdB;
  double dupeCoefficient = 0.0;
};

// One candidate collection.
struct ReliqaClassifierInput {
  std::string collectionID;
  double timeSinceStory = 0.0;
  std::optional<LocationInfo> locationInfo;
  AssetCounts assetCounts;
  std::vector<AssetDetail> assetDetails;
  std::vector<DuplicateInfo> duplicateInfos;
  uint32_t extraCount = 0;  // no managed counterpart; becomes feature 74
};

// A model-parameter update. An empty mSerializedModel leaves the loaded model
// in place; identifier and threshold are stored all the same.
struct ReliqaClassifierModelParams {
  std::string mSerializedModel;
  std::string mModelId;
  double mThreshold = 0.0;
};

}  // namespace kestrova::reliqaclassifier
