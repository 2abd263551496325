#include "reliqaclassifier/ServerFeatureText.h"

#include <locale.h>
#include <stdlib.h>

#include <charconv>
#include <cstdint>
#include <limits>
#include <system_error>

namespace kestrova::reliqaclassifier {
namespace {

// The white space of the "C" locale.
bool isSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\v' || c == '\f' || c == '\r';
}

locale_t cLocale() {
  static const locale_t locale = newlocale(LC_ALL_MASK, "C", static_cast<locale_t>(nullptr));
  return locale;
}

}  // namespace

std::optional<int32_t> parseFeatureId(std::string_view text) {
  size_t i = 0;
  while (i < text.size() && isSpace(text[i])) {
    ++i;
  }
  bool negative = false;
  if (i < text.size() && (text[i] == '+' || text[i] == '-')) {
    negative = text[i] == '-';
    ++i;
  }
  // The digits are read as an unsigned magnitude: a second sign is not a
  // digit, and text without digits reads as 0.
  uint64_t magnitude = 0;
  const std::errc error = std::from_chars(text.data() + i, text.data() + text.size(), magnitude).ec;
  if (error == std::errc::invalid_argument) {
    return 0;
  }
  const uint64_t limit = uint64_t{std::numeric_limits<int32_t>::max()} + (negative ? 1 : 0);
  if (error == std::errc::result_out_of_range || magnitude > limit) {
    return std::nullopt;
  }
  return static_cast<int32_t>(negative ? -static_cast<int64_t>(magnitude) : static_cast<int64_t>(magnitude));
}

double parseFeatureValue(const std::string& text) {
  locale_t locale = cLocale();
  if (locale == static_cast<locale_t>(nullptr)) {
    return strtod(text.c_str(), nullptr);
  }
  return strtod_l(text.c_str(), nullptr, locale);
}

}  // namespace kestrova::reliqaclassifier
