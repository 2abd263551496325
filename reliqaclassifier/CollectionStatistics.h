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
#pragma once

#include <cstdint>
#include <vector>

#include "reliqaclassifier/ReliqaClassifierInput.h"

namespace kestrova::reliqaclassifier {

struct CollectionStatistics {
  std::vector<double> creationDates;
  std::vector<int32_t> creationHours;
  std::vector<double> widths;
  std::vector<double> heights;
  std::vector<double> latitudes;
  std::vector<double> longitudes;
  std::vector<double> videoDurations;
  std::vector<double> modificationDates;
  std::vector<double> knownModificationDates;
  std::vector<double> knownEditDelays;
  std::vector<double> editDelays;
  std::vector<int32_t> favoriteFlags;
  std::vector<int32_t> hiddenFlags;
  std::vector<int32_t> mediaSubtypes;
  std::vector<int32_t> sourceTypes;
  std::vector<double> calculatedBlurriness;
  std::vector<double> blurriness;
  std::vector<double> calculatedDarkness;
  std::vector<double> darkness;
  std::vector<double> duplicateCoefficients;
};

CollectionStatistics gatherCollectionStatistics(const ReliqaClassifierInput& input);

}  // namespace kestrova::reliqaclassifier
