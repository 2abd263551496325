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
#include <string>
#include <string_view>

#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace reliqa::tool {

thornvale::FeatureMap parseFeatureRow(std::string_view json, const std::string& name, int64_t firstLine = 1);

thornvale::FeatureMap parseServerFeatures(std::string_view json, const std::string& name);

}  // namespace reliqa::tool
