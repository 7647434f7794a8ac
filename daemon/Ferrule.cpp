#include "daemon/Ferrule.h"

#include <sys/resource.h>
#include <sys/stat.h>

#include <cstdio>
#include <optional>

#include "daemon/BundleLink.h"
#include "daemon/ConsoleLogs.h"
#include "daemon/SignalCancel.h"
#include "daemon/SyncJson.h"
#include "daemon/SyncRunner.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr const char* kUsage =
    R"(ferrule - the sync daemon: loads the sync plug-in and moves files to a device

usage:
  ferrule sync HOST DEVICE [options]   run one whole sync
)";

constexpr const char* kHelp = R"(
HOST is a host bundle: a directory with PhotoLibrary.plist and media/. (kxsync also reads plain
folders of photos.) DEVICE is a directory that stands for the device's root; sync makes it.

options of sync:
  --json               the result as one JSON object on standard output
  --quiet              no summary line
  --allow-deletes      let a sync take away more than half of the synced photos
  --plugin FILE        the plug-in module to load
  --log-level LEVEL    error, warning, info or debug: show the sync log on standard error
  --help, --version

examples:
  ferrule sync ./bundle ./device
  ferrule sync --json --log-level info ./bundle ./device

exit codes: 0 done, 1 failed, 2 wrong usage, 3 some photos did not make it, 4 stopped by a guard,
6 no space left on the device, 7 another run holds the device, 130 or 143 ended by a signal
)";

struct SyncCommand {
  SyncOptions options;
  std::string host;
  bool json = false;
  bool quiet = false;
  std::optional<LogLevel> logLevel;
};

void complain(const std::string& text) {
  std::fprintf(stderr, "ferrule: %s\n", escapeControlCharacters(text).c_str());
}

int wrongUsage(const std::string& text) {
  complain(text + " (ferrule --help says more)");
  return kExitUsage;
}

// The value of an option given as "--name VALUE" or "--name=VALUE"; nullopt when this is another.
std::optional<std::string> optionValue(const std::vector<std::string>& arguments,
                                       std::size_t* index, const std::string& name) {
  const std::string& argument = arguments[*index];
  if (argument.starts_with(name + "=")) return argument.substr(name.size() + 1);
  if (argument != name || *index + 1 >= arguments.size()) return std::nullopt;
  return arguments[++*index];
}

// What is wrong with the arguments, or "".
std::string parseSync(const std::vector<std::string>& arguments, SyncCommand* command) {
  std::vector<std::string> places;
  bool onlyPlaces = false;
  for (std::size_t i = 1; i < arguments.size(); ++i) {
    const std::string& argument = arguments[i];
    if (onlyPlaces || argument.empty() || argument[0] != '-') {
      places.push_back(argument);
    } else if (argument == "--") {
      onlyPlaces = true;
    } else if (argument == "--json") {
      command->json = true;
    } else if (argument == "--quiet") {
      command->quiet = true;
    } else if (argument == "--allow-deletes") {
      command->options.allowDeletes = true;
    } else if (const auto plugin = optionValue(arguments, &i, "--plugin")) {
      command->options.pluginPath = *plugin;
    } else if (const auto level = optionValue(arguments, &i, "--log-level")) {
      command->logLevel = logLevelNamed(*level);
      if (!command->logLevel) return "unknown log level \"" + *level + "\"";
    } else {
      return "unknown or incomplete option " + argument;
    }
  }
  if (places.size() != 2) return "sync needs HOST and DEVICE";
  if (places[0].empty() || places[1].empty()) return "HOST and DEVICE must not be empty";
  command->host = places[0];
  command->options.deviceRoot = places[1];
  return {};
}

void printResult(const SyncResult& result, const SyncCommand& command) {
  for (const SyncFailure& failure : result.failed) {
    complain(failure.uuid + ": " + failure.reason + " (" + failure.domain + " " +
             std::to_string(failure.code) + ")");
  }
  if (result.error) complain(result.error->message());
  if (command.json) {
    std::printf("%s\n", dumpJson(syncResultJson(result)).c_str());
  } else if (!command.quiet && !result.error) {
    std::printf("%s: %zu photos brought, %zu deleted, %zu updated; %zu albums made, %zu deleted\n",
                syncOutcomeName(result.outcome), result.imported, result.deletedAssets,
                result.updatedAssets, result.albumsCreated, result.albumsDeleted);
  }
  std::fflush(stdout);
}

int runSync(const std::vector<std::string>& arguments) {
  SyncCommand command;
  if (const std::string wrong = parseSync(arguments, &command); !wrong.empty()) {
    return wrongUsage(wrong);
  }
  CancelToken cancel;
  SignalCancel signals(cancel, [&](int signal) {
    SyncResult result;
    result.outcome = SyncOutcome::kStopped;
    result.exitCode = 128 + signal;
    result.error =
        Error::make(kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kCancelled),
                    "stopped in the middle of a step; the same command goes on from here");
    printResult(result, command);
  });
  ErrorPtr error;
  SyncResult result;
  if (const auto link = BundleLink::open(command.host, &error)) {
    result = syncDevice(*link, command.options, consoleLogs(command.logLevel), {}, cancel);
  } else {
    result.error = error;
  }
  printResult(result, command);
  return result.exitCode;
}

}  // namespace

int runFerrule(const std::vector<std::string>& arguments, const FerruleCommands& further) {
  if (arguments.empty()) return wrongUsage("what to do is missing");
  for (const std::string& argument : arguments) {
    if (argument == "--") break;
    if (argument == "--help" || argument == "-h") {
      std::fputs(kUsage, stdout);
      for (const auto& [name, command] : further) std::printf("  %s\n", command.usage.c_str());
      std::fputs(kHelp, stdout);
      return kExitDone;
    }
    if (argument == "--version") {
      std::puts("ferrule " KX_VERSION);
      return kExitDone;
    }
  }
  // Nothing that the daemon makes is for anybody else, and no core holds a library's content.
  ::umask(077);
  const rlimit noCore{0, 0};
  ::setrlimit(RLIMIT_CORE, &noCore);
  if (arguments[0] == "sync") return runSync(arguments);
  if (const auto found = further.find(arguments[0]); found != further.end()) {
    return found->second.run(arguments);
  }
  return wrongUsage("unknown command \"" + arguments[0] + "\"");
}

}  // namespace kx
