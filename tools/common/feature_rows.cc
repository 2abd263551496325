#include "tools/common/feature_rows.h"

#include <glog/logging.h>

#include <charconv>
#include <cmath>
#include <optional>
#include <system_error>

#include "reliqaclassifier/ServerFeatureText.h"
#include "tools/common/json_doc.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMapJson.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace reliqa::tool {

using simdjson::ondemand::field;
using simdjson::ondemand::json_type;
using simdjson::ondemand::value;
using thornvale::FeatureMap;

namespace {

// Why the store would not give `x` back as the same number, or nothing when
// it would: the value goes through the store's own encoder and decoder.
std::optional<std::string> whyNotStorable(int32_t id, double x) {
  std::string stored;
  try {
    stored = thornvale::featureMapToJson(FeatureMap{{id, x}});
  } catch (const std::exception& e) {
    if (std::isfinite(x)) return std::string("cannot be stored: ") + e.what();
    return std::string("reads as ") + (std::isnan(x) ? "NaN" : "infinity") + ", which the store cannot hold";
  }
  try {
    double back = thornvale::featureMapFromJson(stored).at(id);
    if (back == x) return std::nullopt;  // -0 comes back as 0, which compares equal everywhere
    return "cannot be stored: it would read back as " + thornvale::doubleToText(back);
  } catch (const std::exception& e) {
    return std::string("cannot be stored: it would not read back (") + e.what() + ")";
  }
}

}  // namespace

std::optional<int32_t> featureRowIdSlowly(std::string_view key) {
  // No more digits than int32 needs, leading zeros included.
  const size_t digits = key.size() - (!key.empty() && key[0] == '-' ? 1 : 0);
  int32_t id = 0;
  const auto [end, error] = std::from_chars(key.data(), key.data() + key.size(), id);
  if (error != std::errc() || end != key.data() + key.size() || digits > 10) return std::nullopt;
  return id;
}

FeatureMember readFeatureMember(JsonDoc& doc, std::string_view key, value& v) {
  std::optional<int32_t> id = featureRowId(key);
  if (!id) doc.fail(v, "feature id " + quoteForMessage(key) + " is not a decimal 32-bit integer");
  return {*id, doc.getDouble(v, "feature " + std::string(key))};
}

FeatureMap parseFeatureRow(std::string_view json, const std::string& name, int64_t firstLine) {
  JsonDoc doc(json, name, firstLine);
  FeatureMap out;
  readFeatureRow(doc, doc.rootObject("a feature row"),
                 [&](int32_t id, double x) { return out.emplace(id, x).second; });
  doc.expectEnd();
  return out;
}

FeatureMap parseServerFeatures(std::string_view json, const std::string& name) {
  JsonDoc doc(json, name);
  FeatureMap out;
  for (auto member : doc.rootObject("server features")) {
    field f = doc.take(std::move(member), "");
    std::string key(doc.take(f.unescaped_key(), ""));
    value v = f.value();
    std::string path = "feature " + quoteForMessage(key);
    std::string text;
    json_type t;
    if (auto err = v.type().get(t)) doc.failSyntax(err, path);
    if (t == json_type::string) {
      text = doc.getString(v, path);
    } else if (t == json_type::number) {
      doc.getDouble(v, path);  // validates the number
      text = std::string(v.raw_json_token());
    } else {
      doc.fail(v, path + ": expected a number text (\"0.5\") or a number, got " + doc.typeName(v, path));
    }
    std::optional<int32_t> id = kestrova::reliqaclassifier::parseFeatureId(key);
    if (!id) {
      LOG(WARNING) << "server feature key " << quoteForMessage(key)
                   << " lies outside the 32-bit feature ids; dropped";
      continue;
    }
    double x = kestrova::reliqaclassifier::parseFeatureValue(text);
    if (std::optional<std::string> why = whyNotStorable(*id, x)) {
      doc.fail(v, path + ": value " + quoteForMessage(text) + " " + *why);
    }
    out.emplace(*id, x);  // the first key for an id wins
  }
  doc.expectEnd();
  return out;
}

}  // namespace reliqa::tool
