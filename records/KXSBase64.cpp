#include "records/KXSBase64.h"

#include <vector>

namespace kx {
namespace {

constexpr std::string_view kAlphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+%";

char characterOf(unsigned value) { return kAlphabet[value & 63U]; }

bool isAscii(std::string_view text) {
  for (const char c : text) {
    if (static_cast<unsigned char>(c) > 127) return false;
  }
  return true;
}

std::uint8_t byteAt(std::uint32_t accumulator, unsigned lowestBit) {
  return static_cast<std::uint8_t>((accumulator >> lowestBit) & 0xFFU);
}

}  // namespace

std::string KXSBase64Encoder::encodeData(const Data& data) const {
  const std::uint8_t* const bytes = data.bytes();
  const std::size_t count = data.length();
  std::string text;
  text.reserve(count * 4 / 3 + 3);
  std::size_t i = 0;
  for (; count - i >= 3; i += 3) {
    const unsigned first = bytes[i];
    const unsigned second = bytes[i + 1];
    const unsigned third = bytes[i + 2];
    text += characterOf(first >> 2);
    text += characterOf((first & 3U) << 4 | second >> 4);
    text += characterOf((second & 15U) << 2 | third >> 6);
    text += characterOf(third);
  }
  if (count - i == 2) {
    const unsigned first = bytes[i];
    const unsigned second = bytes[i + 1];
    text += characterOf(first >> 2);
    text += characterOf((first & 3U) << 4 | second >> 4);
    text += characterOf((second & 15U) << 2);
    if (!photoUUID_) text += "=";
  } else if (count - i == 1) {
    const unsigned first = bytes[i];
    text += characterOf(first >> 2);
    text += characterOf((first & 3U) << 4);
    if (!photoUUID_) text += "==";
  }
  return text;
}

KXSBase64Decoder::KXSBase64Decoder(bool photoUUID) : photoUUID_(photoUUID) {
  for (std::size_t i = 0; i < kAlphabet.size(); ++i) {
    decoder_[static_cast<std::size_t>(kAlphabet[i])] = static_cast<std::int8_t>(i);
  }
}

DataPtr KXSBase64Decoder::decodeString(std::string_view text) const {
  const std::size_t size = isAscii(text) ? text.size() : 0;
  std::vector<std::uint8_t> bytes;
  bytes.reserve(size / 4 * 3 + 2);
  std::uint32_t accumulator = 0;
  unsigned count = 0;
  std::size_t padCount = 0;
  std::size_t i = 0;
  for (; i < size; ++i) {
    // Before the look at the character: at a "=" this shift is what aligns the bits.
    accumulator <<= 6;
    if (text[i] == '=') {
      padCount = i + 1 < size && text[i + 1] == '=' ? 2 : 1;
      break;
    }
    accumulator |= static_cast<std::uint32_t>(decoder_[static_cast<std::size_t>(text[i])]);
    if (++count == 4) {
      bytes.insert(bytes.end(),
                   {byteAt(accumulator, 16), byteAt(accumulator, 8), byteAt(accumulator, 0)});
      accumulator = 0;
      count = 0;
    }
  }
  if (count == 1) return nullptr;
  if (count != 0) {
    if (photoUUID_) accumulator <<= 6;
    const std::size_t wrongPad = count == 3 ? 2 : 1;
    if (i + padCount >= size && padCount == wrongPad) return nullptr;
    if (count == 3) {
      bytes.insert(bytes.end(), {byteAt(accumulator, 16), byteAt(accumulator, 8)});
    } else {
      bytes.push_back(byteAt(accumulator, 10));
    }
  }
  return std::make_shared<Data>(std::move(bytes));
}

}  // namespace kx
