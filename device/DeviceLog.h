#pragma once

#include <string>
#include <utility>

#include "platform/foundation/Error.h"
#include "platform/sync/FRLog.h"

namespace kx {

// The photo library's own log, written by the library and quarryd. Any thread.
class DeviceLog {
 public:
  explicit DeviceLog(LogSinks sinks) : sinks_(std::move(sinks)) {}
  void write(LogLevel level, const std::string& message) const;
  void failure(const std::string& what, const ErrorPtr& error) const;

 private:
  const LogSinks sinks_;
};

}  // namespace kx
