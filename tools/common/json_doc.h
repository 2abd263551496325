// Position-aware reading of one JSON text with simdjson On-Demand.
//
// JsonDoc parses one JSON text (a whole file, or one line of a JSON Lines
// stream) and turns every problem into a ToolError that names the file and the
// line of the offending byte. The typed getters check the JSON type of a value
// and say what was expected, using a dotted path ("assetDetails[3].pixelWidth")
// to name the value.
//
// A JsonDoc owns its padded copy of the text; values obtained from it are valid
// while it lives. Not thread-safe; use one per thread.
#pragma once

#include <simdjson.h>

#include <cstdint>
#include <string>
#include <string_view>

namespace reliqa::tool {

class JsonDoc {
 public:
  // `name` is used in messages; `firstLine` is the line number of the text's
  // first byte in that file.
  JsonDoc(std::string_view text, std::string name, int64_t firstLine = 1);

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

  std::string name_;
  int64_t firstLine_;
  simdjson::padded_string text_;
  simdjson::ondemand::parser parser_;
  simdjson::ondemand::document doc_;
  bool iterated_ = false;
};

// Quotes a key for messages: "abc" (control bytes escaped, long keys cut).
std::string quoteForMessage(std::string_view s);

}  // namespace reliqa::tool
