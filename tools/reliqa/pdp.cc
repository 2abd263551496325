#include "tools/reliqa/pdp.h"

#include "tools/reliqa/chart.h"
#include "tools/common/errors.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace reliqa::tool {

std::vector<double> sweepValues(double from, double to, int64_t steps) {
  std::vector<double> v(static_cast<size_t>(steps));
  for (int64_t i = 0; i < steps; ++i) {
    v[i] = i + 1 == steps ? to : from + (to - from) * (static_cast<double>(i) / static_cast<double>(steps - 1));
  }
  return v;
}

PdpCurve partialDependence(const std::string& name, const thornvale::Forest& forest, int32_t featureId,
                           const thornvale::FeatureMap& fixed, double from, double to, int64_t steps) {
  if (forest.modelSelector.tree && forest.modelSelector.weight != 0.0) {
    throw ToolError(name, 0, "the model chooses among sub-models with a selector tree; pdp cannot sweep such models");
  }
  const auto& mapping = forest.featureMapping;
  if (mapping.empty()) {
    throw ToolError(name, 0, "the model has no feature mapping, so no feature id can be placed");
  }
  int64_t position = -1;
  for (size_t i = 0; i < mapping.size(); ++i) {
    if (mapping[i] == static_cast<uint32_t>(featureId)) position = static_cast<int64_t>(i);  // the last one wins
  }
  if (position < 0) {
    throw ToolError(name, 0, "feature " + std::to_string(featureId) + " is not an input of the model");
  }
  std::vector<double> features(mapping.size(), 0.0);
  for (size_t i = 0; i < mapping.size(); ++i) {
    auto it = fixed.find(static_cast<int32_t>(mapping[i]));
    if (it != fixed.end()) features[i] = it->second;
  }
  PdpCurve curve;
  curve.values = sweepValues(from, to, steps);
  curve.rawScores.assign(curve.values.size(), forest.baseScore);
  if (static_cast<size_t>(position) < forest.inputKeys.size()) curve.featureName = forest.inputKeys[position];
  for (const auto& wt : forest.trees) {
    if (wt.weight == 0.0 || !wt.tree || !wt.tree->root) continue;
    wt.tree->root->accumulateSweep(wt.weight, features, static_cast<int32_t>(position),
                                   static_cast<int32_t>(steps), curve.values.data(), curve.rawScores.data());
  }
  return curve;
}

std::string pdpCsv(const PdpCurve& curve) {
  std::string out = "value,raw_score\n";
  for (size_t i = 0; i < curve.values.size(); ++i) {
    out += thornvale::doubleToText(curve.values[i]) + "," + thornvale::doubleToText(curve.rawScores[i]) + "\n";
  }
  return out;
}

std::string pdpSvg(const PdpCurve& curve, int32_t featureId, const std::string& modelName) {
  LineChart chart;
  std::string feature = "feature " + std::to_string(featureId);
  if (!curve.featureName.empty() && curve.featureName != std::to_string(featureId)) {
    feature += " (" + curve.featureName + ")";
  }
  chart.title = "Partial dependence of the raw score on " + feature;
  chart.xLabel = feature + " value";
  chart.yLabel = "raw score (" + modelName + ")";
  chart.x = curve.values;
  chart.y = curve.rawScores;
  return renderSvg(chart);
}

}  // namespace reliqa::tool
