// Number text: reading any bytes either gives a number or throws
// ConversionError, and every double written as text reads back to the same
// bits (NaN aside).
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>

#include "xplat/gbdtclassifier/GbdtClassifier/ConversionError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

using namespace thornvale;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  try {
    textToDouble(text);
  } catch (const ConversionError&) {
  }
  try {
    textToInt64(text);
  } catch (const ConversionError&) {
  }

  if (size >= sizeof(double)) {
    double value;
    std::memcpy(&value, data, sizeof value);
    const std::string written = doubleToText(value);
    const double read = textToDouble(written);
    if (std::isnan(value) ? !std::isnan(read) : std::memcmp(&read, &value, sizeof value) != 0) std::abort();
  }
  return 0;
}
