// Stored server features are read back from whatever bytes the store holds.
// Any input must either decode or throw one of the documented errors, and a
// decoded map must survive being written and read again: equal values, except
// that integral values of 2^53 or more may be refused on the way back (they
// are read through a 64-bit integer, which must convert to a double exactly).
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "xplat/gbdtclassifier/GbdtClassifier/ConversionError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMapJson.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"

using namespace thornvale;

namespace {

bool refusableOnReread(double value) {
  return std::trunc(value) == value && std::fabs(value) >= 9007199254740992.0;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  FeatureMap features;
  try {
    features = featureMapFromJson(text);
  } catch (const ConversionError&) {
    return 0;
  } catch (const JsonParseError&) {
    return 0;
  } catch (const JsonTypeError&) {
    return 0;
  }

  bool finite = true;
  bool refusable = false;
  for (const auto& [id, value] : features) {
    finite = finite && std::isfinite(value);
    refusable = refusable || refusableOnReread(value);
  }
  if (!finite) return 0;  // the writer refuses these, as it must

  FeatureMap reread;
  try {
    reread = featureMapFromJson(featureMapToJson(features));
  } catch (const ConversionError&) {
    if (!refusable) std::abort();
    return 0;
  }
  if (reread != features) std::abort();
  return 0;
}
