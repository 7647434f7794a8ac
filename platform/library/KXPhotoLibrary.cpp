#include "platform/library/KXPhotoLibrary.h"

#include <array>
#include <cmath>
#include <random>

#include "platform/sync/FRLog.h"

namespace kx {

bool canUseCoordinate(const std::optional<Coordinate>& coordinate) {
  if (!coordinate) return false;
  const double latitude = coordinate->latitude;
  const double longitude = coordinate->longitude;
  if (!std::isfinite(latitude) || !std::isfinite(longitude)) return false;
  if (latitude == 0.0 && longitude == 0.0) return false;
  return std::fabs(latitude) <= 90.0 && std::fabs(longitude) <= 180.0;
}

std::string describeLocation(const Coordinate& coordinate) {
  return "<" + Number::real(coordinate.latitude).description() + "," +
         Number::real(coordinate.longitude).description() + ">";
}

std::string UUIDString() {
  static thread_local std::random_device source;
  std::array<unsigned, 4> words{};
  for (unsigned& word : words) word = source();
  words[1] = (words[1] & 0xFFFF0FFFU) | 0x00004000U;  // version 4
  words[2] = (words[2] & 0x3FFFFFFFU) | 0x80000000U;  // the RFC 4122 variant
  static constexpr char kDigits[] = "0123456789ABCDEF";
  std::string text;
  for (std::size_t digit = 0; digit < 32; ++digit) {
    if (digit == 8 || digit == 12 || digit == 16 || digit == 20) text += '-';
    text += kDigits[(words[digit / 8] >> (28 - 4 * (digit % 8))) & 0xFU];
  }
  return text;
}

}  // namespace kx
