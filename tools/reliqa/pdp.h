// Partial dependence of a model's raw score on one feature (`reliqa pdp`).
//
// The feature, named by its id, is placed at its position through the model's
// featureMapping; it takes `steps` evenly spaced values from `from` to `to`
// (both included) while every other input keeps its value from `fixed` (0.0
// when absent). The raw score for each value is the base score plus, for every
// tree of non-zero weight, that tree's accumulateSweep: one pass over each
// tree, with comparisons in double as the nodes make them (the compiled forest
// compares floats, so a value within float rounding of a threshold may differ
// from `reliqa score`). Models with a selector are refused, as is a feature
// that is not an input of the model. Errors are ToolErrors naming `name`.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace thornvale {
struct Forest;
}

namespace reliqa::tool {

struct PdpCurve {
  std::vector<double> values;     // the swept feature's values, ascending
  std::vector<double> rawScores;  // one per value
  std::string featureName;        // the input key of the swept position, if any
};

std::vector<double> sweepValues(double from, double to, int64_t steps);

PdpCurve partialDependence(const std::string& name, const thornvale::Forest& forest, int32_t featureId,
                           const thornvale::FeatureMap& fixed, double from, double to, int64_t steps);

std::string pdpCsv(const PdpCurve& curve);

std::string pdpSvg(const PdpCurve& curve, int32_t featureId, const std::string& modelName);

}  // namespace reliqa::tool
