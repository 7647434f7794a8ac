#include "cli/PlanCommand.h"

#include <CLI/CLI.hpp>
#include <csignal>
#include <memory>

#include "cli/JsonOutput.h"
#include "cli/LibraryLink.h"
#include "cli/Paths.h"
#include "cli/PlanText.h"
#include "cli/Progress.h"
#include "daemon/SignalCancel.h"
#include "daemon/SyncPlan.h"
#include "device/SystemClock.h"

namespace kx::cli {

namespace {

constexpr const char* kPlanExamples =
    "Examples:\n"
    "  kxsync plan ~/Pictures ./device                  what a sync would do, in 50 lines\n"
    "  kxsync plan ~/Pictures ./device --all            every action\n"
    "  kxsync plan ~/Pictures ./device --quiet          the totals alone\n"
    "  kxsync plan ./bundle ./device --json             all of it, for a script\n"
    "\n"
    "+ new, - gone, * changed, > renamed. `kxsync sync --dry-run` is the same.\n"
    "\n"
    "Exit codes: that of the sync, as far as it can be told: 0 all would be done, 1 it would "
    "fail,\n"
    "3 the host lacks some files, 4 the guard would stop it, 6 the device is too small; 7 a run\n"
    "holds the device just now.";

constexpr std::size_t kLinesShown = 50;
constexpr std::size_t kPlanFailuresShown = 10;

void nameFailures(Context& context, const SyncResult& result, bool all) {
  std::size_t shown = 0;
  for (const SyncFailure& failure : result.failed) {
    if (!all && shown == kPlanFailuresShown) break;
    context.console.warning("would not be synced: " + failure.uuid + ": " + failure.reason);
    ++shown;
  }
  if (shown < result.failed.size()) {
    context.console.warning("... and " + groupedNumber(result.failed.size() - shown) +
                            " more that would not be synced (--all lists them)");
  }
}

void describe(Context& context, const SyncArguments& arguments, const SyncPlan& plan) {
  const auto line = [&context](const std::string& text) { context.console.result(text); };
  const SyncResult& result = plan.result;
  const bool isKnown = result.outcome == SyncOutcome::kNull ||
                       result.outcome == SyncOutcome::kSynced ||
                       result.outcome == SyncOutcome::kPartial || plan.stop;
  if (!isKnown) return;
  if (changesNothing(plan)) {
    line("Nothing to do: the device is in line with the host.");
    return;
  }
  if (!context.options.quiet) describeActions(plan, arguments.all ? 0 : kLinesShown, line);
  describeTotals(plan, line);
}

int reportPlan(Context& context, const SyncArguments& arguments, const SyncPlan& plan,
               const std::vector<HostProblem>& problems) {
  context.console.endProgress();
  reportHostProblems(context, problems);
  nameFailures(context, plan.result, arguments.all);
  if (context.options.json) {
    writePlanJson(plan,
                  hostProblemsJson(problems).dump(-1, ' ', false,
                                                  nlohmann::ordered_json::error_handler_t::replace),
                  [&context](const std::string& text) { context.console.raw(text); });
  } else {
    describe(context, arguments, plan);
  }
  if (plan.result.error) context.console.error(errorText(plan.result.error));
  return plan.result.exitCode;
}

SyncPlan planOfFailure(const ErrorPtr& error, const CancelToken& cancel) {
  SyncPlan plan;
  plan.result.outcome = cancel.isCancelled() ? SyncOutcome::kStopped : SyncOutcome::kFailed;
  plan.result.error = error;
  plan.result.exitCode = exitCodeForHostError(error, cancel);
  return plan;
}

}  // namespace

int runPlan(Context& context, const SyncArguments& arguments) {
  refuseNesting({"HOST", arguments.host}, {"DEVICE", arguments.device});
  CancelToken cancel;
  // Nothing is under way on the device that an end at once could leave half done.
  SignalCancel signals(cancel, [&context](int) {
    context.console.error("ended by a signal; nothing was changed");
    context.console.finish();
  });
  ErrorPtr error;
  HostOptions options = hostOptions(context, arguments.reading, cancel);
  options.previousSnapshot = [&arguments] { return previousSnapshotOf(arguments.device); };
  const auto library = openHost(arguments.host, options, &error);
  if (!library) return reportPlan(context, arguments, planOfFailure(error, cancel), {});

  LibraryLink link(*library);
  SyncOptions syncOptions;
  syncOptions.deviceRoot = arguments.device;
  syncOptions.allowDeletes = arguments.allowDeletes;
  SystemClock clock;
  ProgressDisplay display(context.console, clock);
  const auto onProgress = [&context, &display](const SyncProgress& progress) {
    if (!context.options.quiet) display.show(progress);
  };
  const SyncPlan plan = planSync(link, syncOptions, logSinksFor(context.options, context.console),
                                 onProgress, cancel);
  return reportPlan(context, arguments, plan, library->problems());
}

void addSyncArguments(CLI::App& command, SyncArguments& arguments) {
  command.add_option("HOST", arguments.host, "A folder of photos and videos, or a host bundle")
      ->required()
      ->type_name("PATH");
  command.add_option("DEVICE", arguments.device, "The directory of the device; made when missing")
      ->required()
      ->type_name("PATH");
  command.add_flag("--allow-deletes", arguments.allowDeletes,
                   "Let the sync take away more than half of the synced photos");
  addFolderReadingOptions(command, arguments.reading);
}

void addPlanCommand(CLI::App& app, Action& chosen) {
  auto arguments = std::make_shared<SyncArguments>();
  CLI::App* command = app.add_subcommand("plan", "Say what a sync would do, and change nothing");
  addSyncArguments(*command, *arguments);
  command->get_option("DEVICE")->description(
      "The directory of the device; a missing one stays missing");
  command->add_flag("--all", arguments->all, "Show every action, however many there are");
  command->footer(kPlanExamples);
  command->callback([arguments, &chosen] {
    chosen = [arguments](Context& context) { return runPlan(context, *arguments); };
  });
}

}  // namespace kx::cli
