#include "cli/Command.h"

#include <utility>

#include "cli/JsonOutput.h"
#include "daemon/ConsoleLogs.h"

namespace kx::cli {

namespace {

// Takes the progress line away before a log line is written over it.
class LogBesideProgress : public FRLog {
 public:
  LogBesideProgress(std::shared_ptr<FRLog> log, Console& console)
      : log_(std::move(log)), console_(console) {}
  bool takes(LogLevel level) override { return log_->takes(level); }
  void write(const LogSite& site, LogLevel level, std::string_view message) override {
    console_.endProgress();
    log_->write(site, level, message);
  }

 private:
  std::shared_ptr<FRLog> log_;
  Console& console_;
};

}  // namespace

LogSinks logSinksFor(const CommonOptions& options, Console& console) {
  LogSinks sinks = consoleLogs(options.logLevel);
  if (sinks.sync) sinks.sync = std::make_shared<LogBesideProgress>(sinks.sync, console);
  return sinks;
}

std::string errorText(const ErrorPtr& error) {
  if (!error) return "failed for an unknown reason";
  const std::string message = error->message();
  return message.empty() ? error->description() : message;
}

int reportFailure(Context& context, const ErrorPtr& error, int exitCode) {
  if (context.options.json) context.console.raw(failureJson(context.command, error));
  context.console.error(errorText(error));
  return exitCode;
}

}  // namespace kx::cli
