#include <CLI/CLI.hpp>
#include <atomic>
#include <csignal>
#include <memory>

#include "backup/BackupReader.h"
#include "cli/Command.h"
#include "cli/JsonOutput.h"
#include "cli/Paths.h"
#include "cli/Progress.h"
#include "daemon/BackupRunner.h"
#include "daemon/RestoreJson.h"
#include "daemon/RestoreRunner.h"
#include "daemon/RunErrors.h"
#include "daemon/SignalCancel.h"
#include "device/SystemClock.h"

namespace kx::cli {

namespace {

constexpr const char* kExamples =
    "Examples:\n"
    "  kxsync restore ./backup ./device            bring back what `kxsync backup` took\n"
    "  kxsync restore ./backup ./device --json     the result for a script\n"
    "\n"
    "What the device has stays: no file of it is ever replaced. A restore that was cut off is "
    "gone\n"
    "on with by the same command. Synced photos come back with the next `kxsync sync`.\n"
    "\n"
    "Exit codes: 0 all done, 1 failed, 2 wrong usage, 3 some files could not be restored, 6 no "
    "space\n"
    "left on the device, 7 another run holds the device or the backup, 130 or 143 ended by a "
    "signal\n"
    "(the same command goes on from there).";

constexpr std::size_t kFailuresShown = 10;

struct RestoreArguments {
  std::string backup;
  std::string device;
};

// Tells of a restore's end, once: what ends it is either the run itself or, when the run hangs
// after a signal, the process's end on another thread.
class RestoreReport {
 public:
  explicit RestoreReport(Context& context) : context_(context) {}

  int end(const RestoreResult& result) {
    if (ended_.exchange(true)) return result.exitCode;
    nameFailures(result);
    if (context_.options.json) {
      context_.console.raw(jsonLine(restoreResultJson(result)));
    } else if (!context_.options.quiet) {
      summarize(result);
    }
    if (result.error) context_.console.error(errorText(result.error));
    return result.exitCode;
  }

  // On the thread that watches for signals, just before the process ends.
  void endForced(int signal) {
    RestoreResult result;
    result.outcome = RestoreOutcome::kStopped;
    result.error = interruptedError(signal);
    result.exitCode = 128 + signal;
    end(result);
    context_.console.finish();
  }

 private:
  // All of them when they are what went wrong.
  void nameFailures(const RestoreResult& result) {
    std::size_t left = result.failed.size();
    std::size_t shown = result.outcome == RestoreOutcome::kPartial ? left : kFailuresShown;
    for (const RestoreFailure& failure : result.failed) {
      if (shown-- == 0) break;
      context_.console.warning("not restored: " + failure.path + ": " + failure.reason);
      --left;
    }
    if (left > 0) {
      context_.console.warning("... and " + groupedNumber(left) +
                               " more that were not restored (--json lists all)");
    }
  }

  void summarize(const RestoreResult& result) {
    if (result.outcome == RestoreOutcome::kNothing) {
      context_.console.result("Nothing to do: the device has all that the backup holds.");
      return;
    }
    if (result.outcome != RestoreOutcome::kRestored && result.outcome != RestoreOutcome::kPartial) {
      return;
    }
    const auto n = [](std::size_t number) { return groupedNumber(number); };
    const std::string how =
        result.outcome == RestoreOutcome::kRestored ? "Restored" : "Restored in part";
    context_.console.result(how + " in " + readableDuration(result.seconds) + ".");
    context_.console.result("Files       " + n(result.restored) + " brought, " + n(result.present) +
                            " there already");
    context_.console.result("Library     " + libraryText(result));
  }

  std::string libraryText(const RestoreResult& result) const {
    const auto counted = [](std::size_t number, const char* what) {
      return groupedNumber(number) + " " + what + (number == 1 ? "" : "s");
    };
    const std::string added = counted(result.registered, "photo") + " added, " +
                              counted(result.albumsCreated, "album") + " created";
    switch (result.library) {
      case RestoreLibrary::kBroughtBack:
        return "brought back from the backup";
      case RestoreLibrary::kKept:
        return "the device's own is kept; " + added;
      case RestoreLibrary::kNone:
      case RestoreLibrary::kDamaged:
        break;
    }
    return added;
  }

  Context& context_;
  std::atomic<bool> ended_{false};
};

int runRestore(Context& context, const RestoreArguments& arguments) {
  refuseNesting({"BACKUP", arguments.backup}, {"DEVICE", arguments.device});
  // A reader of our output that goes away must not end a restore half way.
  std::signal(SIGPIPE, SIG_IGN);
  CancelToken cancel;
  RestoreReport report(context);
  SignalCancel signals(cancel, [&report](int signal) { report.endForced(signal); });

  RestoreResult result;
  const auto backup = BackupReader::open(arguments.backup, &result.error);
  if (!backup) {
    result.exitCode = exitCodeForBackup(result.error, false, cancel);
    return report.end(result);
  }
  RestoreOptions options;
  options.deviceRoot = arguments.device;
  SystemClock clock;
  ProgressDisplay display(context.console, clock);
  const auto onProgress = [&context, &display](const SyncProgress& progress) {
    if (!context.options.quiet) display.show(progress);
  };
  result = restoreDevice(*backup, options, logSinksFor(context.options, context.console),
                         onProgress, cancel);
  return report.end(result);
}

}  // namespace

void addRestoreCommand(CLI::App& app, Action& chosen) {
  auto arguments = std::make_shared<RestoreArguments>();
  CLI::App* command = app.add_subcommand("restore", "Bring a backup back onto a device");
  command->add_option("BACKUP", arguments->backup, "A directory that `kxsync backup` made")
      ->required()
      ->type_name("PATH");
  command->add_option("DEVICE", arguments->device, "The directory of the device; made when missing")
      ->required()
      ->type_name("PATH");
  command->footer(kExamples);
  command->callback([arguments, &chosen] {
    chosen = [arguments](Context& context) { return runRestore(context, *arguments); };
  });
}

}  // namespace kx::cli
