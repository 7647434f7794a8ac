#include "backup/BackupErrors.h"

#include <cerrno>
#include <system_error>

#include "platform/foundation/Text.h"

namespace kx {

ErrorPtr backupError(BackupError code, const std::string& message) {
  constexpr std::size_t kShownBytes = 600;
  std::string text = escapeControlCharacters(message.substr(0, kShownBytes));
  if (message.size() > kShownBytes) text += "...";
  return Error::make(kBackupErrorDomain, static_cast<std::int64_t>(code), text);
}

ErrorPtr backupSystemError(const std::string& what, const std::string& object, int errorNumber) {
  const bool full = errorNumber == ENOSPC || errorNumber == EDQUOT;
  const std::string text = std::error_code(errorNumber, std::generic_category()).message();
  Dictionary info;
  info.set(kErrorMessageKey,
           Value::string(escapeControlCharacters(what + " " + object + ": " + text)));
  info.set("errno", Value::integer(errorNumber));
  return std::make_shared<const Error>(
      kBackupErrorDomain,
      static_cast<std::int64_t>(full ? BackupError::kNoSpace : BackupError::kIo),
      Value::dictionary(std::move(info)));
}

}  // namespace kx
