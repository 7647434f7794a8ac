#include "device/DeviceLog.h"

#include "platform/foundation/Text.h"

namespace kx {

void DeviceLog::write(LogLevel level, const std::string& message) const {
  if (sinks_.library && sinks_.library->isEnabled(level)) {
    sinks_.library->write(level, escapeControlCharacters(message));
  }
}

void DeviceLog::failure(const std::string& what, const ErrorPtr& error) const {
  write(LogLevel::kError, what + ": " + (error ? error->description() : std::string("(null)")));
}

}  // namespace kx
