// Compact JSON writer for the two shapes the system writes: a bare number and
// an object mapping feature ids to numbers.
//
// Numbers use the text of NumberText.h ("1", "0.5", "1E-7"). Objects have no
// white space anywhere: {"-5":1,"3":2,"48":0.25}; member names are the ids in
// decimal, in the map's order, ascending id. NaN and infinities cannot be written: both functions throw
// JsonPrintError before anything is returned. Pure; any thread.
#pragma once

#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace thornvale {

std::string doubleToJson(double value);

std::string featureMapToJson(const FeatureMap& features);

}  // namespace thornvale
