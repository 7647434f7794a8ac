#include "platform/foundation/Data.h"

#include <cstring>

namespace kx {

Data::Data(const void* bytes, std::size_t length)
    : bytes_(static_cast<const std::uint8_t*>(bytes),
             static_cast<const std::uint8_t*>(bytes) + length) {}

bool Data::isEqualToData(const Data& other) const {
  const std::size_t size = length();
  if (size != other.length()) return false;
  return size == 0 || std::memcmp(bytes(), other.bytes(), size) == 0;
}

}  // namespace kx
