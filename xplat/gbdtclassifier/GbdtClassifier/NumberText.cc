#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

#include <double-conversion/double-conversion.h>

#include <algorithm>
#include <charconv>
#include <climits>
#include <cmath>
#include <limits>

#include "xplat/gbdtclassifier/GbdtClassifier/ConversionError.h"

namespace thornvale {
namespace {

using double_conversion::DoubleToStringConverter;
using double_conversion::StringBuilder;
using double_conversion::StringToDoubleConverter;

// Shortest round-trip digits, capital "E", positional from 1e-6 up to (not
// including) 1e21, no "+" in exponents, no trailing ".0".
const DoubleToStringConverter& shortestWriter() {
  static const DoubleToStringConverter writer(DoubleToStringConverter::NO_FLAGS, "Infinity", "NaN",
                                              'E', -6, 21, 6, 1);
  return writer;
}

// Junk (including the words nan and inf) reads as NaN and is sorted out by
// readNonFiniteWord; an all-space input reads as 0.0 and is rejected below.
const StringToDoubleConverter& doubleReader() {
  static const StringToDoubleConverter reader(
      StringToDoubleConverter::ALLOW_TRAILING_JUNK | StringToDoubleConverter::ALLOW_LEADING_SPACES,
      0.0, std::numeric_limits<double>::quiet_NaN(), nullptr, nullptr);
  return reader;
}

constexpr char kEmptyInput[] = "Empty input string";
constexpr char kNoDigits[] = "No digits found in input string";
constexpr char kNonDigit[] = "Non-digit character found";
constexpr char kInvalidLeadingChar[] = "Invalid leading character";
constexpr char kOverflow[] = "Overflow during conversion";
constexpr char kNegativeOverflow[] = "Negative overflow during conversion";
constexpr char kNotFloatingPoint[] = "Unable to convert string to floating point value";
constexpr char kTrailingCharacters[] = "Non-whitespace character found after end of conversion";

[[noreturn]] void fail(const char* reason, std::string_view text) {
  if (text.empty() && reason == kEmptyInput) throw ConversionError(reason);
  std::string message(reason);
  message += ": \"";
  message.append(text);
  message += '"';
  throw ConversionError(message);
}

// The C locale's isspace: space, \t, \n, \v, \f, \r.
bool isSpace(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }
bool isDigit(char c) { return c >= '0' && c <= '9'; }
char lower(char c) { return (c >= 'A' && c <= 'Z') ? static_cast<char>(c - 'A' + 'a') : c; }

bool startsWithNoCase(std::string_view text, std::string_view word) {
  if (text.size() < word.size()) return false;
  for (size_t i = 0; i < word.size(); ++i) {
    if (lower(text[i]) != word[i]) return false;
  }
  return true;
}

void requireOnlySpaceAfter(std::string_view rest) {
  for (char c : rest) {
    if (!isSpace(c)) fail(kTrailingCharacters, rest);
  }
}

// Reads "[-]inf", "[-]infinity" or "[-]nan" (any case) after optional white
// space; returns the value and leaves the unread rest in `rest`.
double readNonFiniteWord(std::string_view text, std::string_view& rest) {
  size_t pos = 0;
  while (pos < text.size() && isSpace(text[pos])) ++pos;
  if (pos == text.size()) fail(kEmptyInput, text);
  bool negative = false;
  if (text[pos] == '-') {
    negative = true;
    ++pos;
    if (pos == text.size()) fail(kNotFloatingPoint, text);
  }
  std::string_view word = text.substr(pos);
  double value;
  if (startsWithNoCase(word, "infinity")) {
    value = std::numeric_limits<double>::infinity();
    pos += 8;
  } else if (startsWithNoCase(word, "inf")) {
    value = std::numeric_limits<double>::infinity();
    pos += 3;
  } else if (startsWithNoCase(word, "nan")) {
    value = std::numeric_limits<double>::quiet_NaN();
    pos += 3;
  } else {
    fail(kNotFloatingPoint, text);
  }
  rest = text.substr(pos);
  return negative ? -value : value;
}

}  // namespace

char* writeDoubleText(double value, char* out) {
  char* const limit = out + kMaxDoubleTextSize;
  // Integral values below 2^53 are their own shortest round-trip digits, and
  // they are positional (below 1e21): the integer's decimal text is the same
  // text, much faster. -0.0 keeps its sign.
  if (value > -9007199254740992.0 && value < 9007199254740992.0) {
    const auto integer = static_cast<int64_t>(value);
    if (static_cast<double>(integer) == value) {
      if (integer == 0 && std::signbit(value)) *out++ = '-';
      return std::to_chars(out, limit, integer).ptr;
    }
  }
  // The builder ends its text with a NUL, so it writes into a buffer of its
  // own.
  char text[kMaxDoubleTextSize + 1];
  StringBuilder builder(text, sizeof text);
  shortestWriter().ToShortest(value, &builder);
  return std::copy(text, text + builder.position(), out);
}

void appendDoubleText(double value, std::string& out) {
  char text[kMaxDoubleTextSize];
  out.append(text, writeDoubleText(value, text));
}

std::string doubleToText(double value) {
  std::string text;
  appendDoubleText(value, text);
  return text;
}

double textToDouble(std::string_view text) {
  if (text.empty()) fail(kEmptyInput, text);
  // The reader takes an int length; a longer text can only be a number
  // followed by junk, which the trailing check below reports.
  int size = text.size() > static_cast<size_t>(INT_MAX) ? INT_MAX : static_cast<int>(text.size());
  int length = 0;
  double value = doubleReader().StringToDouble(text.data(), size, &length);
  std::string_view rest;
  if (std::isnan(value)) {
    value = readNonFiniteWord(text, rest);
  } else {
    if (length == 0 || (value == 0.0 && isSpace(text[length - 1]))) fail(kEmptyInput, text);
    if (length >= 2) {
      // A dangling exponent marker ("12e", "12e-") is not part of the number.
      const char* last = text.data() + length - 1;
      if (*last == '-' || *last == '+') {
        --last;
        --length;
      }
      if (*last == 'e' || *last == 'E') --length;
    }
    rest = text.substr(static_cast<size_t>(length));
  }
  requireOnlySpaceAfter(rest);
  return value;
}

int64_t textToInt64(std::string_view text) {
  size_t pos = 0;
  while (pos < text.size() && isSpace(text[pos])) ++pos;
  if (pos == text.size()) fail(kEmptyInput, text);
  bool negative = false;
  if (!isDigit(text[pos])) {
    if (text[pos] == '-') {
      negative = true;
    } else if (text[pos] != '+') {
      fail(kInvalidLeadingChar, text);
    }
    ++pos;
  }
  if (pos == text.size()) fail(kNoDigits, text);
  if (!isDigit(text[pos])) fail(kNonDigit, text);

  // The digits are read as a magnitude, so that the sign decides which
  // overflow is reported, also where the magnitude exceeds 64 bits.
  uint64_t magnitude = 0;
  const char* const end = text.data() + text.size();
  const auto [digitsEnd, error] = std::from_chars(text.data() + pos, end, magnitude);
  constexpr uint64_t kInt64MinMagnitude = uint64_t{1} << 63;
  if (negative) {
    if (error != std::errc() || magnitude > kInt64MinMagnitude) fail(kNegativeOverflow, text);
  } else {
    if (error != std::errc() || magnitude >= kInt64MinMagnitude) fail(kOverflow, text);
  }
  const int64_t value = !negative                          ? static_cast<int64_t>(magnitude)
                        : magnitude == kInt64MinMagnitude ? std::numeric_limits<int64_t>::min()
                                                          : -static_cast<int64_t>(magnitude);
  requireOnlySpaceAfter(std::string_view(digitsEnd, static_cast<size_t>(end - digitsEnd)));
  return value;
}

}  // namespace thornvale
