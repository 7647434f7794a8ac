#include "daemon/PlistJson.h"

#include <string>
#include <utility>

namespace kx {

namespace {

nlohmann::ordered_json numberJson(const Number& number) {
  switch (number.type()) {
    case Number::Type::kBoolean:
      return number.boolValue();
    case Number::Type::kInteger:
      return number.int64Value();
    case Number::Type::kUnsigned:
      return number.uint64Value();
    case Number::Type::kReal32:
    case Number::Type::kReal64:
      return number.doubleValue();
  }
  return nullptr;
}

nlohmann::ordered_json dictionaryJson(const DictionaryView& view) {
  // Keys of a dictionary differ, so each goes to the end without a look-up.
  nlohmann::ordered_json::object_t entries;
  entries.reserve(view.size());
  for (std::size_t i = 0; i < view.size(); ++i) {
    entries.std::vector<nlohmann::ordered_json::object_t::value_type>::emplace_back(
        std::string(view.keyAt(i)), plistJson(view.valueAt(i)));
  }
  return entries;
}

nlohmann::ordered_json arrayJson(const ArrayView& view) {
  nlohmann::ordered_json elements = nlohmann::ordered_json::array();
  for (const Value& element : view) elements.push_back(plistJson(element));
  return elements;
}

}  // namespace

nlohmann::ordered_json plistJson(const Value& value) {
  switch (value.kind()) {
    case Kind::kNull:
      return nullptr;
    case Kind::kNumber:
      return numberJson(value.numberValue());
    case Kind::kDate:
      return {{"date", value.dateValue().secondsSinceReference}};
    case Kind::kString:
      return std::string(value.stringValue());
    case Kind::kData:
      return {{"base64", base64Text(value.dataValue())}};
    case Kind::kUid:
      return {{"uid", value.uidValue()}};
    case Kind::kArray:
      return arrayJson(value.arrayValue());
    case Kind::kDictionary:
      return dictionaryJson(value.dictionaryValue());
  }
  return nullptr;
}

std::string base64Text(std::span<const std::uint8_t> bytes) {
  constexpr const char* kDigits =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::string text;
  text.reserve((bytes.size() + 2) / 3 * 4);
  for (std::size_t i = 0; i < bytes.size(); i += 3) {
    const std::size_t left = bytes.size() - i;
    const std::uint32_t second = left > 1 ? bytes[i + 1] : 0U;
    const std::uint32_t third = left > 2 ? bytes[i + 2] : 0U;
    const std::uint32_t group = std::uint32_t{bytes[i]} << 16U | second << 8U | third;
    text += kDigits[group >> 18U];
    text += kDigits[group >> 12U & 63U];
    text += left > 1 ? kDigits[group >> 6U & 63U] : '=';
    text += left > 2 ? kDigits[group & 63U] : '=';
  }
  return text;
}

}  // namespace kx
