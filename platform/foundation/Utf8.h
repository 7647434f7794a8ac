#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

// Strict UTF-8: no overlong forms, no surrogates, nothing above U+10FFFF. Internal to
// platform/foundation.
namespace kx {

struct Utf8Unit {
  std::uint32_t point = 0;
  unsigned length = 0;  // 0: not UTF-8 here
};

inline Utf8Unit decodeUtf8(std::string_view text, std::size_t at) {
  const auto byte = [&](std::size_t i) {
    return at + i < text.size() ? static_cast<unsigned char>(text[at + i]) : 0U;
  };
  const auto isTail = [](unsigned value) { return (value & 0xC0U) == 0x80U; };
  const unsigned a = byte(0);
  if (a < 0x80) return {a, at < text.size() ? 1U : 0U};
  const unsigned b = byte(1);
  if (a < 0xC2 || a > 0xF4 || !isTail(b)) return {};
  if (a < 0xE0) return {(a & 0x1FU) << 6 | (b & 0x3FU), 2};
  const unsigned c = byte(2);
  if (!isTail(c)) return {};
  if (a < 0xF0) {
    const std::uint32_t point = (a & 0x0FU) << 12 | (b & 0x3FU) << 6 | (c & 0x3FU);
    if (point < 0x800 || (point >= 0xD800 && point <= 0xDFFF)) return {};
    return {point, 3};
  }
  const unsigned d = byte(3);
  if (!isTail(d)) return {};
  const std::uint32_t point =
      (a & 0x07U) << 18 | (b & 0x3FU) << 12 | (c & 0x3FU) << 6 | (d & 0x3FU);
  if (point < 0x10000 || point > 0x10FFFF) return {};
  return {point, 4};
}

// Writes up to 4 bytes and returns their number.
inline std::size_t encodeUtf8(std::uint32_t point, char* out) {
  if (point < 0x80) {
    out[0] = static_cast<char>(point);
    return 1;
  }
  if (point < 0x800) {
    out[0] = static_cast<char>(0xC0 | point >> 6);
    out[1] = static_cast<char>(0x80 | (point & 0x3F));
    return 2;
  }
  if (point < 0x10000) {
    out[0] = static_cast<char>(0xE0 | point >> 12);
    out[1] = static_cast<char>(0x80 | (point >> 6 & 0x3F));
    out[2] = static_cast<char>(0x80 | (point & 0x3F));
    return 3;
  }
  out[0] = static_cast<char>(0xF0 | point >> 18);
  out[1] = static_cast<char>(0x80 | (point >> 12 & 0x3F));
  out[2] = static_cast<char>(0x80 | (point >> 6 & 0x3F));
  out[3] = static_cast<char>(0x80 | (point & 0x3F));
  return 4;
}

inline void appendUtf8(std::string& out, std::uint32_t point) {
  char bytes[4];
  out.append(bytes, encodeUtf8(point, bytes));
}

// UTF-16 units of valid UTF-8 text.
inline std::size_t utf16Length(std::string_view text) {
  std::size_t units = 0;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if ((byte & 0xC0U) != 0x80U) units += byte >= 0xF0 ? 2 : 1;
  }
  return units;
}

}  // namespace kx
