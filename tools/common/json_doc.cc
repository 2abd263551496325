#include "tools/common/json_doc.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <vector>

#include "reliqaclassifier/ServerFeatureText.h"
#include "tools/common/errors.h"

namespace reliqa::tool {

using simdjson::ondemand::json_type;
using simdjson::ondemand::number_type;

namespace {

const char* typeWord(json_type t) {
  switch (t) {
    case json_type::array: return "an array";
    case json_type::object: return "an object";
    case json_type::number: return "a number";
    case json_type::string: return "a string";
    case json_type::boolean: return "a boolean";
    case json_type::null: return "null";
  }
  return "an unknown value";
}

std::string where(const std::string& path) { return path.empty() ? std::string() : path + ": "; }

}  // namespace

std::string quoteForMessage(std::string_view s) {
  static const char* hex = "0123456789abcdef";
  std::string out = "\"";
  size_t n = std::min<size_t>(s.size(), 60);
  for (size_t i = 0; i < n; ++i) {
    unsigned char c = static_cast<unsigned char>(s[i]);
    if (c == '"' || c == '\\') {
      out += '\\';
      out += static_cast<char>(c);
    } else if (c < 0x20 || c == 0x7f) {
      out += "\\x";
      out += hex[c >> 4];
      out += hex[c & 15];
    } else {
      out += static_cast<char>(c);
    }
  }
  if (n < s.size()) out += "...";
  return out + "\"";
}

JsonDoc::JsonDoc(std::string_view text, std::string name, int64_t firstLine) : name_(std::move(name)) {
  reset(text, firstLine);
}

JsonDoc::JsonDoc(std::string name) : name_(std::move(name)) { reset({}, 1); }

void JsonDoc::reset(std::string_view text, int64_t firstLine) {
  firstLine_ = firstLine;
  size_ = text.size();
  if (buffer_.size() < size_ + simdjson::SIMDJSON_PADDING) buffer_.resize(size_ + simdjson::SIMDJSON_PADDING);
  if (size_ != 0) std::memcpy(buffer_.data(), text.data(), size_);
  std::memset(buffer_.data() + size_, 0, simdjson::SIMDJSON_PADDING);
  doc_ = simdjson::ondemand::document();
  iterated_ = false;
}

int64_t JsonDoc::lineOf(const char* at) const {
  const char* begin = this->begin();
  const char* end = this->end();
  if (at == nullptr || at < begin) at = begin;
  if (at > end) at = end;
  return firstLine_ + std::count(begin, at, '\n');
}

void JsonDoc::fail(const char* at, const std::string& message) const {
  throw ToolError(name_, lineOf(at), message);
}

void JsonDoc::failSyntax(simdjson::error_code code, const std::string& path) {
  const char* at = end();
  if (iterated_) {
    const char* loc = nullptr;
    if (!doc_.current_location().get(loc)) at = loc;
  }
  std::string what;
  switch (code) {
    case simdjson::EMPTY: what = "no JSON value (the input is empty)"; break;
    case simdjson::DEPTH_ERROR: what = "JSON nested too deeply"; break;
    case simdjson::UTF8_ERROR: what = "invalid UTF-8 in the JSON text"; break;
    case simdjson::UNCLOSED_STRING: what = "unterminated string"; break;
    case simdjson::CAPACITY: what = "JSON text too large"; break;
    default: what = std::string("malformed JSON (") + simdjson::error_message(code) + ")"; break;
  }
  fail(at, where(path) + what);
}

void JsonDoc::scanStructure() {
  // simdjson reports some structural problems far from where they are (or not
  // at all, for text after the root value), so the brackets, strings and what
  // follows the root value are checked here first.
  const char* p = begin();
  const char* end = this->end();
  auto space = [](char c) { return c == ' ' || c == '\n' || c == '\r' || c == '\t'; };
  while (p < end && space(*p)) ++p;
  if (p == end) fail(p, "no JSON value (the input is empty)");
  if (*p != '{' && *p != '[') return;  // a scalar: the type check reports it
  std::vector<const char*> open;  // positions of the open brackets
  do {
    char c = *p;
    if (c == '"') {
      const char* start = p++;
      while (p < end && *p != '"') p += (*p == '\\' && end - p > 1) ? 2 : 1;
      if (p == end) fail(start, "unterminated string");
    } else if (c == '{' || c == '[') {
      open.push_back(p);
    } else if (c == '}' || c == ']') {
      if (open.empty() || (*open.back() == '{') != (c == '}')) {
        fail(p, std::string("unexpected '") + c + "'");
      }
      open.pop_back();
    }
    ++p;
  } while (p < end && !open.empty());
  if (!open.empty()) {
    fail(end, std::string("the JSON text ends inside ") + (*open.back() == '{' ? "an object" : "an array") +
                  " opened on line " + std::to_string(lineOf(open.back())));
  }
  while (p < end && space(*p)) ++p;
  if (p < end) fail(p, "unexpected text after the end of the JSON value");
}

simdjson::ondemand::object JsonDoc::rootObject(const std::string& what) {
  scanStructure();
  if (auto err = parser_.iterate(buffer_.data(), size_, buffer_.size()).get(doc_)) failSyntax(err, "");
  iterated_ = true;
  json_type t;
  if (auto err = doc_.type().get(t)) failSyntax(err, "");
  if (t != json_type::object) {
    const char* at = nullptr;
    if (doc_.current_location().get(at)) at = begin();
    // simdjson types a scalar by its first byte: "nope" would be null.
    const std::string_view token = simdjson::trim(std::string_view(begin(), size_));
    const bool literal = t == json_type::null ? token == "null"
                         : t == json_type::boolean ? token == "true" || token == "false"
                                                   : true;
    if (!literal) fail(at, "not JSON: " + quoteForMessage(token));
    fail(at, "expected " + what + " (a JSON object), got " + typeWord(t));
  }
  simdjson::ondemand::object obj;
  if (auto err = doc_.get_object().get(obj)) failSyntax(err, "");
  return obj;
}

void JsonDoc::expectEnd() {
  // The iterator stands after the root value; any token left is surplus.
  const char* at = nullptr;
  if (!doc_.current_location().get(at)) fail(at, "unexpected text after the end of the JSON value");
}

std::string JsonDoc::typeName(simdjson::ondemand::value& v, const std::string& path) {
  json_type t;
  if (auto err = v.type().get(t)) failSyntax(err, path);
  return typeWord(t);
}

namespace {
json_type typeOf(JsonDoc& doc, simdjson::ondemand::value& v, const std::string& path) {
  json_type t;
  if (auto err = v.type().get(t)) doc.failSyntax(err, path);
  return t;
}
}  // namespace

simdjson::ondemand::object JsonDoc::getObject(simdjson::ondemand::value& v, const std::string& path) {
  json_type t = typeOf(*this, v, path);
  if (t != json_type::object) fail(v, where(path) + "expected an object, got " + typeWord(t));
  return take(v.get_object(), path);
}

simdjson::ondemand::array JsonDoc::getArray(simdjson::ondemand::value& v, const std::string& path) {
  json_type t = typeOf(*this, v, path);
  if (t != json_type::array) fail(v, where(path) + "expected an array, got " + typeWord(t));
  return take(v.get_array(), path);
}

std::string_view JsonDoc::tokenOf(simdjson::ondemand::value& v) { return simdjson::trim(v.raw_json_token()); }

namespace {

bool isDigit(char c) { return c >= '0' && c <= '9'; }

// Twenty or more digits in a row, in the mantissa or the exponent.
bool hasLongDigitRun(std::string_view token) {
  size_t run = 0;
  for (char c : token) {
    run = isDigit(c) ? run + 1 : 0;
    if (run >= 20) return true;
  }
  return false;
}

// The JSON number grammar: -?(0|[1-9][0-9]*)(\.[0-9]+)?([eE][+-]?[0-9]+)?
bool isJsonNumber(std::string_view t) {
  size_t i = 0;
  auto digits = [&] {
    size_t start = i;
    while (i < t.size() && isDigit(t[i])) ++i;
    return i > start;
  };
  if (i < t.size() && t[i] == '-') ++i;
  if (i < t.size() && t[i] == '0') {
    ++i;
  } else if (!digits()) {
    return false;
  }
  if (i < t.size() && t[i] == '.') {
    ++i;
    if (!digits()) return false;
  }
  if (i < t.size() && (t[i] == 'e' || t[i] == 'E')) {
    ++i;
    if (i < t.size() && (t[i] == '+' || t[i] == '-')) ++i;
    if (!digits()) return false;
  }
  return i == t.size();
}

}  // namespace

double JsonDoc::getDouble(simdjson::ondemand::value& v, const std::string& path) {
  json_type t = typeOf(*this, v, path);
  if (t != json_type::number) fail(v, where(path) + "expected a number, got " + typeWord(t));
  const std::string_view token = tokenOf(v);
  if (hasLongDigitRun(token)) {
    // simdjson's On-Demand reader misreads such numbers (0.25000000000000000000
    // comes out as -0.0655...) and refuses long exponents that its DOM reader
    // takes; they are read here instead, correctly rounded.
    if (isJsonNumber(token)) {
      double exact = kestrova::reliqaclassifier::parseFeatureValue(std::string(token));
      if (std::isfinite(exact)) return exact;
    }
    fail(v, where(path) + "malformed number " + quoteForMessage(token));
  }
  double d;
  if (auto err = v.get_double().get(d)) {
    if (err == simdjson::NUMBER_ERROR || err == simdjson::INCORRECT_TYPE) {
      fail(v, where(path) + "malformed number " + quoteForMessage(v.raw_json_token()));
    }
    failSyntax(err, path);
  }
  return d;
}

int64_t JsonDoc::getInt(simdjson::ondemand::value& v, const std::string& path, int64_t min, int64_t max) {
  json_type t = typeOf(*this, v, path);
  if (t != json_type::number) fail(v, where(path) + "expected an integer, got " + typeWord(t));
  const std::string token(tokenOf(v));
  number_type nt;
  if (v.get_number_type().get(nt) || nt == number_type::floating_point_number) {
    fail(v, where(path) + "expected an integer, got " + token);
  }
  int64_t out = 0;
  if (nt == number_type::unsigned_integer || v.get_int64().get(out) || out < min || out > max) {
    fail(v, where(path) + "integer " + token + " is out of range [" + std::to_string(min) + ", " +
                std::to_string(max) + "]");
  }
  return out;
}

bool JsonDoc::getBool(simdjson::ondemand::value& v, const std::string& path) {
  json_type t = typeOf(*this, v, path);
  if (t != json_type::boolean) fail(v, where(path) + "expected true or false, got " + typeWord(t));
  return take(v.get_bool(), path);
}

std::string JsonDoc::getString(simdjson::ondemand::value& v, const std::string& path) {
  json_type t = typeOf(*this, v, path);
  if (t != json_type::string) fail(v, where(path) + "expected a string, got " + typeWord(t));
  std::string_view s;
  if (auto err = v.get_string().get(s)) {
    fail(v, where(path) + "malformed string (" + simdjson::error_message(err) + ")");
  }
  return std::string(s);
}

bool JsonDoc::isNull(simdjson::ondemand::value& v, const std::string& path) {
  if (typeOf(*this, v, path) != json_type::null) return false;
  bool null = false;
  if (v.is_null().get(null) || !null) fail(v, where(path) + "malformed literal (expected null)");
  return true;
}

// Whether the text may hold the number -0: a "-0" after ':', ',' or '[' and
// before ',', '}', ']' or white space. Conservative: such a sequence inside a
// string counts too.
bool DomNumbers::mayHoldMinusZero() {
  if (minusZero_ < 0) {
    minusZero_ = 0;
    auto space = [](char c) { return c == ' ' || c == '\n' || c == '\r' || c == '\t'; };
    const char* begin = text_.data();
    const char* end = begin + text_.size();
    for (const char* p = begin; (p = static_cast<const char*>(std::memchr(p, '-', end - p))) != nullptr; ++p) {
      if (end - p < 2 || p[1] != '0') continue;
      const char* before = p;
      while (before > begin && space(before[-1])) --before;
      const bool opens = before > begin && (before[-1] == ':' || before[-1] == ',' || before[-1] == '[');
      const char after = end - p > 2 ? p[2] : ' ';
      const bool closes = after == ',' || after == '}' || after == ']' || space(after);
      if (opens && closes) {
        minusZero_ = 1;
        break;
      }
    }
  }
  return minusZero_ == 1;
}

}  // namespace reliqa::tool
