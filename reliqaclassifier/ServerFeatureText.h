// Reading the texts of one server-feature entry: a decimal feature id and a
// decimal value, both read with the C library's rules.
//
// parseFeatureId follows atoi: leading white space is skipped, an optional
// sign and then the run of decimal digits are read, anything after them is
// ignored, and text without digits gives 0. Unlike atoi it is defined for
// every input: an id whose value lies outside the signed 32-bit range (leading
// zeros do not count towards it) gives no id.
//
// parseFeatureValue follows strtod in the "C" locale whatever the process
// locale: the longest valid floating-point prefix after white space, 0.0
// when there is none; "inf", "nan" and hexadecimal forms are numbers too.
// Reading stops at the first zero byte.
//
// Pure functions; safe on any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace kestrova::reliqaclassifier {

std::optional<int32_t> parseFeatureId(std::string_view text);

double parseFeatureValue(const std::string& text);

}  // namespace kestrova::reliqaclassifier
