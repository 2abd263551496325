// Feature extraction: one candidate collection in, its 74 numbered features
// (ids 1 to 74) out.
//
// A pure function of the input and of the process's local time zone (which
// decides the creation hours behind features 42 to 47). Feature 2 is present
// only when the collection has a location; every other feature is always
// present, -1 standing for statistics of empty lists. NaN and infinities in the
// input pass into the features unchecked.
//
// Reentrant: any number of threads may extract at once. Throws std::bad_alloc
// when the values of an integer list (media subtypes, source types, favourite
// or hidden flags, creation hours) span 2^30 or more, and whatever allocation
// throws.
#pragma once

#include "reliqaclassifier/ReliqaClassifierInput.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace kestrova::reliqaclassifier {

thornvale::FeatureMap extractFeatures(const ReliqaClassifierInput& input);

}  // namespace kestrova::reliqaclassifier
