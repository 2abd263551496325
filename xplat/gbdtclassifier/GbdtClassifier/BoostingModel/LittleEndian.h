// The byte order of the fields of a model record (ModelFormat.h): a 4- or
// 8-byte value is written least significant byte first, whatever the host's
// own order. Pure; any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <type_traits>

namespace thornvale {

// Appends the bytes of `value` (an int32, uint32 or double) to `out` in
// little-endian order.
template <typename T>
void appendLittleEndian(std::string& out, T value) {
  static_assert(sizeof(T) == 4 || sizeof(T) == 8, "record fields take 4 or 8 bytes");
  using Bits = std::conditional_t<sizeof(T) == 4, uint32_t, uint64_t>;
  Bits bits;
  std::memcpy(&bits, &value, sizeof bits);
  for (size_t i = 0; i < sizeof bits; ++i) out.push_back(static_cast<char>(bits >> (8 * i)));
}

}  // namespace thornvale
