// Reading feature maps from JSON.
//
// Two forms, both JSON objects keyed by feature id:
//  - feature rows (`reliqa score`, `reliqa pdp --features`): keys are decimal
//    32-bit ids ("17", "-3"), values JSON numbers; anything else is refused.
//  - server features (`reliqa set-server-features`): the managed map of
//    feature-id text to number text ({"12": "0.5"}), converted as the managed
//    path converts it: keys by the C `atoi` rules (leading white space, optional
//    sign, the digit run; no digits gives 0), values by C `strtod` (longest
//    valid prefix; none gives 0.0). A JSON number is taken by its text. A key
//    whose digit run lies outside the signed 32-bit range is dropped with a
//    warning naming it; of several keys that read as one id, the first in the
//    document wins. Values that read as NaN or infinity are refused, since the
//    store cannot hold them.
// Errors are ToolErrors naming the file and line.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace reliqa::tool {

thornvale::FeatureMap parseFeatureRow(std::string_view json, const std::string& name, int64_t firstLine = 1);

thornvale::FeatureMap parseServerFeatures(std::string_view json, const std::string& name);

// The C `atoi` reading of a key, or nothing when its value does not fit in 32
// bits (where `atoi` itself is undefined).
std::optional<int32_t> serverFeatureId(const std::string& key);

// The C `strtod` reading of a value text.
double serverFeatureValue(const std::string& text);

}  // namespace reliqa::tool
