#include <CLI/CLI.hpp>
#include <memory>

#include "cli/Command.h"
#include "cli/HostOpening.h"
#include "cli/JsonOutput.h"
#include "cli/Paths.h"
#include "cli/Progress.h"
#include "daemon/SignalCancel.h"

namespace kx::cli {

namespace {

constexpr const char* kSnapshotExamples =
    "Examples:\n"
    "  kxsync snapshot ~/Pictures ./bundle           write a host bundle of a folder\n"
    "  kxsync show ./bundle/PhotoLibrary.plist       look at its snapshot\n"
    "  kxsync sync ./bundle ./device                 sync it";

struct SnapshotArguments {
  std::string folder;
  std::string bundle;
  FolderReading reading;
};

int report(Context& context, const HostLibrary& library, const std::string& bundle,
           const std::vector<HostProblem>& problems) {
  reportHostProblems(context, problems);
  const std::size_t files = library.mediaNames().size();
  if (context.options.json) {
    nlohmann::ordered_json json;
    json["libraryUUID"] = library.libraryUUID();
    json["libraryKind"] = library.libraryKind();
    json["bundle"] = bundle;
    json["files"] = files;
    json["problems"] = hostProblemsJson(problems);
    json["error"] = nullptr;
    context.console.raw(jsonLine(json));
  } else if (!context.options.quiet) {
    context.console.result("Wrote " + bundle + ": " + groupedNumber(files) + " photos and videos.");
  }
  return kExitDone;
}

int runSnapshot(Context& context, const SnapshotArguments& arguments) {
  CancelToken cancel;
  SignalCancel signals(cancel, [&context](int) { context.console.endProgress(); });
  const HostOptions options = hostOptions(context, arguments.reading, cancel);
  refuseNesting({"FOLDER", arguments.folder}, {"HOST", arguments.bundle});
  ErrorPtr error;
  const auto library = openHost(arguments.folder, options, &error);
  if (!library) return reportFailure(context, error, exitCodeForHostError(error, cancel));
  std::vector<HostProblem> problems = library->problems();
  if (!writeHostBundle(*library, arguments.bundle, options, &problems, &error)) {
    const int exitCode = exitCodeForHostError(error, cancel);
    return reportFailure(context, withPath(arguments.bundle, error), exitCode);
  }
  return report(context, *library, arguments.bundle, problems);
}

}  // namespace

void addSnapshotCommand(CLI::App& app, Action& chosen) {
  auto arguments = std::make_shared<SnapshotArguments>();
  CLI::App* command = app.add_subcommand("snapshot", "Make a host bundle of a folder of photos");
  command->add_option("FOLDER", arguments->folder, "The folder of photos and videos")
      ->required()
      ->type_name("PATH");
  command
      ->add_option("HOST", arguments->bundle, "The bundle to write; one that is there is replaced")
      ->required()
      ->type_name("PATH");
  addFolderReadingOptions(*command, arguments->reading);
  command->footer(kSnapshotExamples);
  command->callback([arguments, &chosen] {
    chosen = [arguments](Context& context) { return runSnapshot(context, *arguments); };
  });
}

}  // namespace kx::cli
