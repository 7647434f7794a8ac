#include "device/DeviceErrors.h"

#include <cerrno>
#include <system_error>

#include "platform/foundation/Text.h"

namespace kx {
namespace {

std::string systemText(int errorNumber) {
  return std::error_code(errorNumber, std::generic_category()).message();
}

// Long enough for any path that may exist, short enough for a log line.
std::string shown(const std::string& object) {
  constexpr std::size_t kShownBytes = 300;
  std::string text = escapeControlCharacters(object.substr(0, kShownBytes));
  if (object.size() > kShownBytes) text += "...";
  return text;
}

}  // namespace

ErrorPtr deviceError(DeviceError code, const std::string& message) {
  return Error::make(kDeviceErrorDomain, static_cast<std::int64_t>(code), shown(message));
}

ErrorPtr systemError(const std::string& what, const std::string& object, int errorNumber) {
  const bool full = errorNumber == ENOSPC || errorNumber == EDQUOT;
  Dictionary info;
  info.set(kErrorMessageKey,
           Value::string(what + " " + shown(object) + ": " + systemText(errorNumber)));
  info.set("errno", Value::integer(errorNumber));
  return std::make_shared<const Error>(
      kDeviceErrorDomain,
      static_cast<std::int64_t>(full ? DeviceError::kNoSpace : DeviceError::kIo),
      Value::dictionary(std::move(info)));
}

ErrorPtr posixError(const std::string& path, int errorNumber) {
  return Error::make(kPosixErrorDomain, errorNumber, shown(path) + ": " + systemText(errorNumber));
}

}  // namespace kx
