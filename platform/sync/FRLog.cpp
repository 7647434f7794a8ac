#include "platform/sync/FRLog.h"

#include <algorithm>
#include <cstdio>
#include <mutex>

#include "platform/foundation/Limits.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

struct SinkHolder {
  std::mutex mutex;
  LogSinks sinks;
};

SinkHolder& holder() {
  static SinkHolder instance;
  return instance;
}

void appendHexEscape(std::string& out, char c) {
  char buffer[8];
  std::snprintf(buffer, sizeof buffer, "\\x%02x",
                static_cast<unsigned>(static_cast<unsigned char>(c)));
  out += buffer;
}

// Escapes what could steer a terminal, and cuts at the limit without splitting a character or an
// escape.
std::string finished(std::string_view text) {
  std::string out;
  out.reserve(std::min<std::size_t>(text.size(), limits::kLogLineBytes));
  std::size_t whole = 0;  // length of `out` up to its last whole character
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if ((byte & 0xC0U) != 0x80U) whole = out.size();
    if ((byte < 0x20 && c != '\n') || byte == 0x7F) {
      appendHexEscape(out, c);
    } else {
      out += c;
    }
    if (out.size() > limits::kLogLineBytes) {
      out.resize(whole);
      break;
    }
  }
  return out;
}

bool syncTakes(const LogSinks& sinks, LogLevel level) {
  return sinks.sync && sinks.sync->takes(level);
}

bool libraryTakes(const LogSinks& sinks, LogLevel level) {
  return sinks.library && sinks.library->isEnabled(level);
}

}  // namespace

void setLogSinks(LogSinks sinks) {
  SinkHolder& held = holder();
  std::lock_guard<std::mutex> lock(held.mutex);
  std::swap(held.sinks, sinks);
}

LogSinks logSinks() {
  SinkHolder& held = holder();
  std::lock_guard<std::mutex> lock(held.mutex);
  return held.sinks;
}

bool logTakes(LogLevel level) {
  const LogSinks sinks = logSinks();
  return syncTakes(sinks, level) || libraryTakes(sinks, level);
}

LogArgument::LogArgument(int value) : text_(std::to_string(value)) {}
LogArgument::LogArgument(long value) : text_(std::to_string(value)) {}
LogArgument::LogArgument(long long value) : text_(std::to_string(value)) {}
LogArgument::LogArgument(unsigned value) : text_(std::to_string(value)) {}
LogArgument::LogArgument(unsigned long value) : text_(std::to_string(value)) {}
LogArgument::LogArgument(unsigned long long value) : text_(std::to_string(value)) {}
LogArgument::LogArgument(double value) : text_(std::to_string(value)) {}
LogArgument::LogArgument(const char* text) : text_(text != nullptr ? text : "(null)") {}
LogArgument::LogArgument(std::string_view text) : text_(text) {}
LogArgument::LogArgument(const std::string& text) : text_(text) {}
LogArgument::LogArgument(OptionalString text) : text_(describe(text)) {}
LogArgument::LogArgument(const std::optional<std::string>& text) : text_(text ? *text : "(null)") {}
LogArgument::LogArgument(const std::optional<Number>& number)
    : text_(number ? number->description() : "(null)") {}
LogArgument::LogArgument(const Value& value) : text_(value.description()) {}
LogArgument::LogArgument(const ErrorPtr& error) : text_(error ? error->description() : "(null)") {}
LogArgument::LogArgument(Renderer renderer) : renderer_(std::move(renderer)) {}
LogArgument::LogArgument(const void* pointer) {
  char buffer[32];
  std::snprintf(buffer, sizeof buffer, "%p", pointer);
  text_ = buffer;
}

void LogArgument::render(std::string& out, std::size_t limit) const {
  if (renderer_) {
    renderer_(out, limit);
  } else {
    out += text_;
  }
}

std::string formatMessage(const char* format, std::initializer_list<LogArgument> arguments) {
  std::string out;
  const LogArgument* next = arguments.begin();
  for (const char* p = format; *p != '\0'; ++p) {
    if (*p != '%') {
      out += *p;
      continue;
    }
    ++p;
    if (*p == '%') {
      out += '%';
      continue;
    }
    if (*p == 'l') ++p;
    if (next != arguments.end()) {
      next->render(out, limits::kLogLineBytes);
      ++next;
    }
    if (*p == '\0') break;
  }
  return out;
}

void writeLog(const LogSite& site, LogLevel level, const char* format,
              std::initializer_list<LogArgument> arguments) {
  const LogSinks sinks = logSinks();
  const bool toSync = syncTakes(sinks, level);
  const bool toLibrary = libraryTakes(sinks, level);
  if (!toSync && !toLibrary) return;
  const std::string message = finished(formatMessage(format, arguments));
  if (toSync) sinks.sync->write(site, level, message);
  if (toLibrary) sinks.library->write(level, message);
}

void writeSyncLog(const LogSite& site, LogLevel level, const char* format,
                  std::initializer_list<LogArgument> arguments) {
  const LogSinks sinks = logSinks();
  if (syncTakes(sinks, level))
    sinks.sync->write(site, level, finished(formatMessage(format, arguments)));
}

void writeStandardLog(const char* format, std::initializer_list<LogArgument> arguments) {
  const LogSinks sinks = logSinks();
  if (sinks.standard) sinks.standard->write(finished(formatMessage(format, arguments)));
}

}  // namespace kx
