#include "reliqaclassifier/FeatureExtraction.h"

#include "reliqaclassifier/CollectionStatistics.h"
#include "reliqaclassifier/ListStatistics.h"

namespace kestrova::reliqaclassifier {
namespace {

using thornvale::FeatureMap;

// The features come in seven groups with disjoint ids; each group adds its
// features to the map.

// Adds mean and standard deviation of `values` as `meanId` and `meanId + 1`.
template <typename T>
void addMeanAndDeviation(FeatureMap& features, int32_t meanId, const ValueList<T>& values) {
  const MeanAndDeviation summary = meanAndDeviation(values);
  features.emplace(meanId, summary.mean);
  features.emplace(meanId + 1, summary.deviation);
}

// Features 3 to 12: the asset counts, in their declaration order.
void addCounts(FeatureMap& features, const ReliqaClassifierInput& input) {
  const AssetCounts& counts = input.assetCounts;
  features.emplace(3, counts.tileCount);
  features.emplace(4, counts.totalAssetsCount);
  features.emplace(5, counts.photosCount);
  features.emplace(6, counts.burstCount);
  features.emplace(7, counts.videosCount);
  features.emplace(8, counts.loopsCount);
  features.emplace(9, counts.totalAssetsWithinBurstsCount);
  features.emplace(10, counts.totalAssetsWithinLoopsCount);
  features.emplace(11, counts.facesCount);
  features.emplace(12, counts.photosWithFacesCount);
}

// Feature 2 (landmark, only with a location) and 31 to 34 (asset positions).
void addLocation(FeatureMap& features, const ReliqaClassifierInput& input, const CollectionStatistics& stats) {
  if (input.locationInfo) features.emplace(2, input.locationInfo->isLandmark ? 1.0 : 0.0);
  addMeanAndDeviation(features, 31, stats.latitudes);
  addMeanAndDeviation(features, 33, stats.longitudes);
}

// Features 1, 35 to 47 and 71 to 73: story recency, dates, hours, edits.
void addTime(FeatureMap& features, const ReliqaClassifierInput& input, const CollectionStatistics& stats) {
  features.emplace(1, input.timeSinceStory);
  features.emplace(35, standardDeviation(stats.creationDates));
  features.emplace(36, range(stats.creationDates));
  features.emplace(37, standardDeviation(stats.modificationDates));
  features.emplace(38, standardDeviation(stats.knownModificationDates));
  features.emplace(39, range(stats.knownModificationDates));
  addMeanAndDeviation(features, 40, stats.knownEditDelays);
  addMeanAndDeviation(features, 42, stats.creationHours);
  features.emplace(44, minimum(stats.creationHours));
  features.emplace(45, maximum(stats.creationHours));
  features.emplace(46, mode(stats.creationHours));
  features.emplace(47, range(stats.creationHours));
  const size_t assets = input.assetDetails.size();
  features.emplace(71, assets == 0 ? -1.0
                                   : static_cast<double>(stats.knownModificationDates.size()) * 100.0 /
                                         static_cast<double>(assets));
  addMeanAndDeviation(features, 72, stats.editDelays);
}

// Features 13 to 18 (media subtypes, source types) and 74 (extra count).
void addMedia(FeatureMap& features, const ReliqaClassifierInput& input, const CollectionStatistics& stats) {
  addMeanAndDeviation(features, 13, stats.mediaSubtypes);
  features.emplace(15, mode(stats.mediaSubtypes));
  addMeanAndDeviation(features, 16, stats.sourceTypes);
  features.emplace(18, mode(stats.sourceTypes));
  features.emplace(74, static_cast<double>(input.extraCount));
}

// Features 19 to 24: favourite and hidden flags.
void addFlags(FeatureMap& features, const CollectionStatistics& stats) {
  addMeanAndDeviation(features, 19, stats.favoriteFlags);
  features.emplace(21, mode(stats.favoriteFlags));
  addMeanAndDeviation(features, 22, stats.hiddenFlags);
  features.emplace(24, mode(stats.hiddenFlags));
}

// Features 48 to 59 and 61 to 70: image metrics and duplicate coefficients.
void addQuality(FeatureMap& features, const CollectionStatistics& stats) {
  auto describe = [&features](int32_t firstId, const ValueList<double>& values) {
    addMeanAndDeviation(features, firstId, values);
    features.emplace(firstId + 2, minimum(values));
    features.emplace(firstId + 3, maximum(values));
    features.emplace(firstId + 4, range(values));
  };
  describe(48, stats.calculatedBlurriness);
  describe(53, stats.calculatedDarkness);
  addMeanAndDeviation(features, 58, stats.duplicateCoefficients);
  describe(61, stats.blurriness);
  describe(66, stats.darkness);
}

// Features 25 to 30 and 60: pixel sizes and video durations.
void addSize(FeatureMap& features, const CollectionStatistics& stats) {
  const MeanAndDeviation widths = meanAndDeviation(stats.widths);
  const MeanAndDeviation heights = meanAndDeviation(stats.heights);
  features.emplace(25, widths.mean);
  features.emplace(26, widths.deviation);
  features.emplace(27, heights.mean);
  features.emplace(28, heights.deviation);
  addMeanAndDeviation(features, 29, stats.videoDurations);
  features.emplace(60, widths.mean * heights.mean);  // 1.0 without assets: (-1) * (-1)
}

}  // namespace

FeatureMap extractFeatures(const ReliqaClassifierInput& input) {
  const CollectionStatistics stats = gatherCollectionStatistics(input);
  FeatureMap features;
  addCounts(features, input);
  addLocation(features, input, stats);
  addTime(features, input, stats);
  addMedia(features, input, stats);
  addFlags(features, stats);
  addQuality(features, stats);
  addSize(features, stats);
  return features;
}

}  // namespace kestrova::reliqaclassifier
