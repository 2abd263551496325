#include "reliqaclassifier/FeatureExtraction.h"

#include "reliqaclassifier/CollectionStatistics.h"
#include "reliqaclassifier/ListStatistics.h"

namespace kestrova::reliqaclassifier {
namespace {

using thornvale::FeatureMap;

// Initial bucket count of every map built here.
constexpr size_t kBucketHint = 10;

// Features 3 to 12: the asset counts, in their declaration order.
FeatureMap countsGroup(const ReliqaClassifierInput& input) {
  const AssetCounts& counts = input.assetCounts;
  FeatureMap features(kBucketHint);
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
  return features;
}

// Feature 2 (landmark, only with a location) and 31 to 34 (asset positions).
FeatureMap locationGroup(const ReliqaClassifierInput& input, const CollectionStatistics& stats) {
  FeatureMap features(kBucketHint);
  if (input.locationInfo) features.emplace(2, input.locationInfo->isLandmark ? 1.0 : 0.0);
  features.emplace(31, mean(stats.latitudes));
  features.emplace(32, standardDeviation(stats.latitudes));
  features.emplace(33, mean(stats.longitudes));
  features.emplace(34, standardDeviation(stats.longitudes));
  return features;
}

// Features 1, 35 to 47 and 71 to 73: story recency, dates, hours, edits.
FeatureMap timeGroup(const ReliqaClassifierInput& input, const CollectionStatistics& stats) {
  FeatureMap features(kBucketHint);
  features.emplace(1, input.timeSinceStory);
  features.emplace(35, standardDeviation(stats.creationDates));
  features.emplace(36, range(stats.creationDates));
  features.emplace(37, standardDeviation(stats.modificationDates));
  features.emplace(38, standardDeviation(stats.knownModificationDates));
  features.emplace(39, range(stats.knownModificationDates));
  features.emplace(40, mean(stats.knownEditDelays));
  features.emplace(41, standardDeviation(stats.knownEditDelays));
  features.emplace(42, mean(stats.creationHours));
  features.emplace(43, standardDeviation(stats.creationHours));
  features.emplace(44, minimum(stats.creationHours));
  features.emplace(45, maximum(stats.creationHours));
  features.emplace(46, mode(stats.creationHours));
  features.emplace(47, range(stats.creationHours));
  const size_t assets = input.assetDetails.size();
  features.emplace(71, assets == 0 ? -1.0
                                   : static_cast<double>(stats.knownModificationDates.size()) * 100.0 /
                                         static_cast<double>(assets));
  features.emplace(72, mean(stats.editDelays));
  features.emplace(73, standardDeviation(stats.editDelays));
  return features;
}

// Features 13 to 18 (media subtypes, source types) and 74 (extra count).
FeatureMap mediaGroup(const ReliqaClassifierInput& input, const CollectionStatistics& stats) {
  FeatureMap features(kBucketHint);
  features.emplace(13, mean(stats.mediaSubtypes));
  features.emplace(14, standardDeviation(stats.mediaSubtypes));
  features.emplace(15, mode(stats.mediaSubtypes));
  features.emplace(16, mean(stats.sourceTypes));
  features.emplace(17, standardDeviation(stats.sourceTypes));
  features.emplace(18, mode(stats.sourceTypes));
  features.emplace(74, static_cast<double>(input.extraCount));
  return features;
}

// Features 19 to 24: favourite and hidden flags.
FeatureMap flagsGroup(const CollectionStatistics& stats) {
  FeatureMap features(kBucketHint);
  features.emplace(19, mean(stats.favoriteFlags));
  features.emplace(20, standardDeviation(stats.favoriteFlags));
  features.emplace(21, mode(stats.favoriteFlags));
  features.emplace(22, mean(stats.hiddenFlags));
  features.emplace(23, standardDeviation(stats.hiddenFlags));
  features.emplace(24, mode(stats.hiddenFlags));
  return features;
}

// Features 48 to 59 and 61 to 70: image metrics and duplicate coefficients.
FeatureMap qualityGroup(const CollectionStatistics& stats) {
  FeatureMap features(kBucketHint);
  auto describe = [&features](int firstId, const std::vector<double>& values) {
    features.emplace(firstId, mean(values));
    features.emplace(firstId + 1, standardDeviation(values));
    features.emplace(firstId + 2, minimum(values));
    features.emplace(firstId + 3, maximum(values));
    features.emplace(firstId + 4, range(values));
  };
  describe(48, stats.calculatedBlurriness);
  describe(53, stats.calculatedDarkness);
  features.emplace(58, mean(stats.duplicateCoefficients));
  features.emplace(59, standardDeviation(stats.duplicateCoefficients));
  describe(61, stats.blurriness);
  describe(66, stats.darkness);
  return features;
}

// Features 25 to 30 and 60: pixel sizes and video durations.
FeatureMap sizeGroup(const CollectionStatistics& stats) {
  FeatureMap features(kBucketHint);
  const double meanWidth = mean(stats.widths);
  const double meanHeight = mean(stats.heights);
  features.emplace(25, meanWidth);
  features.emplace(26, standardDeviation(stats.widths));
  features.emplace(27, meanHeight);
  features.emplace(28, standardDeviation(stats.heights));
  features.emplace(29, mean(stats.videoDurations));
  features.emplace(30, standardDeviation(stats.videoDurations));
  features.emplace(60, meanWidth * meanHeight);  // 1.0 without assets: (-1) * (-1)
  return features;
}

}  // namespace

FeatureMap extractFeatures(const ReliqaClassifierInput& input) {
  const CollectionStatistics stats = gatherCollectionStatistics(input);
  FeatureMap features(kBucketHint);
  // The groups' ids are disjoint; merge moves their nodes without copying.
  FeatureMap groups[] = {countsGroup(input),       locationGroup(input, stats), timeGroup(input, stats),
                         mediaGroup(input, stats), flagsGroup(stats),           qualityGroup(stats),
                         sizeGroup(stats)};
  for (FeatureMap& group : groups) features.merge(group);
  return features;
}

}  // namespace kestrova::reliqaclassifier
