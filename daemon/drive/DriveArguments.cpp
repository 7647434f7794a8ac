#include "daemon/drive/DriveArguments.h"

#include <utility>

#include "platform/foundation/Limits.h"

namespace kx {

using Json = nlohmann::ordered_json;

DriveArguments::DriveArguments(const Json& object, std::string where)
    : object_(object), where_(std::move(where)) {}

const Json* DriveArguments::find(const char* key) const {
  const auto found = object_.find(key);
  return found == object_.end() || found->is_null() ? nullptr : &*found;
}

void DriveArguments::refuse(const char* key, const char* expected, const Json* found) const {
  const std::string name = where_.empty() ? std::string(key) : where_ + "." + key;
  if (found == nullptr) throw DriveException(kBadArgument, "missing argument \"" + name + "\"");
  throw DriveException(kBadArgument, "argument \"" + name + "\": expected " + expected +
                                         ", found " + found->type_name());
}

bool DriveArguments::has(const char* key) const { return find(key) != nullptr; }

bool DriveArguments::names(const char* key) const { return object_.contains(key); }

std::string DriveArguments::string(const char* key) const {
  const Json* value = find(key);
  if (value == nullptr || !value->is_string()) refuse(key, "string", value);
  return value->get<std::string>();
}

std::optional<std::string> DriveArguments::optionalString(const char* key) const {
  if (!has(key)) return std::nullopt;
  return string(key);
}

bool DriveArguments::boolean(const char* key, bool fallback) const {
  const Json* value = find(key);
  if (value == nullptr) return fallback;
  if (!value->is_boolean()) refuse(key, "boolean", value);
  return value->get<bool>();
}

std::int64_t DriveArguments::integer(const char* key) const {
  const Json* value = find(key);
  if (value == nullptr || !value->is_number_integer()) refuse(key, "integer", value);
  if (value->is_number_unsigned() && value->get<std::uint64_t>() > INT64_MAX) {
    throw DriveException(kBadArgument, "argument \"" + std::string(key) + "\" is too large");
  }
  return value->get<std::int64_t>();
}

std::int64_t DriveArguments::integer(const char* key, std::int64_t fallback) const {
  return has(key) ? integer(key) : fallback;
}

std::optional<std::int64_t> DriveArguments::optionalInteger(const char* key) const {
  if (!has(key)) return std::nullopt;
  return integer(key);
}

std::int64_t DriveArguments::integerWithin(const char* key, std::int64_t low, std::int64_t high,
                                           std::int64_t fallback) const {
  const std::int64_t value = integer(key, fallback);
  if (value < low || value > high) {
    throw DriveException(kBadArgument, "argument \"" + std::string(key) + "\" must lie between " +
                                           std::to_string(low) + " and " + std::to_string(high));
  }
  return value;
}

double DriveArguments::real(const char* key) const {
  const Json* value = find(key);
  if (value == nullptr || !value->is_number()) refuse(key, "number", value);
  return value->get<double>();
}

std::optional<double> DriveArguments::optionalReal(const char* key) const {
  if (!has(key)) return std::nullopt;
  return real(key);
}

std::vector<std::string> DriveArguments::strings(const char* key) const {
  const Json* value = find(key);
  if (value == nullptr || !value->is_array()) refuse(key, "array of strings", value);
  std::vector<std::string> texts;
  for (const Json& element : *value) {
    if (!element.is_string()) refuse(key, "array of strings", &element);
    texts.push_back(element.get<std::string>());
  }
  return texts;
}

std::optional<std::vector<std::string>> DriveArguments::optionalStrings(const char* key) const {
  if (!has(key)) return std::nullopt;
  return strings(key);
}

std::optional<std::vector<double>> DriveArguments::optionalReals(const char* key,
                                                                 std::size_t count) const {
  const Json* value = find(key);
  if (value == nullptr) return std::nullopt;
  const std::string expected = "array of " + std::to_string(count) + " numbers";
  if (!value->is_array() || value->size() != count) refuse(key, expected.c_str(), value);
  std::vector<double> numbers;
  for (const Json& element : *value) {
    if (!element.is_number()) refuse(key, expected.c_str(), &element);
    numbers.push_back(element.get<double>());
  }
  return numbers;
}

const Json* DriveArguments::optionalArray(const char* key) const {
  const Json* value = find(key);
  if (value != nullptr && !value->is_array()) refuse(key, "array", value);
  return value;
}

const Json* DriveArguments::optionalObject(const char* key) const {
  const Json* value = find(key);
  if (value != nullptr && !value->is_object()) refuse(key, "object", value);
  return value;
}

const Json& DriveArguments::object(const char* key) const {
  const Json* value = optionalObject(key);
  if (value == nullptr) refuse(key, "object", value);
  return *value;
}

ErrorPtr DriveArguments::optionalError(const char* key) const {
  const Json* value = optionalObject(key);
  if (value == nullptr) return nullptr;
  const DriveArguments error(*value, key);
  return Error::make(error.string("domain"), error.integer("code"));
}

namespace {

Value numberFromJson(const Json& json) {
  if (json.is_number_unsigned()) return Value::unsignedInteger(json.get<std::uint64_t>());
  if (json.is_number_integer()) return Value::integer(json.get<std::int64_t>());
  return Value::real(json.get<double>());
}

Value objectFromJson(const Json& json, std::size_t depth) {
  if (json.size() == 1) {
    const std::string key = json.begin().key();
    const Json& value = json.begin().value();
    if (key == "base64" && value.is_string()) {
      return Value::data(bytesFromBase64(value.get<std::string>()));
    }
    if (key == "date" && value.is_number()) return Value::date(Date{value.get<double>()});
  }
  Dictionary dictionary;
  for (const auto& [key, value] : json.items()) {
    dictionary.set(std::string_view(key), plistFromJson(value, depth + 1));
  }
  return Value::dictionary(std::move(dictionary));
}

}  // namespace

Value plistFromJson(const Json& json, std::size_t depth) {
  if (depth > limits::kNestingDepth) {
    throw DriveException(kBadArgument, "the property list is nested too deep");
  }
  if (json.is_boolean()) return Value::boolean(json.get<bool>());
  if (json.is_number()) return numberFromJson(json);
  if (json.is_string()) return Value::string(json.get<std::string>());
  if (json.is_object()) return objectFromJson(json, depth);
  if (json.is_array()) {
    Array elements;
    for (const Json& element : json) elements.push_back(plistFromJson(element, depth + 1));
    return Value::array(std::move(elements));
  }
  throw DriveException(kBadArgument, "a property list holds no null");
}

std::vector<std::uint8_t> bytesFromBase64(const std::string& text) {
  constexpr std::string_view kDigits =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::size_t length = text.size();
  std::size_t pad = 0;
  while (pad < 2 && length > 0 && text[length - 1] == '=') {
    --length;
    ++pad;
  }
  std::vector<std::uint8_t> bytes;
  std::uint32_t group = 0;
  unsigned bits = 0;
  bool valid = text.size() % 4 == 0;
  for (std::size_t i = 0; i < length && valid; ++i) {
    const std::size_t digit = kDigits.find(text[i]);
    valid = digit != std::string_view::npos;
    group = (group << 6U) | static_cast<std::uint32_t>(digit & 63U);
    bits += 6;
    if (bits < 8) continue;
    bits -= 8;
    bytes.push_back(static_cast<std::uint8_t>((group >> bits) & 0xFFU));
  }
  if (!valid) throw DriveException(kBadArgument, "not Base64 text");
  return bytes;
}

}  // namespace kx
