#include "platform/foundation/PropertyListWriters.h"

#include <cmath>

#include "platform/foundation/Calendar.h"
#include "platform/foundation/PropertyListFailure.h"
#include "platform/foundation/Text.h"
#include "platform/foundation/Utf8.h"

namespace kx {

TextClass classifyText(std::string_view text) {
  if (text.size() > limits::kStringBytes) {
    throw PropertyListFailure(
        PropertyListError::kLimit,
        "a string is longer than " + std::to_string(limits::kStringBytes) + " bytes");
  }
  unsigned highBits = 0;
  bool hasNul = false;
  for (const char c : text) {
    highBits |= static_cast<unsigned char>(c);
    hasNul |= c == 0;
  }
  if (hasNul) throw PropertyListFailure(PropertyListError::kWrite, "a string holds a NUL");
  if (highBits < 0x80) return {true, text.size()};
  if (!isValidUtf8(text)) {
    throw PropertyListFailure(PropertyListError::kWrite, "a string is not UTF-8");
  }
  return {false, utf16Length(text)};
}

void requireKey(std::string_view key) {
  if (key.size() > limits::kKeyUnits && utf16Length(key) > limits::kKeyUnits) {
    throw PropertyListFailure(
        PropertyListError::kLimit,
        "a key is longer than " + std::to_string(limits::kKeyUnits) + " units");
  }
}

void requireDate(double secondsSinceReference) {
  if (!isDateInRange(secondsSinceReference) ||
      std::fpclassify(secondsSinceReference) == FP_SUBNORMAL) {
    throw PropertyListFailure(PropertyListError::kRange, "a date is not in the years 1 to 9999");
  }
}

void requireDataSize(std::size_t size) {
  if (size > limits::kDataBytes) {
    throw PropertyListFailure(
        PropertyListError::kLimit,
        "data is longer than " + std::to_string(limits::kDataBytes) + " bytes");
  }
}

void requireFileSize(std::uint64_t size) {
  if (size > limits::kSnapshotFileBytes) {
    throw PropertyListFailure(
        PropertyListError::kLimit,
        "the file would have more than " + std::to_string(limits::kSnapshotFileBytes) + " bytes");
  }
}

void failNull() {
  throw PropertyListFailure(PropertyListError::kWrite, "a null has no form in a property list");
}

void failDepth() {
  throw PropertyListFailure(
      PropertyListError::kDepth,
      "nested deeper than " + std::to_string(limits::kNestingDepth) + " levels");
}

void appendArrayStep(std::string& path, std::size_t index) {
  path += '[' + std::to_string(index) + ']';
}

void appendDictionaryStep(std::string& path, std::string_view key) {
  if (!path.empty()) path += '.';
  path += escapeControlCharacters(key);
}

}  // namespace kx
