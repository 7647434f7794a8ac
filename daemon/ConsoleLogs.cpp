#include "daemon/ConsoleLogs.h"

#include <cstdio>
#include <mutex>
#include <string>

#include "platform/foundation/Text.h"

namespace kx {
namespace {

std::mutex& lineLock() {
  static std::mutex lock;
  return lock;
}

// A line break starts an indented line, so that no text can look like a message of its own.
void writeLine(const std::string& prefix, std::string_view message) {
  std::string line = prefix;
  for (std::size_t begin = 0; begin <= message.size();) {
    const std::size_t end = std::min(message.find('\n', begin), message.size());
    if (begin > 0) line += "    ";
    line += escapeControlCharacters(message.substr(begin, end - begin));
    line += '\n';
    begin = end + 1;
  }
  std::lock_guard<std::mutex> guard(lineLock());
  std::fwrite(line.data(), 1, line.size(), stderr);
}

class ConsoleSyncLog : public FRLog {
 public:
  explicit ConsoleSyncLog(LogLevel level) : level_(level) {}
  bool takes(LogLevel level) override { return level <= level_; }
  void write(const LogSite& site, LogLevel level, std::string_view message) override {
    if (!takes(level)) return;
    writeLine(std::string(logLevelName(level)) + " " + site.sourceFile + " " + site.function + ": ",
              message);
  }

 private:
  LogLevel level_;
};

class ConsoleStandardLog : public StandardLog {
 public:
  void write(std::string_view message) override { writeLine("", message); }
};

}  // namespace

LogSinks consoleLogs(std::optional<LogLevel> level) {
  LogSinks sinks;
  if (!level) return sinks;
  sinks.sync = std::make_shared<ConsoleSyncLog>(*level);
  sinks.standard = std::make_shared<ConsoleStandardLog>();
  return sinks;
}

std::optional<LogLevel> logLevelNamed(std::string_view name) {
  for (const LogLevel level :
       {LogLevel::kError, LogLevel::kWarning, LogLevel::kInfo, LogLevel::kDebug}) {
    if (name == logLevelName(level)) return level;
  }
  return std::nullopt;
}

const char* logLevelName(LogLevel level) {
  switch (level) {
    case LogLevel::kError:
      return "error";
    case LogLevel::kWarning:
      return "warning";
    case LogLevel::kInfo:
      return "info";
    case LogLevel::kDebug:
      break;
  }
  return "debug";
}

}  // namespace kx
