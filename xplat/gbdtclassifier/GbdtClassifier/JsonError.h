// Errors of the JSON writer and reader.
//
// JsonPrintError: a value cannot be written as JSON (NaN or an infinity). Its
//   text names the value's place, e.g. "folly::toJson: JSON object value was a
//   NaN when serializing value at \"7\"", the text that the managed side and
//   the logs know for this failure.
// JsonParseError: the text is not well-formed JSON of the expected shape.
// JsonTypeError: well-formed JSON holding a value of the wrong type where a
//   number (or an object) is needed.
//
// Bad numbers inside otherwise well-formed JSON are reported as ConversionError
// (ConversionError.h).
#pragma once

#include <stdexcept>
#include <string>

namespace thornvale {

class JsonPrintError : public std::runtime_error {
 public:
  explicit JsonPrintError(const std::string& message) : std::runtime_error(message) {}
};

class JsonParseError : public std::runtime_error {
 public:
  explicit JsonParseError(const std::string& message) : std::runtime_error(message) {}
};

class JsonTypeError : public std::runtime_error {
 public:
  explicit JsonTypeError(const std::string& message) : std::runtime_error(message) {}
};

}  // namespace thornvale
