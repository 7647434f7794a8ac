#pragma once

#include <cstdint>
#include <cstring>
#include <string_view>

// Hashing of text and numbers for look-up tables. Seeded once per process from the system's random
// source, so that input cannot be made to collide; nothing that can be observed, such as an order
// of enumeration, may depend on it. Safe from any thread.
namespace kx {

struct HashSeed {
  std::uint64_t first;
  std::uint64_t second;
};

const HashSeed& processHashSeed();

namespace hash_detail {

__extension__ using Wide = unsigned __int128;

inline std::uint64_t fold(std::uint64_t a, std::uint64_t b) {
  const Wide product = static_cast<Wide>(a) * b;
  return static_cast<std::uint64_t>(product) ^ static_cast<std::uint64_t>(product >> 64);
}

template <typename T>
std::uint64_t load(const char* from) {
  T value;
  std::memcpy(&value, from, sizeof(T));
  return value;
}

}  // namespace hash_detail

inline std::uint64_t hashBytes(const char* bytes, std::size_t length, const HashSeed& seed) {
  using hash_detail::fold;
  using hash_detail::load;
  std::uint64_t state = seed.first;
  std::uint64_t a = 0;
  std::uint64_t b = 0;
  if (length <= 16) {
    if (length >= 8) {
      a = load<std::uint64_t>(bytes);
      b = load<std::uint64_t>(bytes + length - 8);
    } else if (length >= 4) {
      a = load<std::uint32_t>(bytes);
      b = load<std::uint32_t>(bytes + length - 4);
    } else if (length > 0) {
      const auto at = [bytes](std::size_t i) {
        return static_cast<std::uint64_t>(static_cast<unsigned char>(bytes[i]));
      };
      a = at(0) << 16 | at(length / 2) << 8 | at(length - 1);
    }
  } else {
    std::size_t left = length;
    for (; left > 16; left -= 16, bytes += 16) {
      state =
          fold(load<std::uint64_t>(bytes) ^ seed.second, load<std::uint64_t>(bytes + 8) ^ state);
    }
    a = load<std::uint64_t>(bytes + left - 16);
    b = load<std::uint64_t>(bytes + left - 8);
  }
  return fold(seed.second ^ length, fold(a ^ seed.second, b ^ state));
}

inline std::uint64_t hashText(std::string_view text) {
  return hashBytes(text.data(), text.size(), processHashSeed());
}

inline std::uint64_t hashNumber(std::uint64_t bits, std::uint64_t tag, const HashSeed& seed) {
  return hash_detail::fold(bits ^ seed.first, (tag * 2 + 1) ^ seed.second);
}

}  // namespace kx
