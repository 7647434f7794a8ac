#include "client/CameraFolderName.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <iterator>

#include "client/LetterRanges.h"

namespace kx {
namespace {

constexpr int kLeastNumber = 100;
constexpr int kGreatestNumber = 999;
constexpr std::size_t kFewestLetters = 2;
constexpr std::size_t kMostLetters = 5;

bool isDigit(char c) { return c >= '0' && c <= '9'; }

bool isLetter(std::uint32_t point) {
  if (point < 0x80) return (point >= 'A' && point <= 'Z') || (point >= 'a' && point <= 'z');
  const LetterRange* range =
      std::lower_bound(std::begin(kLetterRanges), std::end(kLetterRanges), point,
                       [](const LetterRange& r, std::uint32_t value) { return r.last < value; });
  return range != std::end(kLetterRanges) && range->first <= point;
}

// Takes one character off the front; 0 for bytes that are no UTF-8.
std::uint32_t takeCodePoint(std::string_view& text) {
  const auto first = static_cast<unsigned char>(text.front());
  std::size_t length = 1;
  std::uint32_t point = first;
  if (first >= 0xF0U) {
    length = 4;
    point = first & 0x07U;
  } else if (first >= 0xE0U) {
    length = 3;
    point = first & 0x0FU;
  } else if (first >= 0xC0U) {
    length = 2;
    point = first & 0x1FU;
  }
  if (text.size() < length || (first >= 0x80U && first < 0xC0U)) {
    text.remove_prefix(1);
    return 0;
  }
  for (std::size_t i = 1; i < length; ++i) {
    point = point << 6U | (static_cast<unsigned char>(text[i]) & 0x3FU);
  }
  text.remove_prefix(length);
  return point;
}

}  // namespace

bool isCameraFolderName(std::string_view name) {
  constexpr std::string_view kBlanks = " \t\n\v\f\r";
  name.remove_prefix(std::min(name.find_first_not_of(kBlanks), name.size()));
  if (name.starts_with('+')) {
    name.remove_prefix(1);
  } else if (name.starts_with('-')) {
    return false;  // no negative number is large enough
  }
  int number = 0;
  while (!name.empty() && isDigit(name.front())) {
    number = std::min(number * 10 + (name.front() - '0'), kGreatestNumber + 1);
    name.remove_prefix(1);
  }
  if (number < kLeastNumber || number > kGreatestNumber) return false;
  std::size_t units = 0;  // UTF-16 units of the letters
  while (!name.empty()) {
    const std::uint32_t point = takeCodePoint(name);
    if (!isLetter(point)) return false;
    units += point > 0xFFFFU ? 2 : 1;
  }
  return units >= kFewestLetters && units <= kMostLetters;
}

}  // namespace kx
