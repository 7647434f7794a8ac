#include <CLI/CLI.hpp>
#include <atomic>
#include <csignal>
#include <memory>
#include <unordered_map>

#include "cli/Command.h"
#include "cli/HostOpening.h"
#include "cli/JsonOutput.h"
#include "cli/LibraryLink.h"
#include "cli/Paths.h"
#include "cli/PlanCommand.h"
#include "cli/Progress.h"
#include "daemon/SignalCancel.h"
#include "daemon/SyncJson.h"
#include "device/SystemClock.h"

namespace kx::cli {

namespace {

constexpr const char* kSyncExamples =
    "Examples:\n"
    "  kxsync sync ~/Pictures ./device                  a folder of photos\n"
    "  kxsync sync ./bundle ./device --json             a host bundle, the result for a script\n"
    "  kxsync sync ~/Few ./device --allow-deletes       also when most photos go away by it\n"
    "  kxsync sync ~/Pictures ./device --dry-run        say what it would do, and change nothing\n"
    "\n"
    "Exit codes: 0 all done, 1 failed, 2 wrong usage, 3 some assets did not make it, 4 stopped by\n"
    "the guard, 6 no space left on the device, 7 another run holds the device, 130 or 143 ended "
    "by\n"
    "a signal (the same command goes on from there).";

constexpr std::size_t kFailuresShown = 10;

bool changedNothing(const SyncResult& result) {
  return result.outcome == SyncOutcome::kSynced && result.requested == 0 &&
         result.deletedAssets == 0 && result.updatedAssets == 0 && result.albumsCreated == 0 &&
         result.albumsDeleted == 0 && result.albumsRenamed == 0;
}

// Tells of a sync's end, once: what ends it is either the run itself or, when the run hangs after a
// signal, the process's end on another thread.
class SyncReport {
 public:
  explicit SyncReport(Context& context) : context_(context) {}

  int end(const SyncResult& result, const std::vector<HostProblem>& problems) {
    if (ended_.exchange(true)) return result.exitCode;
    reportHostProblems(context_, problems);
    nameFailures(result);
    if (context_.options.json) {
      nlohmann::ordered_json json = syncResultJson(result);
      json["hostProblems"] = hostProblemsJson(problems);
      context_.console.raw(jsonLine(json));
    } else if (!context_.options.quiet) {
      summarize(result);
    }
    if (result.error) context_.console.error(errorText(result.error));
    return result.exitCode;
  }

  // On the thread that watches for signals, just before the process ends.
  void endForced(int signal) {
    SyncResult result;
    result.outcome = SyncOutcome::kStopped;
    result.error =
        Error::make(kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kCancelled),
                    "ended by a signal; the same command goes on from here");
    result.exitCode = 128 + signal;
    end(result, {});
    context_.console.finish();
  }

 private:
  // All of them when they are what went wrong; a run that ended early left most of its files.
  void nameFailures(const SyncResult& result) {
    std::size_t left = result.failed.size();
    std::size_t shown = result.outcome == SyncOutcome::kPartial ? left : kFailuresShown;
    for (const SyncFailure& failure : result.failed) {
      if (shown-- == 0) break;
      context_.console.warning("not synced: " + failure.uuid + ": " + failure.reason);
      --left;
    }
    if (left > 0) {
      context_.console.warning("... and " + groupedNumber(left) +
                               " more that were not synced (--json lists all)");
    }
  }

  void summarize(const SyncResult& result) {
    if (result.outcome == SyncOutcome::kNull || changedNothing(result)) {
      context_.console.result("Nothing to do: the device is in line with the host.");
      return;
    }
    if (result.outcome != SyncOutcome::kSynced && result.outcome != SyncOutcome::kPartial) return;
    const auto n = [](std::size_t number) { return groupedNumber(number); };
    const std::string how = result.outcome == SyncOutcome::kSynced ? "Synced" : "Synced in part";
    context_.console.result(how + " in " + readableDuration(result.seconds) + ".");
    context_.console.result("Assets      " + n(result.imported) + " of " + n(result.requested) +
                            " imported, " + n(result.updatedAssets) + " updated, " +
                            n(result.deletedAssets) + " deleted");
    context_.console.result("Containers  " + n(result.albumsCreated) + " created, " +
                            n(result.albumsRenamed) + " renamed, " + n(result.albumsDeleted) +
                            " deleted");
  }

  Context& context_;
  std::atomic<bool> ended_{false};
};

SyncResult hostFailure(const ErrorPtr& error, const CancelToken& cancel) {
  SyncResult result;
  result.outcome = cancel.isCancelled() ? SyncOutcome::kStopped : SyncOutcome::kFailed;
  result.error = error;
  result.exitCode = exitCodeForHostError(error, cancel);
  return result;
}

int runSync(Context& context, const SyncArguments& arguments) {
  refuseNesting({"HOST", arguments.host}, {"DEVICE", arguments.device});
  // A reader of our output that goes away must not end a sync half way.
  std::signal(SIGPIPE, SIG_IGN);
  CancelToken cancel;
  SyncReport report(context);
  SignalCancel signals(cancel, [&report](int signal) { report.endForced(signal); });

  HostOptions options = hostOptions(context, arguments.reading, cancel);
  options.previousSnapshot = [&arguments] { return previousSnapshotOf(arguments.device); };
  ErrorPtr error;
  const auto library = openHost(arguments.host, options, &error);
  if (!library) return report.end(hostFailure(error, cancel), {});

  LibraryLink link(*library);
  SyncOptions syncOptions;
  syncOptions.deviceRoot = arguments.device;
  syncOptions.allowDeletes = arguments.allowDeletes;
  syncOptions.notice = [&context](const std::string& text) { context.console.warning(text); };
  SystemClock clock;
  ProgressDisplay display(context.console, clock);
  const auto onProgress = [&context, &display](const SyncProgress& progress) {
    if (!context.options.quiet) display.show(progress);
  };
  const SyncResult result = syncDevice(
      link, syncOptions, logSinksFor(context.options, context.console), onProgress, cancel);
  return report.end(result, library->problems());
}

}  // namespace

void addSyncCommand(CLI::App& app, Action& chosen) {
  auto arguments = std::make_shared<SyncArguments>();
  CLI::App* command = app.add_subcommand("sync", "Bring a device in line with a host library");
  addSyncArguments(*command, *arguments);
  CLI::Option* dryRun = command->add_flag("--dry-run", arguments->dryRun,
                                          "Say what would be done, and change nothing: as `plan`");
  command->add_flag("--all", arguments->all, "With --dry-run: show every action")->needs(dryRun);
  command->footer(kSyncExamples);
  command->callback([arguments, &chosen] {
    chosen = [arguments](Context& context) {
      return arguments->dryRun ? runPlan(context, *arguments) : runSync(context, *arguments);
    };
  });
}

}  // namespace kx::cli
