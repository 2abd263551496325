// ConversionError: a text could not be converted to a number, or a number could
// not be converted exactly to another number type.
//
// what() reads "<reason>: \"<text>\"" for text conversions (the quoted text is
// the whole input for a malformed number, or the unconsumed rest when a number
// is followed by other characters), "<reason>: (<type>) <value>" for a number
// conversion that would lose precision, and exactly "Empty input string" for an
// empty input. The texts are fixed, so callers may show them to users or match
// them in logs.
#pragma once

#include <stdexcept>
#include <string>

namespace thornvale {

class ConversionError : public std::range_error {
 public:
  explicit ConversionError(const std::string& message) : std::range_error(message) {}
};

}  // namespace thornvale
