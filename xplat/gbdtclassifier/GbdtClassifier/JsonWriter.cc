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

// Each member is written straight into the text, which is sized for the
// longest possible members first and cut to length at the end.
std::string featureMapToJson(const FeatureMap& features) {
  // "-2147483648": at most 11 characters for an id, 4 for quotes, colon, comma.
  constexpr size_t kMaxMemberSize = 11 + 4 + kMaxDoubleTextSize;
  std::string json(2 + features.size() * kMaxMemberSize, '\0');
  char* const begin = json.data();
  char* out = begin;
  *out++ = '{';
  for (const auto& [featureId, value] : features) {
    if (!std::isfinite(value)) {
      char id[16];
      char* idEnd = std::to_chars(id, id + sizeof id, featureId).ptr;
      requireFinite(value, "value at \"" + std::string(id, idEnd) + "\"");
    }
    if (out != begin + 1) *out++ = ',';
    *out++ = '"';
    out = std::to_chars(out, out + 11, featureId).ptr;
    *out++ = '"';
    *out++ = ':';
    out = writeDoubleText(value, out);
  }
  *out++ = '}';
  json.resize(static_cast<size_t>(out - begin));
  return json;
}

}  // namespace thornvale
