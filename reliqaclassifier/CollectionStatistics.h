// CollectionStatistics: the value lists that the features of one collection
// are computed from, gathered in one pass over its assets (lists 1 to 19, in
// asset order) and one over its duplicate pairs (list 20).
//
// A modification date of -1 means "unknown": it still counts in
// modificationDates and editDelays, but not in the "known" lists. A creation
// date that the local-time conversion cannot break down adds no creation hour.
// Uncalculated metrics add nothing to the "calculated" lists and 100.0 to the
// others. Hours are those of the process's local time zone, converted with the
// reentrant localtime_r, so gathering may run on several threads at once.
//
// The room for every list is set aside at once when the statistics are made,
// and the lists point into it: the statistics can be moved but not copied.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include "reliqaclassifier/ReliqaClassifierInput.h"
#include "reliqaclassifier/ValueList.h"

namespace kestrova::reliqaclassifier {

struct CollectionStatistics {
  // Empty lists with room for one value per asset in each of lists 1 to 19
  // and one per duplicate pair in list 20.
  CollectionStatistics(size_t assets, size_t duplicatePairs);
  CollectionStatistics(const CollectionStatistics&) = delete;
  CollectionStatistics& operator=(const CollectionStatistics&) = delete;
  CollectionStatistics(CollectionStatistics&&) = default;  // the room moves with the lists
  CollectionStatistics& operator=(CollectionStatistics&&) = default;

  ValueList<double> creationDates;
  ValueList<int32_t> creationHours;
  ValueList<double> widths;
  ValueList<double> heights;
  ValueList<double> latitudes;
  ValueList<double> longitudes;
  ValueList<double> videoDurations;
  ValueList<double> modificationDates;
  ValueList<double> knownModificationDates;
  ValueList<double> knownEditDelays;
  ValueList<double> editDelays;
  ValueList<int32_t> favoriteFlags;
  ValueList<int32_t> hiddenFlags;
  ValueList<int32_t> mediaSubtypes;
  ValueList<int32_t> sourceTypes;
  ValueList<double> calculatedBlurriness;
  ValueList<double> blurriness;
  ValueList<double> calculatedDarkness;
  ValueList<double> darkness;
  ValueList<double> duplicateCoefficients;

 private:
  std::unique_ptr<double[]> doubleRoom;
  std::unique_ptr<int32_t[]> intRoom;
};

CollectionStatistics gatherCollectionStatistics(const ReliqaClassifierInput& input);

}  // namespace kestrova::reliqaclassifier
