// Reads a feature map back from JSON: the text that JsonWriter.h writes, and
// any stored server-feature text of the shapes below.
//
// The text must be one JSON object; a NUL byte ends it. Each member name is read as a decimal
// integer (surrounding white space and a leading "+" allowed, e.g. "4", "04",
// " 4") and narrowed to 32 bits by two's complement; each member value must be a
// number, true/false (1/0) or a string holding a number.
//   - Members with identical names: the last value counts.
//   - Different names that give the same id ("4" and "04"): the member that
//     comes first in the text wins.
//   - A number written without ".", "e" or "E" is read as a 64-bit integer and
//     must convert to a double exactly; every other number is read as a double.
//     NaN, Infinity and -Infinity are accepted as values.
//
// Throws JsonParseError for malformed text, ConversionError for a number that
// cannot be read (integer overflow, an integer that is not exactly a double, a
// name that is not an integer), JsonTypeError when the text is not an object or
// a member value is null, an array or an object. Pure; any thread.
#pragma once

#include <string_view>

#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace thornvale {

FeatureMap featureMapFromJson(std::string_view json);

}  // namespace thornvale
