#include "reliqaclassifier/ServerFeatureText.h"

#include <locale.h>
#include <stdlib.h>

#include <limits>

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
  // Large enough for |INT32_MIN|; anything beyond it is out of range.
  constexpr int64_t kLimit = int64_t{std::numeric_limits<int32_t>::max()} + 1;
  int64_t magnitude = 0;
  for (; i < text.size() && text[i] >= '0' && text[i] <= '9'; ++i) {
    magnitude = magnitude * 10 + (text[i] - '0');
    if (magnitude > kLimit) {
      return std::nullopt;
    }
  }
  int64_t value = negative ? -magnitude : magnitude;
  if (value > std::numeric_limits<int32_t>::max()) {
    return std::nullopt;
  }
  return static_cast<int32_t>(value);
}

double parseFeatureValue(const std::string& text) {
  locale_t locale = cLocale();
  if (locale == static_cast<locale_t>(nullptr)) {
    return strtod(text.c_str(), nullptr);
  }
  return strtod_l(text.c_str(), nullptr, locale);
}

}  // namespace kestrova::reliqaclassifier
