#include "host/HostIdentity.h"

#include <algorithm>
#include <bit>

namespace kx {

namespace {

class Sha1 {
 public:
  void block(const std::uint8_t* bytes) {
    std::array<std::uint32_t, 80> w = {};
    for (std::size_t i = 0; i < 16; ++i) {
      w[i] = static_cast<std::uint32_t>(bytes[4 * i]) << 24 |
             static_cast<std::uint32_t>(bytes[4 * i + 1]) << 16 |
             static_cast<std::uint32_t>(bytes[4 * i + 2]) << 8 | bytes[4 * i + 3];
    }
    for (std::size_t i = 16; i < 80; ++i)
      w[i] = std::rotl(w[i - 3] ^ w[i - 8] ^ w[i - 14] ^ w[i - 16], 1);
    std::array<std::uint32_t, 5> s = state_;
    for (std::size_t i = 0; i < 80; ++i) {
      const std::uint32_t next = std::rotl(s[0], 5) + mix(i, s) + s[4] + w[i];
      s = {next, s[0], std::rotl(s[1], 30), s[2], s[3]};
    }
    for (std::size_t i = 0; i < 5; ++i) state_[i] += s[i];
  }

  std::array<std::uint8_t, 20> digest() const {
    std::array<std::uint8_t, 20> result = {};
    for (std::size_t i = 0; i < 20; ++i)
      result[i] = static_cast<std::uint8_t>(state_[i / 4] >> (24 - 8 * (i % 4)) & 0xFF);
    return result;
  }

 private:
  static std::uint32_t mix(std::size_t round, const std::array<std::uint32_t, 5>& s) {
    if (round < 20) return ((s[1] & s[2]) | (~s[1] & s[3])) + 0x5A827999;
    if (round < 40) return (s[1] ^ s[2] ^ s[3]) + 0x6ED9EBA1;
    if (round < 60) return ((s[1] & s[2]) | (s[1] & s[3]) | (s[2] & s[3])) + 0x8F1BBCDC;
    return (s[1] ^ s[2] ^ s[3]) + 0xCA62C1D6;
  }

  std::array<std::uint32_t, 5> state_{0x67452301, 0xEFCDAB89, 0x98BADCFE, 0x10325476, 0xC3D2E1F0};
};

int hexDigit(char letter) {
  if (letter >= '0' && letter <= '9') return letter - '0';
  if (letter >= 'a' && letter <= 'f') return letter - 'a' + 10;
  if (letter >= 'A' && letter <= 'F') return letter - 'A' + 10;
  return -1;
}

}  // namespace

std::array<std::uint8_t, 20> sha1(std::string_view bytes) {
  std::string padded(bytes);
  padded.push_back('\x80');
  while (padded.size() % 64 != 56) padded.push_back('\0');
  const std::uint64_t bits = static_cast<std::uint64_t>(bytes.size()) * 8;
  for (int shift = 56; shift >= 0; shift -= 8)
    padded.push_back(static_cast<char>(bits >> shift & 0xFF));
  Sha1 hash;
  const auto* data = reinterpret_cast<const std::uint8_t*>(padded.data());
  for (std::size_t at = 0; at < padded.size(); at += 64) hash.block(data + at);
  return hash.digest();
}

UUIDBytes uuidVersion5(const UUIDBytes& nameSpace, std::string_view name) {
  std::string input(nameSpace.begin(), nameSpace.end());
  input.append(name);
  const std::array<std::uint8_t, 20> digest = sha1(input);
  UUIDBytes uuid = {};
  std::copy_n(digest.begin(), uuid.size(), uuid.begin());
  uuid[6] = static_cast<std::uint8_t>((uuid[6] & 0x0F) | 0x50);
  uuid[8] = static_cast<std::uint8_t>((uuid[8] & 0x3F) | 0x80);
  return uuid;
}

std::string uuidText(const UUIDBytes& uuid) {
  static constexpr std::string_view kDigits = "0123456789ABCDEF";
  std::string text;
  for (std::size_t i = 0; i < uuid.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text.push_back('-');
    text.push_back(kDigits[uuid[i] >> 4]);
    text.push_back(kDigits[uuid[i] & 0xF]);
  }
  return text;
}

std::optional<UUIDBytes> uuidFromText(std::string_view text) {
  if (text.size() != 36) return std::nullopt;
  UUIDBytes uuid = {};
  std::size_t at = 0;
  for (std::size_t i = 0; i < uuid.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) {
      if (text[at++] != '-') return std::nullopt;
    }
    const int high = hexDigit(text[at]);
    const int low = hexDigit(text[at + 1]);
    if (high < 0 || low < 0) return std::nullopt;
    uuid[i] = static_cast<std::uint8_t>(high << 4 | low);
    at += 2;
  }
  return uuid;
}

UUIDBytes HostIdentity::libraryOfFolder(std::string_view canonicalPath) {
  static constexpr UUIDBytes kUrlNamespace{0x6B, 0xA7, 0xB8, 0x11, 0x9D, 0xAD, 0x11, 0xD1,
                                           0x80, 0xB4, 0x00, 0xC0, 0x4F, 0xD4, 0x30, 0xC8};
  return uuidVersion5(kUrlNamespace, canonicalPath);
}

}  // namespace kx
