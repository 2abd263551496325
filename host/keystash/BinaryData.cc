#include "host/keystash/BinaryData.h"

#include <cstring>
#include <utility>

namespace kestrova::mobile::xplat::keystash::FileUtils {

BinaryData::BinaryData(const void* bytes, size_t size) {
  if (size == 0) return;
  bytes_ = std::make_unique<uint8_t[]>(size);
  std::memcpy(bytes_.get(), bytes, size);
  size_ = size;
}

BinaryData& BinaryData::operator=(const BinaryData& other) {
  if (this != &other) *this = BinaryData(other);
  return *this;
}

BinaryData::BinaryData(BinaryData&& other) noexcept
    : bytes_(std::move(other.bytes_)), size_(std::exchange(other.size_, 0)) {}

BinaryData& BinaryData::operator=(BinaryData&& other) noexcept {
  bytes_ = std::move(other.bytes_);
  size_ = std::exchange(other.size_, 0);
  return *this;
}

}  // namespace kestrova::mobile::xplat::keystash::FileUtils
