#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "platform/foundation/Error.h"
#include "platform/foundation/Number.h"
#include "platform/foundation/Value.h"

namespace kx {

enum class LogLevel : int { kError = 3, kWarning = 4, kInfo = 6, kDebug = 7 };

inline constexpr const char* kBundleIdentifier = "com.veltro.kxsyncbundle";
inline constexpr const char* kLogFacility = "com.veltro.ferrule";

// Where a message comes from. The texts are literals. `facility` is the plug-in's bundle identifier
// unless the message says otherwise.
struct LogSite {
  const char* sourceFile;  // "KXSyncClient", without extension
  const char* function;    // the C++ name, without class or arguments
  int line = 0;
  const char* facility = kBundleIdentifier;
};

// The sync framework's log. Called from any thread; must not call back into the plug-in.
class FRLog {
 public:
  virtual ~FRLog() = default;
  virtual bool takes(LogLevel level) = 0;
  virtual void write(const LogSite& site, LogLevel level, std::string_view message) = 0;
};

// The photo library's log, written besides FRLog when it is enabled for the level. Any thread.
class KXLibraryLog {
 public:
  virtual ~KXLibraryLog() = default;
  virtual bool isEnabled(LogLevel level) = 0;
  virtual void write(LogLevel level, std::string_view message) = 0;
};

// The process's standard log. Any thread.
class StandardLog {
 public:
  virtual ~StandardLog() = default;
  virtual void write(std::string_view message) = 0;
};

// Sinks may be null. They are shared, so that a late message never meets a sink that is gone.
struct LogSinks {
  std::shared_ptr<FRLog> sync;
  std::shared_ptr<KXLibraryLog> library;
  std::shared_ptr<StandardLog> standard;
};

// One set of sinks per loaded copy of this code: a plug-in module has its own. Any thread.
void setLogSinks(LogSinks sinks);
LogSinks logSinks();
bool logTakes(LogLevel level);

// One argument of a message. Text and lists are rendered only if the message is written.
class LogArgument {
 public:
  // Appends to `out`, may stop as soon as out is longer than `limit` bytes.
  using Renderer = std::function<void(std::string& out, std::size_t limit)>;

  LogArgument(int value);                               // NOLINT: arguments convert by design
  LogArgument(long value);                              // NOLINT
  LogArgument(long long value);                         // NOLINT
  LogArgument(unsigned value);                          // NOLINT
  LogArgument(unsigned long value);                     // NOLINT
  LogArgument(unsigned long long value);                // NOLINT
  LogArgument(double value);                            // NOLINT
  LogArgument(const char* text);                        // NOLINT: null prints as (null)
  LogArgument(std::string_view text);                   // NOLINT
  LogArgument(const std::string& text);                 // NOLINT
  LogArgument(OptionalString text);                     // NOLINT
  LogArgument(const std::optional<std::string>& text);  // NOLINT
  LogArgument(const std::optional<Number>& number);     // NOLINT
  LogArgument(const Value& value);                      // NOLINT
  LogArgument(const ErrorPtr& error);                   // NOLINT
  LogArgument(Renderer renderer);                       // NOLINT
  LogArgument(const void* pointer);                     // NOLINT: for %p
  // Any object with description(); a null pointer prints as (null). The object is rendered with the
  // message.
  template <typename T>
  LogArgument(const std::shared_ptr<T>& object)  // NOLINT
      : LogArgument(Renderer([&object](std::string& out, std::size_t) {
          out += object ? object->description() : std::string("(null)");
        })) {}

  void render(std::string& out, std::size_t limit) const;

 private:
  std::string text_;
  Renderer renderer_;
};

// Renders a list of objects as "(\n    a,\n    b\n)", stopping at the limit.
template <typename Range>
LogArgument::Renderer describeList(const Range& range) {
  return [&range](std::string& out, std::size_t limit) {
    out += "(";
    bool first = true;
    for (const auto& element : range) {
      if (out.size() > limit) return;
      out += first ? "\n    " : ",\n    ";
      first = false;
      LogArgument(element).render(out, limit);
    }
    out += first ? ")" : "\n)";
  };
}

// Formats `format` (placeholders %@ %d %u %lu %f %s %p, each takes the next argument, whatever its
// type; %f prints six decimals) and writes it to the sync log and, where enabled, the library's.
// The message is cut at limits::kLogLineBytes; control bytes other than line breaks are escaped.
void writeLog(const LogSite& site, LogLevel level, const char* format,
              std::initializer_list<LogArgument> arguments);
// To the sync log alone, whatever the library's log takes.
void writeSyncLog(const LogSite& site, LogLevel level, const char* format,
                  std::initializer_list<LogArgument> arguments);
std::string formatMessage(const char* format, std::initializer_list<LogArgument> arguments);
// To the process's standard log alone.
void writeStandardLog(const char* format, std::initializer_list<LogArgument> arguments);

}  // namespace kx

// Arguments are evaluated and formatted only when a sink takes the level.
#define KX_LOG(source, function, level, format, ...)                                           \
  do {                                                                                         \
    if (::kx::logTakes(level)) {                                                               \
      ::kx::writeLog(::kx::LogSite{source, function, __LINE__}, level, format, {__VA_ARGS__}); \
    }                                                                                          \
  } while (false)
