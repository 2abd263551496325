// Server features come from users (`reliqa set-server-features`) and from the
// app's map: any bytes must either read into a feature map or be refused with
// a ToolError whose line lies inside the text. Every value of a map that is
// read must come back from the store's own encoding as the same number, since
// the tool stores nothing else; and the text readers must take any key or
// value text.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

#include "reliqaclassifier/ServerFeatureText.h"
#include "tools/common/errors.h"
#include "tools/common/feature_rows.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMapJson.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  (void)kestrova::reliqaclassifier::parseFeatureId(text);
  (void)kestrova::reliqaclassifier::parseFeatureValue(std::string(text));

  thornvale::FeatureMap features;
  try {
    features = reliqa::tool::parseServerFeatures(text, "fuzz");
  } catch (const reliqa::tool::ToolError& e) {
    int64_t lines = 1;
    for (char c : text) lines += c == '\n';
    if (e.file() != "fuzz" || e.line() < 1 || e.line() > lines) std::abort();
    return 0;
  }
  const thornvale::FeatureMap back = thornvale::featureMapFromJson(thornvale::featureMapToJson(features));
  if (back.size() != features.size()) std::abort();
  for (const auto& [id, value] : features) {
    auto it = back.find(id);
    if (it == back.end() || !(it->second == value)) {
      std::fprintf(stderr, "feature %d was accepted but does not read back\n", id);
      std::abort();
    }
  }
  return 0;
}
