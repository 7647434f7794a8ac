#pragma once

#include <initializer_list>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/foundation/PropertyList.h"
#include "platform/foundation/Value.h"

namespace kx {

inline Value text(std::string_view content) { return Value::string(content); }
inline Value list(Array elements) { return Value::array(std::move(elements)); }
inline Value dict(std::initializer_list<std::pair<std::string_view, Value>> entries) {
  return Value::dictionary(Dictionary(entries));
}
inline Value texts(std::initializer_list<std::string_view> contents) {
  Array elements;
  for (const std::string_view content : contents) elements.push_back(text(content));
  return list(std::move(elements));
}

// The value after writing it to a property-list file and reading that.
inline Value throughFile(const Value& value,
                         PropertyListFormat format = PropertyListFormat::kBinary) {
  ErrorPtr error;
  auto bytes = writePropertyList(value, format, &error);
  if (error) throw std::runtime_error(error->description());
  Value read = readPropertyList(std::make_shared<const Data>(std::move(bytes)), &error);
  if (error) throw std::runtime_error(error->description());
  return read;
}

inline std::string hexOf(std::span<const std::uint8_t> bytes) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string hex;
  for (const std::uint8_t byte : bytes) {
    hex += kDigits[byte >> 4];
    hex += kDigits[byte & 15];
  }
  return hex;
}

// Ignores spaces and line breaks.
inline std::vector<std::uint8_t> bytesOfHex(std::string_view hex) {
  std::string digits;
  for (const char c : hex) {
    if (c != ' ' && c != '\n') digits += c;
  }
  std::vector<std::uint8_t> bytes;
  for (std::size_t i = 0; i + 1 < digits.size(); i += 2) {
    bytes.push_back(static_cast<std::uint8_t>(std::stoi(digits.substr(i, 2), nullptr, 16)));
  }
  return bytes;
}

}  // namespace kx
