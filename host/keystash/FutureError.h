// FutureError: misuse of a Future (see Future.h), reported with a code.
//
//   1 "Shared state is invalid"                        the handle has no shared state
//   2 "Value may not be fetched if a callback is set"  get() after setCallback()
//   3 "Callback may not be set again"                  a second setCallback()
//   4 "Unknown error"                                  get() on a state whose promise
//                                                      was dropped without a result
// Any other code reads "Unknown error" as well.
#pragma once

#include <stdexcept>

namespace kestrova::mobile::xplat::keystash {

class FutureError : public std::logic_error {
 public:
  static constexpr int kInvalidState = 1;
  static constexpr int kCallbackIsSet = 2;
  static constexpr int kCallbackAlreadySet = 3;
  static constexpr int kNoValueSource = 4;

  explicit FutureError(int code) : std::logic_error(describe(code)), code_(code) {}

  int code() const noexcept { return code_; }

  static const char* describe(int code) noexcept {
    switch (code) {
      case kInvalidState: return "Shared state is invalid";
      case kCallbackIsSet: return "Value may not be fetched if a callback is set";
      case kCallbackAlreadySet: return "Callback may not be set again";
      default: return "Unknown error";
    }
  }

 private:
  int code_;
};

}  // namespace kestrova::mobile::xplat::keystash
