#include "tools/reliqa/explain.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <numeric>

#include "tools/reliqa/chart.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"

namespace reliqa::tool {

namespace {

constexpr size_t kBlockRows = 1024;
constexpr size_t kLongestName = 40;  // characters of an input key in a chart label

// At most `limit` characters (not bytes) of a UTF-8 text, with an ellipsis
// when something was cut.
std::string shortened(const std::string& s, size_t limit) {
  size_t chars = 0;
  for (size_t i = 0; i < s.size(); ++i) {
    if ((static_cast<unsigned char>(s[i]) & 0xC0u) == 0x80u) continue;
    if (chars++ == limit) return s.substr(0, i) + "\xE2\x80\xA6";
  }
  return s;
}

std::string fewDigits(double v) {
  char buf[48];
  std::snprintf(buf, sizeof buf, "%.4g", v);
  return buf;
}

}  // namespace

ScoreExplainer::ScoreExplainer(const thornvale::BoostingModel& model, const thornvale::TreeCovers& covers)
    : model_(model), shap_(model, covers) {
  const thornvale::Forest& forest = model.getForest();
  const size_t n = shap_.numContributions();
  for (size_t p = 0; p < n; ++p) ids_.push_back(static_cast<int32_t>(forest.featureMapping[p]));
  std::sort(ids_.begin(), ids_.end());
  ids_.erase(std::unique(ids_.begin(), ids_.end()), ids_.end());
  names_.resize(ids_.size());
  const bool named = forest.inputKeys.size() == forest.featureMapping.size();
  for (size_t p = 0; p < n; ++p) {
    const auto id = static_cast<int32_t>(forest.featureMapping[p]);
    const size_t at = static_cast<size_t>(std::lower_bound(ids_.begin(), ids_.end(), id) - ids_.begin());
    idOfPosition_.push_back(at);
    // A repeated id reads its value at its last position; that one names it.
    if (named) names_[at] = forest.inputKeys[p] == std::to_string(id) ? "" : forest.inputKeys[p];
  }
  positions_.resize(n);
}

Explanation ScoreExplainer::explain(const thornvale::FeatureMap& features) {
  const std::vector<float> row = model_.featureVector(features);
  Explanation e;
  e.bias = shap_.explain(row.data(), positions_.data(), scratch_);
  e.contributions.assign(ids_.size(), 0.0);
  for (size_t p = 0; p < positions_.size(); ++p) e.contributions[idOfPosition_[p]] += positions_[p];
  e.rawScore = model_.rawScore(features);
  e.score = model_.predict(features);
  return e;
}

std::string ScoreExplainer::json(const Explanation& e) const {
  thornvale::FeatureMap contributions;
  for (size_t i = 0; i < ids_.size(); ++i) contributions.emplace(ids_[i], e.contributions[i]);
  std::string s = "{\"bias\":" + thornvale::doubleToJson(e.bias);
  s += ",\"contributions\":" + thornvale::featureMapToJson(contributions);
  s += ",\"raw_score\":" + thornvale::doubleToJson(e.rawScore);
  s += ",\"score\":" + thornvale::doubleToJson(e.score) + "}";
  return s;
}

std::string ScoreExplainer::waterfallSvg(const Explanation& e, const std::string& title, size_t shown) const {
  std::vector<size_t> order(ids_.size());
  std::iota(order.begin(), order.end(), size_t{0});
  // By absolute size, larger first; ties by id (order starts ascending).
  std::stable_sort(order.begin(), order.end(), [&](size_t a, size_t b) {
    return std::fabs(e.contributions[a]) > std::fabs(e.contributions[b]);
  });
  WaterfallChart chart;
  chart.title = title;
  chart.subtitle = "bias + contributions = raw score; red raises the score, blue lowers it";
  chart.axisLabel = "raw score (log-odds)";
  chart.startLabel = "bias";
  chart.start = e.bias;
  size_t drawn = 0;
  while (drawn < order.size() && drawn < shown && e.contributions[order[drawn]] != 0.0) {
    const size_t i = order[drawn++];
    std::string label = "feature " + std::to_string(ids_[i]);
    if (!names_[i].empty()) label += " (" + shortened(names_[i], kLongestName) + ")";
    chart.steps.push_back({label, e.contributions[i]});
  }
  if (drawn < order.size()) {
    double rest = 0.0;
    for (size_t k = drawn; k < order.size(); ++k) rest += e.contributions[order[k]];
    const size_t others = order.size() - drawn;
    chart.steps.push_back({std::to_string(others) + (others == 1 ? " other feature" : " other features"), rest});
  }
  chart.endLabel = "raw score";
  chart.end = e.rawScore;
  chart.endNote = "score " + fewDigits(e.score);
  return renderSvg(chart);
}

CoverCounter::CoverCounter(const thornvale::BoostingModel& model) : model_(model) {}

void CoverCounter::add(const thornvale::FeatureMap& row) {
  const std::vector<float> x = model_.featureVector(row);
  block_.insert(block_.end(), x.begin(), x.end());
  ++rows_;
  if (++blockRows_ == kBlockRows) countBlock();
}

void CoverCounter::countBlock() {
  thornvale::TreeCovers counts = thornvale::backgroundCovers(model_, block_.data(), blockRows_, model_.vectorLength());
  block_.clear();
  blockRows_ = 0;
  if (counts_.empty()) {
    counts_ = std::move(counts);
    return;
  }
  for (size_t t = 0; t < counts.size(); ++t) {
    for (size_t n = 0; n < counts[t].size(); ++n) counts_[t][n] += counts[t][n];
  }
}

thornvale::TreeCovers CoverCounter::covers() {
  if (blockRows_ > 0 || counts_.empty()) countBlock();
  return counts_;
}

}  // namespace reliqa::tool
