#include "reliqaclassifier/CollectionStatistics.h"

#include <cassert>
#include <ctime>
#include <limits>
#include <new>

namespace kestrova::reliqaclassifier {
namespace {

// Stands in for a metric that was not calculated.
constexpr double kUncalculatedMetric = 100.0;

// How many of lists 1 to 19 hold doubles and how many integers.
constexpr size_t kDoubleAssetLists = 14;
constexpr size_t kIntAssetLists = 5;

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

// The number of values of `count` lists of `length` each and `extra` more,
// refused (as memory that cannot be had) where size_t cannot hold it: on a
// 32-bit phone the product could wrap around to a small room.
template <typename T>
size_t roomFor(size_t count, size_t length, size_t extra) {
  const size_t most = std::numeric_limits<size_t>::max() / sizeof(T);
  if (extra > most || length > (most - extra) / count) throw std::bad_alloc();
  return count * length + extra;
}

}  // namespace

// Lists 1 to 19 take a share of `assets` values each, kDoubleAssetLists of
// doubles and kIntAssetLists of integers, and list 20 a share of
// `duplicatePairs` doubles.
CollectionStatistics::CollectionStatistics(size_t assets, size_t duplicatePairs)
    : doubleRoom(new double[roomFor<double>(kDoubleAssetLists, assets, duplicatePairs)]),
      intRoom(new int32_t[roomFor<int32_t>(kIntAssetLists, assets, 0)]) {
  double* nextDouble = doubleRoom.get();
  int32_t* nextInt = intRoom.get();
  auto share = [](auto*& next, size_t count) {
    auto* room = next;
    next += count;
    return ValueList(room);
  };
  creationDates = share(nextDouble, assets);
  creationHours = share(nextInt, assets);
  widths = share(nextDouble, assets);
  heights = share(nextDouble, assets);
  latitudes = share(nextDouble, assets);
  longitudes = share(nextDouble, assets);
  videoDurations = share(nextDouble, assets);
  modificationDates = share(nextDouble, assets);
  knownModificationDates = share(nextDouble, assets);
  knownEditDelays = share(nextDouble, assets);
  editDelays = share(nextDouble, assets);
  favoriteFlags = share(nextInt, assets);
  hiddenFlags = share(nextInt, assets);
  mediaSubtypes = share(nextInt, assets);
  sourceTypes = share(nextInt, assets);
  calculatedBlurriness = share(nextDouble, assets);
  blurriness = share(nextDouble, assets);
  calculatedDarkness = share(nextDouble, assets);
  darkness = share(nextDouble, assets);
  duplicateCoefficients = share(nextDouble, duplicatePairs);
  assert(nextDouble == doubleRoom.get() + kDoubleAssetLists * assets + duplicatePairs);
  assert(nextInt == intRoom.get() + kIntAssetLists * assets);
}

CollectionStatistics gatherCollectionStatistics(const ReliqaClassifierInput& input) {
  CollectionStatistics stats(input.assetDetails.size(), input.duplicateInfos.size());
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

  for (const DuplicateInfo& duplicate : input.duplicateInfos) {
    stats.duplicateCoefficients.push_back(duplicate.dupeCoefficient);
  }
  return stats;
}

}  // namespace kestrova::reliqaclassifier
