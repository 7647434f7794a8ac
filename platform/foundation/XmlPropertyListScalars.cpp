// The part of the XML reader that turns the text of elements into objects of the document.
#include <array>
#include <bit>
#include <charconv>
#include <cstring>
#include <limits>

#include "platform/foundation/Calendar.h"
#include "platform/foundation/XmlPropertyListReader.h"

namespace kx {
namespace {

constexpr std::string_view kSpace = " \t\r\n";

std::string_view trimmed(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kSpace);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kSpace) - first + 1);
}

bool allDigits(std::string_view text) {
  return !text.empty() && text.find_first_not_of("0123456789") == std::string_view::npos;
}

constexpr std::array<std::int8_t, 256> makeBase64Values() {
  std::array<std::int8_t, 256> values{};
  values.fill(-1);
  constexpr std::string_view kAlphabet =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  for (std::size_t i = 0; i < kAlphabet.size(); ++i) {
    values[static_cast<unsigned char>(kAlphabet[i])] = static_cast<std::int8_t>(i);
  }
  return values;
}
constexpr auto kBase64Values = makeBase64Values();

}  // namespace

std::uint32_t XmlPropertyListReader::addNode(Kind kind) {
  std::uint32_t& count = document_->count_;
  if (count == capacity_) {
    scanner_.fail(PropertyListError::kLimit,
                  "more than " + std::to_string(limits_.objects) + " objects", scanner_.offset());
  }
  nodes_[count].kind = kind;
  return count++;
}

std::uint32_t XmlPropertyListReader::addBits(Kind kind, Number::Type type, std::uint64_t bits) {
  const std::uint32_t object = addNode(kind);
  nodes_[object].detail = static_cast<std::uint8_t>(type);
  nodes_[object].setBits(bits);
  return object;
}

// Values that occur often and are shorter in the file than their node is here.
std::uint32_t XmlPropertyListReader::shared(Shared which, Kind kind, std::uint32_t bits) {
  std::uint32_t& object = shared_[which];
  if (object == kNoObject) {
    object = kind == Kind::kNumber ? addBits(kind, Number::Type::kBoolean, bits) : addNode(kind);
  }
  return object;
}

std::uint32_t XmlPropertyListReader::addString(std::string_view text, bool isInText,
                                               std::size_t offset) {
  if (text.size() > limits_.stringBytes) {
    scanner_.fail(PropertyListError::kLimit,
                  "a string is longer than " + std::to_string(limits_.stringBytes) + " bytes",
                  offset);
  }
  if (text.empty()) return shared(kEmptyString, Kind::kString, 0);
  const std::uint32_t object = addNode(Kind::kString);
  DocumentNode& node = nodes_[object];
  node.high = static_cast<std::uint32_t>(text.size());
  if (isInText) {
    node.detail = DocumentNode::kInFile;
    node.low = static_cast<std::uint32_t>(textStart_ +
                                          static_cast<std::size_t>(text.data() - text_.data()));
    return object;
  }
  char* const out = document_->arena_.begin(text.size(), text_.size());
  if (out == nullptr) {
    scanner_.fail(PropertyListError::kLimit, "too much text for the memory of a decoding", offset);
  }
  std::memcpy(out, text.data(), text.size());
  node.detail = DocumentNode::kInArena;
  node.low = document_->arena_.commit(text.size());
  return object;
}

std::uint32_t XmlPropertyListReader::addData(std::string_view base64, std::size_t offset) {
  const std::size_t most = std::min(base64.size() / 4 * 3 + 3, limits_.dataBytes + 3);
  char* const out = document_->arena_.begin(most, text_.size());
  if (out == nullptr) {
    scanner_.fail(PropertyListError::kLimit, "too much data for the memory of a decoding", offset);
  }
  std::size_t written = 0;
  std::size_t padding = 0;
  std::uint32_t group = 0;
  unsigned groupSize = 0;
  for (std::size_t i = 0; i < base64.size(); ++i) {
    const char c = base64[i];
    if (kSpace.find(c) != std::string_view::npos) continue;
    const int value = kBase64Values[static_cast<unsigned char>(c)];
    const bool isPadding = c == '=' && groupSize >= 2;
    if ((value < 0 && !isPadding) || (value >= 0 && padding > 0)) {
      scanner_.failSyntax("bad base64", offset + i);
    }
    if (isPadding) ++padding;
    group = group << 6 | (isPadding ? 0U : static_cast<std::uint32_t>(value));
    if (++groupSize < 4) continue;
    const std::size_t size = 3 - padding;
    if (padding > 0 && (group & (padding == 1 ? 0xFFU : 0xFFFFU)) != 0) {
      scanner_.failSyntax("bad base64", offset + i);
    }
    if (written + size > limits_.dataBytes) {
      scanner_.fail(PropertyListError::kLimit,
                    "data is longer than " + std::to_string(limits_.dataBytes) + " bytes", offset);
    }
    for (std::size_t k = 0; k < size; ++k) {
      out[written++] = static_cast<char>(group >> (16 - 8 * k) & 0xFF);
    }
    group = 0;
    groupSize = 0;
  }
  if (groupSize != 0) scanner_.failSyntax("bad base64", offset + base64.size());
  if (written == 0) return shared(kEmptyData, Kind::kData, 0);
  const std::uint32_t object = addNode(Kind::kData);
  nodes_[object].detail = DocumentNode::kInArena;
  nodes_[object].high = static_cast<std::uint32_t>(written);
  nodes_[object].low = document_->arena_.commit(written);
  return object;
}

std::uint32_t XmlPropertyListReader::addInteger(std::string_view text, std::size_t offset) {
  std::string_view digits = trimmed(text);
  const bool isNegative = !digits.empty() && digits.front() == '-';
  if (isNegative || (!digits.empty() && digits.front() == '+')) digits.remove_prefix(1);
  if (!allDigits(digits)) scanner_.failSyntax("bad integer", offset);
  std::uint64_t magnitude = 0;
  const auto result = std::from_chars(digits.data(), digits.data() + digits.size(), magnitude);
  constexpr std::uint64_t kLowest = std::uint64_t{1} << 63;
  if (result.ec != std::errc() || (isNegative && magnitude > kLowest)) {
    scanner_.fail(PropertyListError::kRange, "an integer exceeds 64 bits", offset);
  }
  const bool isUnsigned = !isNegative && magnitude >= kLowest;
  return addBits(Kind::kNumber, isUnsigned ? Number::Type::kUnsigned : Number::Type::kInteger,
                 isNegative ? 0 - magnitude : magnitude);
}

std::uint32_t XmlPropertyListReader::addReal(std::string_view text, std::size_t offset) {
  std::string_view body = trimmed(text);
  const bool isNegative = !body.empty() && body.front() == '-';
  if (isNegative || (!body.empty() && body.front() == '+')) body.remove_prefix(1);
  double value = 0;
  if (body == "inf" || body == "infinity") {
    value = std::numeric_limits<double>::infinity();
  } else if (body == "nan" && body.size() == trimmed(text).size()) {
    value = std::numeric_limits<double>::quiet_NaN();
  } else {
    const bool startsWell = !body.empty() && (body.front() == '.' || allDigits(body.substr(0, 1)));
    const auto result = std::from_chars(body.data(), body.data() + body.size(), value);
    if (!startsWell || result.ec == std::errc::invalid_argument ||
        result.ptr != body.data() + body.size()) {
      scanner_.failSyntax("bad real", offset);
    }
    if (result.ec != std::errc()) {
      scanner_.fail(PropertyListError::kRange, "a real exceeds 64 bits", offset);
    }
  }
  return addBits(Kind::kNumber, Number::Type::kReal64,
                 std::bit_cast<std::uint64_t>(isNegative ? -value : value));
}

// "2001-01-01T00:00:00Z"
std::uint32_t XmlPropertyListReader::addDate(std::string_view text, std::size_t offset) {
  constexpr std::string_view kShape = "0000-00-00T00:00:00Z";
  if (text.size() != kShape.size()) scanner_.failSyntax("bad date", offset);
  for (std::size_t i = 0; i < kShape.size(); ++i) {
    const bool fits = kShape[i] == '0' ? text[i] >= '0' && text[i] <= '9' : text[i] == kShape[i];
    if (!fits) scanner_.failSyntax("bad date", offset + i);
  }
  const auto number = [&](std::size_t from, std::size_t length) {
    int value = 0;
    for (std::size_t i = from; i < from + length; ++i) value = value * 10 + (text[i] - '0');
    return value;
  };
  const int year = number(0, 4);
  const int month = number(5, 2);
  const int day = number(8, 2);
  if (year == 0) {
    scanner_.fail(PropertyListError::kRange, "a date is not in the years 1 to 9999", offset);
  }
  if (month < 1 || month > 12 || day < 1 || day > daysInMonth(year, month) || number(11, 2) > 23 ||
      number(14, 2) > 59 || number(17, 2) > 59) {
    scanner_.failSyntax("bad date", offset);
  }
  const std::int64_t seconds = daysFromReference(year, month, day) * kSecondsPerDay +
                               number(11, 2) * 3600 + number(14, 2) * 60 + number(17, 2);
  return addBits(Kind::kDate, Number::Type::kReal64,
                 std::bit_cast<std::uint64_t>(static_cast<double>(seconds)));
}

}  // namespace kx
