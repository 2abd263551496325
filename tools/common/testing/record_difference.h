// For tests and fuzz targets: the first difference between two collection
// records, comparing numbers by their bits (so -0 differs from 0 and NaN
// equals NaN), or "" when they are the same.
#pragma once

#include <cstdint>
#include <cstring>
#include <string>

#include "reliqaclassifier/ReliqaClassifierInput.h"

namespace reliqa::tool::test {

namespace detail {

namespace rc = kestrova::reliqaclassifier;

inline bool sameBits(double a, double b) { return std::memcmp(&a, &b, sizeof a) == 0; }

struct Differ {
  std::string first;
  void note(bool same, const std::string& what) {
    if (!same && first.empty()) first = what;
  }
  void number(double a, double b, const std::string& what) { note(sameBits(a, b), what); }
  template <class T>
  void value(const T& a, const T& b, const std::string& what) { note(a == b, what); }
  void metric(const rc::OptionalImageMetricValue& a, const rc::OptionalImageMetricValue& b, const std::string& w) {
    value(a.isCalculated, b.isCalculated, w + ".isCalculated");
    number(a.value, b.value, w + ".value");
  }
};

}  // namespace detail

inline std::string recordDifference(const kestrova::reliqaclassifier::ReliqaClassifierInput& a,
                                    const kestrova::reliqaclassifier::ReliqaClassifierInput& b) {
  detail::Differ d;
  d.value(a.collectionID, b.collectionID, "collectionID");
  d.number(a.timeSinceStory, b.timeSinceStory, "timeSinceStory");
  d.value(a.extraCount, b.extraCount, "extraCount");
  d.value(a.locationInfo.has_value(), b.locationInfo.has_value(), "locationInfo");
  if (a.locationInfo && b.locationInfo) {
    d.value(a.locationInfo->name, b.locationInfo->name, "locationInfo.name");
    d.value(a.locationInfo->isLandmark, b.locationInfo->isLandmark, "locationInfo.isLandmark");
    d.number(a.locationInfo->longitude, b.locationInfo->longitude, "locationInfo.longitude");
    d.number(a.locationInfo->latitude, b.locationInfo->latitude, "locationInfo.latitude");
  }
  d.note(std::memcmp(&a.assetCounts, &b.assetCounts, sizeof a.assetCounts) == 0, "assetCounts");
  d.value(a.assetDetails.size(), b.assetDetails.size(), "assetDetails.size");
  for (size_t i = 0; i < a.assetDetails.size() && i < b.assetDetails.size(); ++i) {
    const auto& x = a.assetDetails[i];
    const auto& y = b.assetDetails[i];
    const std::string w = "assetDetails[" + std::to_string(i) + "]";
    d.value(x.assetID, y.assetID, w + ".assetID");
    d.value(x.assetType, y.assetType, w + ".assetType");
    d.value(x.creationDateSinceEpoch, y.creationDateSinceEpoch, w + ".creationDateSinceEpoch");
    d.value(x.modificationDateSinceEpoch, y.modificationDateSinceEpoch, w + ".modificationDateSinceEpoch");
    d.number(x.pixelWidth, y.pixelWidth, w + ".pixelWidth");
    d.number(x.pixelHeight, y.pixelHeight, w + ".pixelHeight");
    d.number(x.latitude, y.latitude, w + ".latitude");
    d.number(x.longitude, y.longitude, w + ".longitude");
    d.number(x.videoDuration, y.videoDuration, w + ".videoDuration");
    d.value(x.isFavorite, y.isFavorite, w + ".isFavorite");
    d.value(x.isHidden, y.isHidden, w + ".isHidden");
    d.value(x.mediaSubtypes, y.mediaSubtypes, w + ".mediaSubtypes");
    d.value(x.sourceType, y.sourceType, w + ".sourceType");
    d.metric(x.blurrinessMetric, y.blurrinessMetric, w + ".blurrinessMetric");
    d.metric(x.darknessMetric, y.darknessMetric, w + ".darknessMetric");
  }
  d.value(a.duplicateInfos.size(), b.duplicateInfos.size(), "duplicateInfos.size");
  for (size_t i = 0; i < a.duplicateInfos.size() && i < b.duplicateInfos.size(); ++i) {
    const std::string w = "duplicateInfos[" + std::to_string(i) + "]";
    d.value(a.duplicateInfos[i].assetIdA, b.duplicateInfos[i].assetIdA, w + ".assetIdA");
    d.value(a.duplicateInfos[i].assetIdB, b.duplicateInfos[i].assetIdB, w + ".assetIdB");
    d.number(a.duplicateInfos[i].dupeCoefficient, b.duplicateInfos[i].dupeCoefficient, w + ".dupeCoefficient");
  }
  return d.first;
}

}  // namespace reliqa::tool::test
