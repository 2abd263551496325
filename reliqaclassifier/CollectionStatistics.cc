#include "reliqaclassifier/CollectionStatistics.h"

#include <ctime>

namespace kestrova::reliqaclassifier {
namespace {

// Stands in for a metric that was not calculated.
constexpr double kUncalculatedMetric = 100.0;

// Modification date of an asset whose modification is unknown.
constexpr time_t kUnknownDate = -1;

// Seconds from creation to modification: the exact difference, rounded once
// to double (which is what difftime gives, and what the plain subtraction
// gives whenever it cannot overflow).
double editDelayOf(time_t created, time_t modified) {
  time_t delay;
  if (!__builtin_sub_overflow(modified, created, &delay)) return static_cast<double>(delay);
  return difftime(modified, created);
}

}  // namespace

CollectionStatistics gatherCollectionStatistics(const ReliqaClassifierInput& input) {
  CollectionStatistics stats;
  const size_t assets = input.assetDetails.size();
  for (auto* list : {&stats.creationDates, &stats.widths, &stats.heights, &stats.latitudes, &stats.longitudes,
                     &stats.videoDurations, &stats.modificationDates, &stats.knownModificationDates,
                     &stats.knownEditDelays, &stats.editDelays, &stats.calculatedBlurriness, &stats.blurriness,
                     &stats.calculatedDarkness, &stats.darkness}) {
    list->reserve(assets);
  }
  for (auto* list : {&stats.creationHours, &stats.favoriteFlags, &stats.hiddenFlags, &stats.mediaSubtypes,
                     &stats.sourceTypes}) {
    list->reserve(assets);
  }

  for (const AssetDetail& asset : input.assetDetails) {
    const time_t created = asset.creationDateSinceEpoch;
    const time_t modified = asset.modificationDateSinceEpoch;
    const bool modificationKnown = modified != kUnknownDate;
    const double editDelay = editDelayOf(created, modified);

    stats.creationDates.push_back(static_cast<double>(created));
    std::tm local{};
    if (localtime_r(&created, &local) != nullptr) stats.creationHours.push_back(local.tm_hour);
    stats.widths.push_back(asset.pixelWidth);
    stats.heights.push_back(asset.pixelHeight);
    stats.latitudes.push_back(asset.latitude);
    stats.longitudes.push_back(asset.longitude);
    stats.videoDurations.push_back(asset.videoDuration);
    stats.modificationDates.push_back(static_cast<double>(modified));
    if (modificationKnown) {
      stats.knownModificationDates.push_back(static_cast<double>(modified));
      stats.knownEditDelays.push_back(editDelay);
    }
    stats.editDelays.push_back(editDelay);
    stats.favoriteFlags.push_back(asset.isFavorite);
    stats.hiddenFlags.push_back(asset.isHidden);
    stats.mediaSubtypes.push_back(asset.mediaSubtypes);
    stats.sourceTypes.push_back(asset.sourceType);
    if (asset.blurrinessMetric.isCalculated) stats.calculatedBlurriness.push_back(asset.blurrinessMetric.value);
    stats.blurriness.push_back(asset.blurrinessMetric.isCalculated ? asset.blurrinessMetric.value
                                                                   : kUncalculatedMetric);
    if (asset.darknessMetric.isCalculated) stats.calculatedDarkness.push_back(asset.darknessMetric.value);
    stats.darkness.push_back(asset.darknessMetric.isCalculated ? asset.darknessMetric.value : kUncalculatedMetric);
  }

  stats.duplicateCoefficients.reserve(input.duplicateInfos.size());
  for (const DuplicateInfo& duplicate : input.duplicateInfos) {
    stats.duplicateCoefficients.push_back(duplicate.dupeCoefficient);
  }
  return stats;
}

}  // namespace kestrova::reliqaclassifier
