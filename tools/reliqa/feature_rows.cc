#include "tools/reliqa/feature_rows.h"

#include <glog/logging.h>

#include <cctype>
#include <cmath>
#include <cstdlib>
#include <limits>

#include "tools/reliqa/json_doc.h"

namespace reliqa::tool {

using simdjson::ondemand::field;
using simdjson::ondemand::json_type;
using simdjson::ondemand::value;
using thornvale::FeatureMap;

namespace {

// Strict decimal id: optional '-', then 1 to 10 digits, within int32.
std::optional<int32_t> strictId(std::string_view key) {
  size_t i = 0;
  bool negative = false;
  if (i < key.size() && key[i] == '-') {
    negative = true;
    ++i;
  }
  if (i == key.size() || key.size() - i > 10) return std::nullopt;
  int64_t v = 0;
  for (; i < key.size(); ++i) {
    if (key[i] < '0' || key[i] > '9') return std::nullopt;
    v = v * 10 + (key[i] - '0');
  }
  if (negative) v = -v;
  if (v < std::numeric_limits<int32_t>::min() || v > std::numeric_limits<int32_t>::max()) return std::nullopt;
  return static_cast<int32_t>(v);
}

}  // namespace

FeatureMap parseFeatureRow(std::string_view json, const std::string& name, int64_t firstLine) {
  JsonDoc doc(json, name, firstLine);
  FeatureMap out;
  for (auto member : doc.rootObject("a feature row")) {
    field f = doc.take(std::move(member), "");
    std::string_view key = doc.take(f.unescaped_key(), "");
    value v = f.value();
    std::optional<int32_t> id = strictId(key);
    if (!id) doc.fail(v, "feature id " + quoteForMessage(key) + " is not a decimal 32-bit integer");
    double x = doc.getDouble(v, "feature " + std::string(key));
    if (!out.emplace(*id, x).second) doc.fail(v, "feature " + std::to_string(*id) + " appears twice");
  }
  doc.expectEnd();
  return out;
}

std::optional<int32_t> serverFeatureId(const std::string& key) {
  const char* p = key.c_str();
  while (std::isspace(static_cast<unsigned char>(*p))) ++p;
  bool negative = false;
  if (*p == '+' || *p == '-') negative = *p++ == '-';
  int64_t v = 0;
  for (; *p >= '0' && *p <= '9'; ++p) {
    v = v * 10 + (*p - '0');
    if (v > int64_t{1} << 32) return std::nullopt;  // far outside; stop before overflowing
  }
  if (negative) v = -v;
  if (v < std::numeric_limits<int32_t>::min() || v > std::numeric_limits<int32_t>::max()) return std::nullopt;
  return static_cast<int32_t>(v);
}

double serverFeatureValue(const std::string& text) { return std::strtod(text.c_str(), nullptr); }

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
    std::optional<int32_t> id = serverFeatureId(key);
    if (!id) {
      LOG(WARNING) << "server feature key " << quoteForMessage(key)
                   << " lies outside the 32-bit feature ids; dropped";
      continue;
    }
    double x = serverFeatureValue(text);
    if (!std::isfinite(x)) {
      doc.fail(v, path + ": value " + quoteForMessage(text) + " reads as " + (std::isnan(x) ? "NaN" : "infinity") +
                      ", which the store cannot hold");
    }
    out.emplace(*id, x);  // the first key for an id wins
  }
  doc.expectEnd();
  return out;
}

}  // namespace reliqa::tool
