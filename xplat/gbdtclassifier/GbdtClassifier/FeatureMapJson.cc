#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMapJson.h"

#include <simdjson.h>

#include <cstdint>
#include <limits>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/ConversionError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace thornvale {
namespace {

namespace ondemand = simdjson::ondemand;

// One parsed JSON value, as far as a member value needs it. Views point into the
// parser's buffers and live as long as the parser.
struct JsonScalar {
  enum class Kind { kNull, kBool, kInt, kDouble, kString, kArray, kObject };
  Kind kind = Kind::kNull;
  bool boolean = false;
  int64_t integer = 0;
  double number = 0.0;
  std::string_view text;
};

const char* typeName(JsonScalar::Kind kind) {
  switch (kind) {
    case JsonScalar::Kind::kNull: return "null";
    case JsonScalar::Kind::kBool: return "boolean";
    case JsonScalar::Kind::kInt: return "int64";
    case JsonScalar::Kind::kDouble: return "double";
    case JsonScalar::Kind::kString: return "string";
    case JsonScalar::Kind::kArray: return "array";
    case JsonScalar::Kind::kObject: return "object";
  }
  return "unknown";
}

[[noreturn]] void failParse(const std::string& what) { throw JsonParseError("json parse error: " + what); }

[[noreturn]] void failParse(simdjson::error_code error) { failParse(simdjson::error_message(error)); }

[[noreturn]] void failType(const char* expected, JsonScalar::Kind actual) {
  throw JsonTypeError(std::string("TypeError: expected dynamic type '") + expected + "', but had type '" +
                      typeName(actual) + "'");
}

bool isDigit(char c) { return c >= '0' && c <= '9'; }

JsonScalar makeDouble(double value) {
  JsonScalar scalar;
  scalar.kind = JsonScalar::Kind::kDouble;
  scalar.number = value;
  return scalar;
}

// A JSON number token: "-Infinity", or an optional "-", digits (leading zeros
// allowed) and, for a double, "." with optional digits and/or an exponent whose
// digits may be missing (which the number reader then reports).
JsonScalar parseNumber(std::string_view token) {
  if (token == "-Infinity") return makeDouble(-std::numeric_limits<double>::infinity());
  size_t pos = token[0] == '-' ? 1 : 0;
  while (pos < token.size() && isDigit(token[pos])) ++pos;
  if (token[0] == '-' && pos < 2) failParse("expected digits after `-' in \"" + std::string(token) + "\"");
  if (pos == token.size()) {
    JsonScalar scalar;
    scalar.kind = JsonScalar::Kind::kInt;
    scalar.integer = textToInt64(token);
    return scalar;
  }
  if (token[pos] == '.') {
    ++pos;
    while (pos < token.size() && isDigit(token[pos])) ++pos;
  }
  if (pos < token.size() && (token[pos] == 'e' || token[pos] == 'E')) {
    ++pos;
    if (pos < token.size() && (token[pos] == '+' || token[pos] == '-')) ++pos;
    while (pos < token.size() && isDigit(token[pos])) ++pos;
  }
  if (pos != token.size()) failParse("malformed number \"" + std::string(token) + "\"");
  return makeDouble(textToDouble(token));
}

// Reads a value whose type simdjson could not name: the words NaN and Infinity.
JsonScalar parseNonFiniteWord(std::string_view token, simdjson::error_code error) {
  if (token == "NaN") return makeDouble(std::numeric_limits<double>::quiet_NaN());
  if (token == "Infinity") return makeDouble(std::numeric_limits<double>::infinity());
  failParse(error);
}

// A value's text without the white space that follows it.
std::string_view rawToken(ondemand::value& value) { return simdjson::trim(value.raw_json_token()); }

std::string_view rawToken(ondemand::document& document) {
  std::string_view token;
  if (auto error = document.raw_json_token().get(token)) failParse(error);
  return simdjson::trim(token);
}

template <typename Value>
JsonScalar readValue(Value& value) {
  ondemand::json_type type;
  if (auto error = value.type().get(type)) return parseNonFiniteWord(rawToken(value), error);
  JsonScalar scalar;
  switch (type) {
    case ondemand::json_type::number:
      return parseNumber(rawToken(value));
    case ondemand::json_type::string:
      scalar.kind = JsonScalar::Kind::kString;
      if (auto error = value.get_string().get(scalar.text)) failParse(error);
      return scalar;
    case ondemand::json_type::boolean:
      scalar.kind = JsonScalar::Kind::kBool;
      if (auto error = value.get_bool().get(scalar.boolean)) failParse(error);
      return scalar;
    case ondemand::json_type::null: {
      bool isNull = false;
      if (auto error = value.is_null().get(isNull)) failParse(error);
      if (!isNull) failParse("invalid literal");
      return scalar;
    }
    case ondemand::json_type::array:
      scalar.kind = JsonScalar::Kind::kArray;
      return scalar;
    case ondemand::json_type::object:
      scalar.kind = JsonScalar::Kind::kObject;
      return scalar;
  }
  failParse("unknown value type");
}

double asDouble(const JsonScalar& value) {
  switch (value.kind) {
    case JsonScalar::Kind::kDouble:
      return value.number;
    case JsonScalar::Kind::kInt: {
      // Exact iff the double converts back to the same integer; 2^63 itself is
      // out of int64's range, so it is checked before converting back.
      double converted = static_cast<double>(value.integer);
      if (converted >= 9223372036854775808.0 || static_cast<int64_t>(converted) != value.integer) {
        throw ConversionError("Loss of precision during arithmetic conversion: (double) " +
                              std::to_string(value.integer));
      }
      return converted;
    }
    case JsonScalar::Kind::kBool:
      return value.boolean ? 1.0 : 0.0;
    case JsonScalar::Kind::kString:
      return textToDouble(value.text);
    default:
      failType("int/double/bool/string", value.kind);
  }
}

struct Member {
  std::string_view name;
  JsonScalar value;
};

}  // namespace

FeatureMap featureMapFromJson(std::string_view json) {
  // A NUL byte ends the text.
  json = json.substr(0, json.find('\0'));
  simdjson::padded_string padded(json);
  ondemand::parser parser;
  ondemand::document document;
  if (auto error = parser.iterate(padded).get(document)) failParse(error);

  ondemand::json_type rootType;
  if (auto error = document.type().get(rootType)) failParse(error);
  if (rootType != ondemand::json_type::object) {
    JsonScalar root;
    if (rootType == ondemand::json_type::array) {
      root.kind = JsonScalar::Kind::kArray;
    } else {
      root = readValue(document);
    }
    failType("object", root.kind);
  }

  ondemand::object object;
  if (auto error = document.get_object().get(object)) failParse(error);
  std::vector<Member> members;
  std::unordered_map<std::string_view, size_t> indexByName;
  for (auto fieldResult : object) {
    ondemand::field field;
    if (auto error = std::move(fieldResult).get(field)) failParse(error);
    std::string_view name;
    if (auto error = field.unescaped_key().get(name)) failParse(error);
    JsonScalar value = readValue(field.value());
    auto [it, inserted] = indexByName.emplace(name, members.size());
    if (inserted) {
      members.push_back({name, value});
    } else {
      members[it->second].value = value;  // identical names: the last value counts
    }
  }
  // Past the object's closing brace there must be nothing but white space.
  const char* trailing = nullptr;
  if (document.current_location().get(trailing) == simdjson::SUCCESS) {
    failParse("parsing didn't consume all input");
  }

  FeatureMap features;
  for (const Member& member : members) {
    auto id = static_cast<int32_t>(textToInt64(member.name));
    double value = asDouble(member.value);
    features.emplace(id, value);  // different names, same id: the first in the text wins
  }
  return features;
}

}  // namespace thornvale
