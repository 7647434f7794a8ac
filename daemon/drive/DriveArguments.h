#pragma once

#include <cstdint>
#include <nlohmann/json.hpp>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/Value.h"

namespace kx {

// What a drive call is answered with as its exception.
class DriveException : public std::runtime_error {
 public:
  DriveException(std::string name, const std::string& reason)
      : std::runtime_error(reason), name_(std::move(name)) {}
  const std::string& name() const { return name_; }

 private:
  std::string name_;
};

inline constexpr const char* kBadLine = "BadLine";
inline constexpr const char* kBadArgument = "BadArgument";
inline constexpr const char* kUnknownCall = "UnknownCall";
inline constexpr const char* kUnknownRequest = "UnknownRequest";

// Typed access to the members of one JSON object. A missing or mistyped one raises DriveException
// kBadArgument that names it. A member that is null counts as absent. The object outlives it.
class DriveArguments {
 public:
  explicit DriveArguments(const nlohmann::ordered_json& object, std::string where = {});

  bool has(const char* key) const;
  std::string string(const char* key) const;
  std::optional<std::string> optionalString(const char* key) const;
  bool boolean(const char* key, bool fallback) const;
  std::int64_t integer(const char* key) const;
  std::int64_t integer(const char* key, std::int64_t fallback) const;
  std::optional<std::int64_t> optionalInteger(const char* key) const;
  double real(const char* key) const;
  std::optional<double> optionalReal(const char* key) const;
  std::vector<std::string> strings(const char* key) const;
  std::optional<std::vector<std::string>> optionalStrings(const char* key) const;
  // Exactly `count` numbers.
  std::optional<std::vector<double>> optionalReals(const char* key, std::size_t count) const;
  // Null where absent; an array or an object where it is there.
  const nlohmann::ordered_json* optionalArray(const char* key) const;
  const nlohmann::ordered_json* optionalObject(const char* key) const;
  const nlohmann::ordered_json& object(const char* key) const;
  // {"domain", "code"}; null where absent.
  ErrorPtr optionalError(const char* key) const;
  // Whether the key is there at all, null included.
  bool names(const char* key) const;
  // A number within the bounds, as that type.
  std::int64_t integerWithin(const char* key, std::int64_t low, std::int64_t high,
                             std::int64_t fallback) const;

  const nlohmann::ordered_json& json() const { return object_; }

 private:
  const nlohmann::ordered_json* find(const char* key) const;
  [[noreturn]] void refuse(const char* key, const char* expected,
                           const nlohmann::ordered_json* found) const;

  const nlohmann::ordered_json& object_;
  std::string where_;
};

// JSON as a property-list value: the other direction of plistJson. Raises DriveException for a null
// inside a container and for nesting beyond limits::kNestingDepth.
Value plistFromJson(const nlohmann::ordered_json& json, std::size_t depth = 0);

// Plain Base64; raises DriveException for any other text.
std::vector<std::uint8_t> bytesFromBase64(const std::string& text);

}  // namespace kx
