// Position-aware reading of one JSON text with simdjson On-Demand.
//
// JsonDoc parses one JSON text (a whole file, or one line of a JSON Lines
// stream) and turns every problem into a ToolError that names the file and the
// line of the offending byte. The typed getters check the JSON type of a value
// and say what was expected, using a dotted path ("assetDetails[3].pixelWidth")
// to name the value.
//
// A JsonDoc owns its padded copy of the text; values obtained from it are valid
// while it lives and until reset(). reset() reads another text with the same
// buffer and parser, so that a stream of short texts allocates nothing per
// text. Not thread-safe; use one per thread.
#pragma once

#include <simdjson.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace reliqa::tool {

class JsonDoc {
 public:
  // `name` is used in messages; `firstLine` is the line number of the text's
  // first byte in that file.
  JsonDoc(std::string_view text, std::string name, int64_t firstLine = 1);
  // A document without a text yet: call reset() before reading.
  explicit JsonDoc(std::string name);

  // Takes another text (the values read from the previous one become invalid).
  void reset(std::string_view text, int64_t firstLine = 1);

  // The root value, which must be an object; `what` names it in messages
  // ("a collection"). Throws ToolError otherwise.
  simdjson::ondemand::object rootObject(const std::string& what);

  // Call after the root value has been read completely: throws when anything
  // but white space follows it.
  void expectEnd();

  // Line of a position inside the text (clamped to the text).
  int64_t lineOf(const char* at) const;
  int64_t lineOf(simdjson::ondemand::value& v) const { return lineOf(v.raw_json_token().data()); }

  [[noreturn]] void fail(const char* at, const std::string& message) const;
  [[noreturn]] void fail(simdjson::ondemand::value& v, const std::string& message) const {
    fail(v.raw_json_token().data(), message);
  }
  // Reports a simdjson error at the parser's current position.
  [[noreturn]] void failSyntax(simdjson::error_code code, const std::string& path);

  const std::string& name() const { return name_; }

  // Typed getters; `path` names the value in messages.
  simdjson::ondemand::object getObject(simdjson::ondemand::value& v, const std::string& path);
  simdjson::ondemand::array getArray(simdjson::ondemand::value& v, const std::string& path);
  double getDouble(simdjson::ondemand::value& v, const std::string& path);
  int64_t getInt(simdjson::ondemand::value& v, const std::string& path, int64_t min, int64_t max);
  bool getBool(simdjson::ondemand::value& v, const std::string& path);
  std::string getString(simdjson::ondemand::value& v, const std::string& path);
  bool isNull(simdjson::ondemand::value& v, const std::string& path);
  // A value's text as written, without the white space that follows it.
  static std::string_view tokenOf(simdjson::ondemand::value& v);
  // The JSON type of a value, for messages ("a string", "an object", ...).
  std::string typeName(simdjson::ondemand::value& v, const std::string& path);

  // Unwraps a simdjson result, reporting a failure at the current position.
  template <class T>
  T take(simdjson::simdjson_result<T>&& r, const std::string& path) {
    T out;
    if (auto err = std::move(r).get(out)) failSyntax(err, path);
    return out;
  }

 private:
  void scanStructure();

  const char* begin() const { return buffer_.data(); }
  const char* end() const { return buffer_.data() + size_; }

  std::string name_;
  int64_t firstLine_ = 1;
  std::string buffer_;  // the text, then simdjson's padding
  size_t size_ = 0;
  simdjson::ondemand::parser parser_;
  simdjson::ondemand::document doc_;
  bool iterated_ = false;
};

// Numbers of a text that simdjson's DOM has validated, read as
// JsonDoc::getDouble reads them. The DOM reads "-0" as the integer 0, so an
// integer 0 is vouched for only when the text holds no "-0" that could be a
// number (checked once per text, when first needed).
class DomNumbers {
 public:
  explicit DomNumbers(std::string_view text) : text_(text) {}

  // The number `v` holds; nothing when `v` is not a number, or may be -0.
  std::optional<double> read(simdjson::dom::element v) {
    switch (v.type()) {
      case simdjson::dom::element_type::DOUBLE: return v.get_double().value_unsafe();
      case simdjson::dom::element_type::UINT64: return static_cast<double>(v.get_uint64().value_unsafe());
      case simdjson::dom::element_type::INT64: {
        const int64_t i = v.get_int64().value_unsafe();
        if (i == 0 && mayHoldMinusZero()) return std::nullopt;
        return static_cast<double>(i);
      }
      default: return std::nullopt;
    }
  }

 private:
  bool mayHoldMinusZero();

  std::string_view text_;
  int minusZero_ = -1;  // unknown until needed
};

// Quotes a key for messages: "abc" (control bytes escaped, long keys cut).
std::string quoteForMessage(std::string_view s);

}  // namespace reliqa::tool
