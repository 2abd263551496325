// Number text: the one conversion between doubles and decimal text that every
// stored value, logging value and JSON number of the system uses.
//
// doubleToText writes the shortest decimal that reads back to the same double:
// no trailing ".0" ("1", "0.5", "-0"), positional for decimal exponents -6 to 20
// and "<mantissa>E<exponent>" outside that span ("1E-7", "1E21"), and the words
// "NaN", "Infinity" and "-Infinity" for non-finite values. It never fails.
//
// textToDouble and textToInt64 read stored numbers: leading white space is
// skipped, trailing white space is allowed, anything else after the number is
// an error. textToInt64 takes an optional "+" or "-" and decimal digits
// (leading zeros allowed) and refuses values outside int64. textToDouble also
// reads "nan", "inf" and "infinity" (any case, optional "-") and returns
// +-Infinity or 0 for out-of-range exponents. Both throw ConversionError.
//
// All functions are pure and may be called from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace thornvale {

std::string doubleToText(double value);

// Appends doubleToText(value) to `out`.
void appendDoubleText(double value, std::string& out);

// The longest text doubleToText writes: "-0.00000" and 17 digits.
inline constexpr size_t kMaxDoubleTextSize = 25;

// Writes doubleToText(value) at `out`, which has room for kMaxDoubleTextSize
// characters, and returns the end of what it wrote.
char* writeDoubleText(double value, char* out);

double textToDouble(std::string_view text);

int64_t textToInt64(std::string_view text);

}  // namespace thornvale
