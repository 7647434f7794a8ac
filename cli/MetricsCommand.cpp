#include <CLI/CLI.hpp>
#include <algorithm>
#include <cmath>
#include <memory>

#include "cli/BackupCommand.h"
#include "cli/JsonOutput.h"
#include "cli/Progress.h"
#include "daemon/BackupRunner.h"

namespace kx::cli {

namespace {

constexpr const char* kMetricsExamples =
    "Examples:\n"
    "  kxsync metrics ./device            what synced and own photos take, and what is free\n"
    "  kxsync metrics ./device --json     the same for a script";

constexpr const char* kPathsExamples =
    "Examples:\n"
    "  kxsync backup-paths ./device            one path a line\n"
    "  kxsync backup-paths ./device --json     the same for a script";

constexpr std::size_t kBarColumns = 60;
constexpr std::size_t kLabelColumns = 22;
constexpr std::size_t kNumberColumns = 12;

// A share of the device's disk.
struct Share {
  const char* label;
  char mark;
  std::uint64_t bytes;
  double part;  // of the capacity, 0 to 1
};

std::vector<Share> sharesOf(const DeviceMetrics& metrics) {
  const auto part = [&metrics](std::uint64_t bytes) {
    if (metrics.capacity == 0) return 0.0;
    return std::min(static_cast<double>(bytes) / static_cast<double>(metrics.capacity), 1.0);
  };
  const std::uint64_t photos = metrics.photo.physicalSize + metrics.shoebox.physicalSize;
  const std::uint64_t known = std::min(photos + metrics.free, metrics.capacity);
  const std::uint64_t other = metrics.capacity - known;
  return {{"Synced photos", '#', metrics.photo.physicalSize, part(metrics.photo.physicalSize)},
          {"The device's photos", '=', metrics.shoebox.physicalSize,
           part(metrics.shoebox.physicalSize)},
          {"Everything else", '-', other, part(other)},
          {"Free", '.', metrics.free, part(metrics.free)}};
}

// What there is of at all gets a column; the free space takes what is left.
std::string barOf(const std::vector<Share>& shares) {
  std::string bar;
  for (const Share& share : shares) {
    auto columns = static_cast<std::size_t>(std::lround(share.part * kBarColumns));
    if (share.bytes > 0) columns = std::max<std::size_t>(columns, 1);
    bar.append(std::min(columns, kBarColumns - bar.size()), share.mark);
  }
  bar.append(kBarColumns - bar.size(), shares.back().mark);
  return bar;
}

std::string percent(double part) {
  const auto tenths = static_cast<std::uint64_t>(std::lround(part * 1000.0));
  if (tenths == 0 && part > 0.0) return "<0.1 %";
  return std::to_string(tenths / 10) + "." + std::to_string(tenths % 10) + " %";
}

std::string rightAligned(const std::string& text) {
  return text.size() < kNumberColumns ? std::string(kNumberColumns - text.size(), ' ') + text
                                      : text;
}

nlohmann::ordered_json metricsJson(const DeviceMetrics& metrics) {
  nlohmann::ordered_json json;
  json["backupRunning"] = metrics.backupRunning;
  json["metrics"] = nlohmann::ordered_json::object();
  const std::vector<Share> shares = sharesOf(metrics);
  if (!metrics.backupRunning) {
    const auto kind = [](const DeviceMetrics::Kind& found) {
      return nlohmann::ordered_json{{"_PhysicalSize", found.physicalSize}, {"_Count", found.count}};
    };
    json["metrics"]["Photo"] = kind(metrics.photo);
    json["metrics"]["Shoebox"] = kind(metrics.shoebox);
    json["shares"] = {{"Photo", shares[0].part}, {"Shoebox", shares[1].part}};
  } else {
    json["shares"] = nlohmann::ordered_json::object();
  }
  json["capacity"] = metrics.capacity;
  json["free"] = metrics.free;
  return json;
}

void printMetrics(Console& console, const DeviceMetrics& metrics) {
  const std::string free = readableBytes(metrics.free) + " of " + readableBytes(metrics.capacity);
  if (metrics.backupRunning) {
    console.result("A backup is running: there are no figures until it has ended.");
    console.result(padded("Free", kLabelColumns) + free);
    return;
  }
  const std::vector<Share> shares = sharesOf(metrics);
  if (console.outIsTerminal()) console.result("[" + barOf(shares) + "]");
  for (const Share& share : shares) {
    std::string line = console.outIsTerminal() ? std::string(1, share.mark) + " " : std::string();
    line += padded(share.label, kLabelColumns) + rightAligned(readableBytes(share.bytes)) +
            rightAligned(percent(share.part));
    if (&share == &shares[0]) line += rightAligned(groupedNumber(metrics.photo.count)) + " photos";
    if (&share == &shares[1]) {
      line += rightAligned(groupedNumber(metrics.shoebox.count)) + " photos";
    }
    console.result(line);
  }
}

int runMetrics(Context& context, const std::string& root) {
  ErrorPtr error;
  const auto metrics = readMetrics(root, logSinksFor(context.options, context.console), &error);
  if (!metrics) return reportFailure(context, error, exitCodeForDeviceError(error));
  if (context.options.json) {
    context.console.raw(jsonLine(metricsJson(*metrics)));
  } else {
    printMetrics(context.console, *metrics);
  }
  return kExitDone;
}

int runBackupPaths(Context& context, const std::string& root) {
  ErrorPtr error;
  const auto paths = readBackupPaths(root, logSinksFor(context.options, context.console), &error);
  if (!paths) return reportFailure(context, error, exitCodeForDeviceError(error));
  if (context.options.json) {
    context.console.raw(jsonLine({{"pathsToBackup", *paths}}));
  } else {
    for (const std::string& path : *paths) context.console.result(path);
  }
  return kExitDone;
}

struct ReadingCommand {
  const char* name;
  const char* what;
  const char* examples;
  int (*run)(Context&, const std::string&);
};

void addReadingCommand(CLI::App& app, Action& chosen, const ReadingCommand& reading) {
  auto root = std::make_shared<std::string>();
  CLI::App* command = app.add_subcommand(reading.name, reading.what);
  command->add_option("DEVICE", *root, "The directory of the device")
      ->required()
      ->type_name("PATH");
  command->footer(reading.examples);
  command->callback([root, run = reading.run, &chosen] {
    chosen = [root, run](Context& context) { return run(context, *root); };
  });
}

}  // namespace

void addMetricsCommand(CLI::App& app, Action& chosen) {
  addReadingCommand(app, chosen,
                    {"metrics", "Say what photos take of the device, and what is free",
                     kMetricsExamples, &runMetrics});
}

void addBackupPathsCommand(CLI::App& app, Action& chosen) {
  addReadingCommand(app, chosen,
                    {"backup-paths", "Print what the plug-in names for the backup of a device",
                     kPathsExamples, &runBackupPaths});
}

}  // namespace kx::cli
