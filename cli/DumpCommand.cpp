#include <CLI/CLI.hpp>
#include <memory>

#include "cli/Command.h"
#include "cli/DeviceReading.h"
#include "cli/JsonOutput.h"
#include "daemon/DumpJson.h"
#include "daemon/SyncJson.h"

namespace kx::cli {

namespace {

constexpr const char* kDumpExamples =
    "Examples:\n"
    "  kxsync dump ./device                    all that the library holds, indented\n"
    "  kxsync dump ./device --json --hash      on one line, with the SHA-256 of every file";

constexpr int kIndent = 2;

struct DumpArguments {
  std::string device;
  bool hash = false;
};

int runDump(Context& context, const DumpArguments& arguments) {
  ErrorPtr error;
  const std::optional<DeviceDump> dump =
      readDevice(context, arguments.device, arguments.hash, &error);
  if (!dump) return reportFailure(context, error, exitCodeForDeviceError(error));
  const nlohmann::ordered_json json = deviceDumpJson(*dump);
  context.console.raw(context.options.json ? jsonLine(json) : dumpJson(json, kIndent) + "\n");
  return kExitDone;
}

}  // namespace

void addDumpCommand(CLI::App& app, Action& chosen) {
  auto arguments = std::make_shared<DumpArguments>();
  CLI::App* command = app.add_subcommand("dump", "Print the device library as JSON");
  command->add_option("DEVICE", arguments->device, "The directory of the device")
      ->required()
      ->type_name("PATH");
  command->add_flag("--hash", arguments->hash, "Add the SHA-256 of every asset's file");
  command->footer(kDumpExamples);
  command->callback([arguments, &chosen] {
    chosen = [arguments](Context& context) { return runDump(context, *arguments); };
  });
}

}  // namespace kx::cli
