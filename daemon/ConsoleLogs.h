#pragma once

#include <optional>
#include <string_view>

#include "platform/sync/FRLog.h"

namespace kx {

// Log sinks of a program: the sync log goes to standard error from `level` on (nullopt: nowhere), a
// message a line with continuation lines indented and control bytes escaped; the photo library's
// log goes nowhere; the standard log goes to standard error when the sync log goes anywhere. Any
// thread; lines never mix.
LogSinks consoleLogs(std::optional<LogLevel> level);

// "error", "warning", "info", "debug"; nullopt for any other text.
std::optional<LogLevel> logLevelNamed(std::string_view name);
const char* logLevelName(LogLevel level);

}  // namespace kx
