#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>

#include "cli/Console.h"
#include "platform/foundation/Error.h"
#include "platform/sync/FRLog.h"

namespace CLI {
class App;
}

namespace kx::cli {

// The domain of errors that the program itself finds: code 1 for a failure, 2 for wrong usage.
inline constexpr const char* kCliErrorDomain = "com.veltro.kxsync";

struct CommonOptions {
  bool json = false;
  bool quiet = false;
  bool noColor = false;
  std::optional<LogLevel> logLevel;  // absent: no log lines at all
};

// What a command needs: the common options and the streams. Lives while the command runs.
struct Context {
  std::string command;  // "sync"
  CommonOptions options;
  Console& console;
};

// A command that was chosen and parsed: runs it and gives the exit code.
using Action = std::function<int(Context&)>;

// Wrong usage that only shows once the arguments are looked at together.
class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Each adds its command below `app`; when it was chosen, parsing stores its action.
void addSyncCommand(CLI::App& app, Action& chosen);
void addPlanCommand(CLI::App& app, Action& chosen);
void addStatusCommand(CLI::App& app, Action& chosen);
void addDumpCommand(CLI::App& app, Action& chosen);
void addShowCommand(CLI::App& app, Action& chosen);
void addSnapshotCommand(CLI::App& app, Action& chosen);
void addRestoreCommand(CLI::App& app, Action& chosen);

// Options of every command, kept until parsing is done.
void addCommonOptions(CLI::App& command, CommonOptions& options);

// The sinks for the log lines that the user asked for; all null when none were asked for.
LogSinks logSinksFor(const CommonOptions& options, Console& console);

// Tells of a failure: {"error": ...} on standard output with --json, one line otherwise. Gives
// `exitCode` back.
int reportFailure(Context& context, const ErrorPtr& error, int exitCode);
// One clear line about an error, without a line break.
std::string errorText(const ErrorPtr& error);

}  // namespace kx::cli
