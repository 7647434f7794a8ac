#include "cli/Cli.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <exception>

#include "cli/BackupCommand.h"
#include "cli/Command.h"
#include "daemon/ConsoleLogs.h"
#include "daemon/SyncRunner.h"

namespace kx::cli {

namespace {

constexpr const char* kDescription =
    "Keeps a device's photo library in line with a library on the host.\n"
    "HOST is a folder of photos and videos, or a host bundle (a directory with PhotoLibrary.plist\n"
    "and media/). DEVICE is the directory that stands for the device's root.";

constexpr const char* kExamples =
    "Examples:\n"
    "  kxsync sync ~/Pictures ./device     bring a folder of photos onto the device\n"
    "  kxsync plan ~/Pictures ./device     say what that would do, and change nothing\n"
    "  kxsync status ./device              what is on it\n"
    "  kxsync dump ./device                all of it, as JSON\n"
    "  kxsync backup ./device ./backup     take a backup of the device's own photos\n"
    "  kxsync restore ./backup ./device    bring it back, also onto another device\n"
    "  kxsync metrics ./device             what photos take of it\n"
    "\n"
    "kxsync COMMAND --help says more about a command.";

struct Parsed {
  CommonOptions options;
  Action action;
};

// Whether --json is among the arguments, for a command line that does not parse.
bool asksForJson(const std::vector<std::string>& arguments) {
  const auto end = std::find(arguments.begin(), arguments.end(), "--");
  return std::find(arguments.begin(), end, "--json") != end;
}

std::string commandOf(const CLI::App& app, const std::vector<std::string>& arguments) {
  for (const CLI::App* command : app.get_subcommands(nullptr)) {
    const auto found = std::find(arguments.begin(), arguments.end(), command->get_name());
    const bool first = std::all_of(arguments.begin(), found, [](const std::string& argument) {
      return !argument.empty() && argument.front() == '-';
    });
    if (found != arguments.end() && first) return command->get_name();
  }
  return "";
}

bool isCommand(const CLI::App& app, const std::string& name) {
  const auto commands = app.get_subcommands(nullptr);
  return std::any_of(commands.begin(), commands.end(),
                     [&](const CLI::App* command) { return command->get_name() == name; });
}

// The first word that is no option, when it names no command.
std::string unknownCommand(const CLI::App& app, const std::vector<std::string>& arguments) {
  for (std::size_t i = 0; i < arguments.size(); ++i) {
    const std::string& argument = arguments[i];
    if (argument == "--log-level") ++i;
    if (!argument.empty() && argument.front() == '-') continue;
    return isCommand(app, argument) ? "" : argument;
  }
  return "";
}

// What is wrong with a command line that names no command of ours.
std::string whatIsMissing(const CLI::App& app, const std::vector<std::string>& arguments) {
  const std::string unknown = unknownCommand(app, arguments);
  if (!unknown.empty()) return "there is no command \"" + unknown + "\"";
  for (const std::string& argument : arguments) {
    if (argument == "--") break;
    if (argument.front() == '-' && app.get_option_no_throw(argument) == nullptr) {
      return "there is no option \"" + argument + "\"";
    }
  }
  return "a command is missing";
}

int reportUsage(Context& context, const std::string& message) {
  reportFailure(context, Error::make(kCliErrorDomain, kExitUsage, message), kExitUsage);
  const std::string program = context.command.empty() ? "kxsync" : "kxsync " + context.command;
  context.console.hint("Try \"" + program + " --help\".");
  return kExitUsage;
}

int perform(Parsed& parsed, const std::string& command, Console& console) {
  if (parsed.options.noColor) console.withoutColor();
  Context context{command, parsed.options, console};
  const auto failed = [&context](const std::string& message) {
    return reportFailure(context, Error::make(kCliErrorDomain, kExitFailed, message), kExitFailed);
  };
  try {
    return parsed.action(context);
  } catch (const UsageError& error) {
    return reportUsage(context, error.what());
  } catch (const std::bad_alloc&) {
    return failed("out of memory");
  } catch (const std::exception& error) {
    return failed(error.what());
  }
}

int parseAndPerform(const std::vector<std::string>& arguments, Console& console) {
  CLI::App app(kDescription, "kxsync");
  app.footer(kExamples);
  app.set_version_flag("--version", std::string("kxsync ") + KX_VERSION,
                       "Print the version and exit");
  app.require_subcommand(1);
  Parsed parsed;
  addCommonOptions(app, parsed.options);
  addSyncCommand(app, parsed.action);
  addPlanCommand(app, parsed.action);
  addStatusCommand(app, parsed.action);
  addDumpCommand(app, parsed.action);
  addShowCommand(app, parsed.action);
  addSnapshotCommand(app, parsed.action);
  addRestoreCommand(app, parsed.action);
  addBackupCommand(app, parsed.action);
  addMetricsCommand(app, parsed.action);
  addBackupPathsCommand(app, parsed.action);
  for (CLI::App* command : app.get_subcommands(nullptr)) addCommonOptions(*command, parsed.options);

  const std::string command = commandOf(app, arguments);
  try {
    app.parse(std::vector<std::string>(arguments.rbegin(), arguments.rend()));
  } catch (const CLI::Success& answer) {
    if (answer.get_name() == "CallForVersion") {
      console.raw(std::string(answer.what()) + "\n");
    } else {
      console.raw(app.help());
    }
    return kExitDone;
  } catch (const CLI::ParseError& error) {
    parsed.options.json = asksForJson(arguments);
    Context context{command, parsed.options, console};
    return reportUsage(context, command.empty() ? whatIsMissing(app, arguments) : error.what());
  }
  return perform(parsed, command, console);
}

}  // namespace

void addCommonOptions(CLI::App& command, CommonOptions& options) {
  const auto group = "Common options";
  command.add_flag("--json", options.json, "Print one machine-readable result, and nothing else")
      ->group(group);
  command.add_flag("--quiet", options.quiet, "Show no progress and no summary")->group(group);
  command.add_flag("--no-color", options.noColor, "Use no colours (as with NO_COLOR set)")
      ->group(group);
  const auto readLevel = [&options](const std::string& text) {
    options.logLevel = logLevelNamed(text);
    if (!options.logLevel) {
      throw CLI::ValidationError("--log-level",
                                 "\"" + text + "\" is none of error, warning, info and debug");
    }
  };
  command
      .add_option_function<std::string>(
          "--log-level", readLevel,
          "Show log lines of this level and above: error, warning, info or debug (none without it)")
      ->type_name("LEVEL")
      ->group(group);
}

int run(const std::vector<std::string>& arguments, Console& console) {
  int exitCode = kExitFailed;
  try {
    exitCode = parseAndPerform(arguments, console);
  } catch (const std::exception& error) {
    console.error(error.what());
  }
  if (!console.finish() && exitCode == kExitDone) {
    console.error("the result could not be written to standard output");
    return kExitFailed;
  }
  return exitCode;
}

}  // namespace kx::cli
