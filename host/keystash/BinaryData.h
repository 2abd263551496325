// FileUtils::BinaryData: an exclusively owned byte array and its length.
//
// Empty means no array and length 0. Copies are deep; a moved-from value is
// empty. Not synchronised: share a value between threads only for reading.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace kestrova::mobile::xplat::keystash::FileUtils {

class BinaryData {
 public:
  BinaryData() noexcept = default;
  // Copies `size` bytes from `bytes` (which may be null when size is 0).
  BinaryData(const void* bytes, size_t size);
  explicit BinaryData(std::string_view bytes) : BinaryData(bytes.data(), bytes.size()) {}

  BinaryData(const BinaryData& other) : BinaryData(other.data(), other.size()) {}
  BinaryData& operator=(const BinaryData& other);
  BinaryData(BinaryData&& other) noexcept;
  BinaryData& operator=(BinaryData&& other) noexcept;
  ~BinaryData() = default;

  const uint8_t* data() const noexcept { return bytes_.get(); }
  size_t size() const noexcept { return size_; }
  bool empty() const noexcept { return size_ == 0; }

  std::string_view view() const noexcept {
    return {reinterpret_cast<const char*>(bytes_.get()), size_};
  }
  std::string toString() const { return std::string(view()); }

 private:
  std::unique_ptr<uint8_t[]> bytes_;
  size_t size_ = 0;
};

}  // namespace kestrova::mobile::xplat::keystash::FileUtils
