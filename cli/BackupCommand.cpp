#include "cli/BackupCommand.h"

#include <CLI/CLI.hpp>
#include <atomic>
#include <csignal>
#include <memory>

#include "cli/BackupProgressDisplay.h"
#include "cli/JsonOutput.h"
#include "cli/Paths.h"
#include "cli/Progress.h"
#include "daemon/BackupRunner.h"
#include "daemon/SignalCancel.h"
#include "daemon/SyncJson.h"
#include "device/SystemClock.h"

namespace kx::cli {

namespace {

constexpr const char* kExamples =
    "Examples:\n"
    "  kxsync backup ./device ./backup                  take a backup, or bring one up to date\n"
    "  kxsync backup ./device ./backup --with-library   the library's database too\n"
    "  kxsync backup --verify ./backup                  compare every file with the manifest\n"
    "\n"
    "A file is copied when its size or its time has changed. A backup that is cut off leaves the\n"
    "one before as it was, and the same command goes on from there.\n"
    "\n"
    "Exit codes: 0 all done, 1 failed, 2 wrong usage, 3 some files are missing in the backup or\n"
    "damaged, 4 stopped by the guard, 6 no space left on the backup's disk, 7 another run holds "
    "the\n"
    "device or the backup, 130 or 143 ended by a signal.";

constexpr std::size_t kProblemsShown = 20;
constexpr int kSignalExitBase = 128;

struct BackupArguments {
  std::string device, backup, verify;
  bool withLibrary = false;
  bool allowDeletes = false;
};

using Json = nlohmann::ordered_json;

Json problemsJson(const std::vector<BackupProblem>& problems) {
  Json json = Json::array();
  for (const BackupProblem& problem : problems) {
    json.push_back({{"path", problem.path}, {"reason", problem.reason}});
  }
  return json;
}

std::uint64_t bytesOf(const BackupManifest& manifest) {
  std::uint64_t bytes = 0;
  for (const BackupFile& file : manifest.files) bytes += static_cast<std::uint64_t>(file.size);
  return bytes;
}

Json identityOf(const BackupManifest& manifest) {
  return manifest.identity.empty() ? Json() : Json(manifest.identity);
}

Json resultJson(const BackupResult& result, double seconds) {
  return {{"identity", identityOf(result.manifest)},
          {"files", result.manifest.files.size()},
          {"bytes", bytesOf(result.manifest)},
          {"copiedFiles", result.copiedFiles},
          {"copiedBytes", result.copiedBytes},
          {"removedFiles", result.removedFiles},
          {"albums", result.albums},
          {"library", result.manifest.library.has_value()},
          {"failed", problemsJson(result.failures)},
          {"leftOut", problemsJson(result.leftOut)},
          {"seconds", seconds},
          {"error", errorJson(result.error)}};
}

Json checkJson(const BackupCheck& check, double seconds) {
  const BackupManifest& manifest = check.manifest;
  const bool known = !manifest.identity.empty();
  return {{"identity", identityOf(manifest)},
          {"takenAt", known ? Json(manifest.takenAt.secondsSinceReference) : Json()},
          {"files", manifest.files.size()},
          {"bytes", bytesOf(manifest)},
          {"library", manifest.library.has_value()},
          {"damaged", problemsJson(check.damaged)},
          {"seconds", seconds},
          {"error", errorJson(check.error)}};
}

// Each on a line of its own, all of them: they are what the user has to see to.
void nameProblems(Context& context, const char* what, const std::vector<BackupProblem>& problems,
                  bool all) {
  std::size_t shown = 0;
  for (const BackupProblem& problem : problems) {
    if (!all && shown == kProblemsShown) break;
    context.console.warning(std::string(what) + problem.path + ": " + problem.reason);
    ++shown;
  }
  if (shown < problems.size()) {
    context.console.warning("... and " + groupedNumber(problems.size() - shown) +
                            " more like these (--json lists all)");
  }
}

void summarize(Context& context, const BackupResult& result, double seconds) {
  const auto n = [](std::size_t number) { return groupedNumber(number); };
  const std::string how = result.failures.empty() ? "Backed up" : "Backed up in part";
  context.console.result(how + " in " + readableDuration(seconds) + ".");
  context.console.result("Files       " + n(result.manifest.files.size()) + " (" +
                         readableBytes(bytesOf(result.manifest)) + "), " + n(result.copiedFiles) +
                         " copied (" + readableBytes(result.copiedBytes) + "), " +
                         n(result.removedFiles) + " gone");
  context.console.result("Albums      " + n(result.albums) + " of the device's own");
  context.console.result(std::string("Library     ") +
                         (result.manifest.library ? "in it" : "not in it (--with-library)"));
}

void summarize(Context& context, const BackupCheck& check, double seconds) {
  const std::string files = groupedNumber(check.manifest.files.size()) + " files, " +
                            readableBytes(bytesOf(check.manifest)) + ", taken " +
                            check.manifest.takenAt.description();
  if (check.damaged.empty()) {
    context.console.result("The backup is whole: " + files + " (verified in " +
                           readableDuration(seconds) + ").");
  } else {
    context.console.result(groupedNumber(check.damaged.size()) +
                           " damaged in the backup: " + files + ".");
    context.console.hint(
        "Remove what is damaged from the backup; the next backup copies it anew from the device.");
  }
}

// Runs a body that can be ended by a signal and tells of its end, once: a body that hangs after a
// signal is ended with the process, on another thread.
class Ending {
 public:
  Ending(Context& context, CancelToken& cancel)
      : context_(context), signals_(cancel, [this](int signal) {
          if (ended_.exchange(true)) return;
          const ErrorPtr error =
              Error::make(kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kCancelled),
                          "ended by a signal; the same command goes on from here");
          reportFailure(context_, error, kSignalExitBase + signal);
          context_.console.finish();
        }) {
    std::signal(SIGPIPE, SIG_IGN);
  }
  // Whether the caller is to tell.
  bool tells() { return !ended_.exchange(true); }

 private:
  Context& context_;
  std::atomic<bool> ended_{false};
  SignalCancel signals_;
};

int runBackup(Context& context, const BackupArguments& arguments) {
  refuseNesting({"DEVICE", arguments.device}, {"BACKUP", arguments.backup});
  CancelToken cancel;
  Ending ending(context, cancel);
  SystemClock clock;
  const double start = clock.absoluteTime();
  BackupProgressDisplay display(context.console, clock);
  BackupOptions options;
  options.deviceRoot = arguments.device;
  options.backupPath = arguments.backup;
  options.withLibrary = arguments.withLibrary;
  options.allowLosses = arguments.allowDeletes;
  const BackupResult result = backUpDevice(
      options, logSinksFor(context.options, context.console),
      [&](const BackupProgress& state) {
        if (!context.options.quiet) display.show(state);
        return true;
      },
      cancel);
  const double seconds = clock.absoluteTime() - start;
  const int exitCode = exitCodeForBackup(result.error, !result.failures.empty(), cancel);
  if (!ending.tells()) return exitCode;
  context.console.endProgress();
  nameProblems(context, "left out: ", result.leftOut, false);
  nameProblems(context, "not backed up: ", result.failures, true);
  if (context.options.json) {
    context.console.raw(jsonLine(resultJson(result, seconds)));
  } else if (!result.error && !context.options.quiet) {
    summarize(context, result, seconds);
  }
  if (result.error) context.console.error(errorText(result.error));
  return exitCode;
}

int runVerify(Context& context, const std::string& backup) {
  CancelToken cancel;
  Ending ending(context, cancel);
  SystemClock clock;
  const double start = clock.absoluteTime();
  BackupProgressDisplay display(context.console, clock);
  const BackupCheck check = verifyBackup(backup, [&](const BackupProgress& state) {
    if (!context.options.quiet) display.show(state);
    return !cancel.isCancelled();
  });
  const double seconds = clock.absoluteTime() - start;
  const int exitCode = exitCodeForBackup(check.error, !check.damaged.empty(), cancel);
  if (!ending.tells()) return exitCode;
  context.console.endProgress();
  nameProblems(context, "damaged: ", check.damaged, true);
  if (context.options.json) {
    context.console.raw(jsonLine(checkJson(check, seconds)));
  } else if (!check.error && !context.options.quiet) {
    summarize(context, check, seconds);
  }
  if (check.error) context.console.error(errorText(check.error));
  return exitCode;
}

int run(Context& context, const BackupArguments& arguments) {
  const bool both = !arguments.device.empty() && !arguments.backup.empty();
  if (!arguments.verify.empty()) {
    if (!arguments.device.empty() || arguments.withLibrary || arguments.allowDeletes) {
      throw UsageError("--verify BACKUP stands alone: it takes no DEVICE and no other option");
    }
    return runVerify(context, arguments.verify);
  }
  if (!both) throw UsageError("DEVICE and BACKUP are needed, or --verify BACKUP");
  return runBackup(context, arguments);
}

}  // namespace

void addBackupCommand(CLI::App& app, Action& chosen) {
  auto arguments = std::make_shared<BackupArguments>();
  CLI::App* command = app.add_subcommand("backup", "Take a backup of a device, or verify one");
  command->add_option("DEVICE", arguments->device, "The directory of the device")
      ->type_name("PATH");
  command
      ->add_option("BACKUP", arguments->backup,
                   "The directory of the backup: missing, empty, or a backup to bring up to date")
      ->type_name("PATH");
  command->add_option("--verify", arguments->verify, "Compare a backup with its manifest, instead")
      ->type_name("BACKUP");
  command->add_flag("--with-library", arguments->withLibrary,
                    "Take the library's database too: albums and dates come back as they are");
  command->add_flag("--allow-deletes", arguments->allowDeletes,
                    "Let this backup lose most of the files of the old one");
  command->footer(kExamples);
  command->callback([arguments, &chosen] {
    chosen = [arguments](Context& context) { return run(context, *arguments); };
  });
}

}  // namespace kx::cli
