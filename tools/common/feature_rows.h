// Reading feature maps from JSON.
//
// Two forms, both JSON objects keyed by feature id:
//  - feature rows (`reliqa score`, `reliqa pdp --features`): keys are decimal
//    32-bit ids ("17", "-3"), values JSON numbers; anything else is refused.
//  - server features (`reliqa set-server-features`): the managed map of
//    feature-id text to number text ({"12": "0.5"}), read by the classifier's
//    own reader of those texts (ServerFeatureText.h), exactly as the app's map
//    is read: keys by the C `atoi` rules, values by C `strtod` in the "C"
//    locale. A JSON number is taken by its text. A key whose digit run lies
//    outside the signed 32-bit range is dropped with a warning naming it; of
//    several keys that read as one id, the first in the document wins.
//    Every value is put through the store's own encoder and decoder, and one
//    that would not come back as the same number is refused: NaN and the
//    infinities cannot be stored at all, and an integral value stored as a
//    text that its decoder cannot read exactly (2^60, 2^63) would make every
//    later fetch of the server features fail.
// Errors are ToolErrors naming the file and line.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "tools/common/json_doc.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace reliqa::tool {

thornvale::FeatureMap parseFeatureRow(std::string_view json, const std::string& name, int64_t firstLine = 1);

// The id of a feature-row key: an optional '-' and 1 to 10 decimal digits
// (leading zeros allowed) within the signed 32-bit range; nothing otherwise.
std::optional<int32_t> featureRowIdSlowly(std::string_view key);
// The same, without an optional in the way of the loops that read many keys.
inline bool readFeatureRowId(std::string_view key, int32_t& id) {
  // Most keys are a few digits, read here at once.
  if (!key.empty() && key.size() <= 9) {
    uint32_t v = 0;  // nine digits fit; other bytes make a number that is dropped
    bool digits = true;
    for (char c : key) {
      digits &= c >= '0' && c <= '9';
      v = v * 10 + static_cast<uint32_t>(static_cast<unsigned char>(c) - '0');
    }
    if (digits) {
      id = static_cast<int32_t>(v);
      return true;
    }
  }
  const std::optional<int32_t> slowly = featureRowIdSlowly(key);
  if (slowly) id = *slowly;
  return slowly.has_value();
}
inline std::optional<int32_t> featureRowId(std::string_view key) {
  int32_t id;
  if (readFeatureRowId(key, id)) return id;
  return std::nullopt;
}

// One member of a feature row: its id and value, read as parseFeatureRow
// reads them (with its messages). `key` is the member's unescaped key.
struct FeatureMember {
  int32_t id;
  double value;
};
FeatureMember readFeatureMember(JsonDoc& doc, std::string_view key, simdjson::ondemand::value& v);

// Reads the members of the feature-row object `row`, calling
// onFeature(id, value) for each; onFeature returns false for an id given
// before, which is refused as parseFeatureRow refuses it.
template <class F>
void readFeatureRow(JsonDoc& doc, simdjson::ondemand::object row, F&& onFeature) {
  for (auto member : row) {
    simdjson::ondemand::field f = doc.take(std::move(member), "");
    std::string_view key = doc.take(f.unescaped_key(), "");
    simdjson::ondemand::value v = f.value();
    const FeatureMember m = readFeatureMember(doc, key, v);
    if (!onFeature(m.id, m.value)) doc.fail(v, "feature " + std::to_string(m.id) + " appears twice");
  }
}

thornvale::FeatureMap parseServerFeatures(std::string_view json, const std::string& name);

}  // namespace reliqa::tool
