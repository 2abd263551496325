#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"

#include <charconv>
#include <cmath>

#include "xplat/gbdtclassifier/GbdtClassifier/JsonError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace thornvale {
namespace {

// `location` is "<undefined location>" for a bare value, or
// "value at \"<id>\"" for an object member.
void requireFinite(double value, const std::string& location) {
  if (std::isnan(value)) {
    throw JsonPrintError("folly::toJson: JSON object value was a NaN when serializing " + location);
  }
  if (std::isinf(value)) {
    throw JsonPrintError("folly::toJson: JSON object value was an INF when serializing " + location);
  }
}

}  // namespace

std::string doubleToJson(double value) {
  requireFinite(value, "<undefined location>");
  return doubleToText(value);
}

std::string featureMapToJson(const FeatureMap& features) {
  std::string json;
  json.reserve(2 + features.size() * 24);
  json += '{';
  char id[16];
  for (const auto& [featureId, value] : features) {
    auto idEnd = std::to_chars(id, id + sizeof id, featureId).ptr;
    if (!std::isfinite(value)) {
      requireFinite(value, "value at \"" + std::string(id, idEnd) + "\"");
    }
    if (json.size() > 1) json += ',';
    json += '"';
    json.append(id, idEnd);
    json += "\":";
    appendDoubleText(value, json);
  }
  json += '}';
  return json;
}

}  // namespace thornvale
