#include <CLI/CLI.hpp>
#include <algorithm>
#include <memory>

#include "cli/Command.h"
#include "cli/DeviceReading.h"
#include "cli/JsonOutput.h"
#include "cli/Progress.h"
#include "daemon/SyncRunner.h"

namespace kx::cli {

namespace {

constexpr const char* kStatusExamples =
    "Examples:\n"
    "  kxsync status ./device            albums, events and face albums with their counts\n"
    "  kxsync status ./device --json     the same for a script";

constexpr std::int32_t kSyncedAssetType = 256;
constexpr std::size_t kNumberColumns = 9;
constexpr const char* kFaceAlbums = "Face albums";
constexpr std::size_t kWidestTitle = 48;

struct Totals {
  std::size_t synced = 0, deviceMade = 0, videos = 0, incomplete = 0, faces = 0;
};

Totals totalsOf(const DeviceDump& dump) {
  Totals totals;
  for (const DeviceDump::Asset& asset : dump.assets) {
    ++(asset.savedAssetType == kSyncedAssetType ? totals.synced : totals.deviceMade);
    totals.videos += asset.isVideo ? 1U : 0U;
    totals.incomplete += asset.incomplete ? 1U : 0U;
    totals.faces += asset.faces.size();
  }
  return totals;
}

nlohmann::ordered_json optionalText(const std::optional<std::string>& text) {
  return text ? nlohmann::ordered_json(*text) : nlohmann::ordered_json(nullptr);
}

nlohmann::ordered_json containersJson(const std::vector<DeviceDump::Container>& containers) {
  nlohmann::ordered_json json = nlohmann::ordered_json::array();
  for (const DeviceDump::Container& container : containers) {
    json.push_back({{"uuid", container.uuid},
                    {"title", optionalText(container.title)},
                    {"kind", container.kind},
                    {"assets", container.assets.size()},
                    {"pending", container.pending.count}});
  }
  return json;
}

nlohmann::ordered_json statusJson(const DeviceDump& dump, const std::optional<Date>& lastSync) {
  const Totals totals = totalsOf(dump);
  nlohmann::ordered_json json;
  json["libraryUUID"] = optionalText(dump.currentLibraryUUID);
  json["libraryKind"] = dump.syncAgent ? optionalText(dump.syncAgent->libraryKind) : nullptr;
  json["userAgent"] = dump.syncAgent ? optionalText(dump.syncAgent->userAgent) : nullptr;
  json["lastSynced"] = dump.lastSynced;
  json["lastSyncDate"] = nullptr;
  if (dump.lastSynced && lastSync) json["lastSyncDate"] = lastSync->secondsSinceReference;
  json["pending"] = dump.syncProgress.count;
  json["assets"] = {{"synced", totals.synced},
                    {"deviceMade", totals.deviceMade},
                    {"videos", totals.videos},
                    {"incomplete", totals.incomplete},
                    {"faces", totals.faces}};
  json["albums"] = containersJson(dump.albums);
  json["events"] = containersJson(dump.events);
  json["faceAlbums"] = containersJson(dump.faceAlbums);
  return json;
}

std::string rightAligned(const std::string& text) {
  return text.size() < kNumberColumns ? std::string(kNumberColumns - text.size(), ' ') + text
                                      : text;
}

std::string shownTitle(const DeviceDump::Container& container) {
  return printable(container.title ? *container.title : "(no title)");
}

std::size_t titleColumns(const DeviceDump& dump) {
  std::size_t columns = columnsOf(kFaceAlbums);
  for (const auto* list : {&dump.albums, &dump.events, &dump.faceAlbums}) {
    for (const auto& container : *list) {
      columns = std::max(columns, columnsOf(shownTitle(container)));
    }
  }
  return std::min(columns, kWidestTitle);
}

void printContainers(Console& console, const char* name,
                     const std::vector<DeviceDump::Container>& containers, std::size_t columns) {
  if (containers.empty()) return;
  console.result("");
  console.heading(padded(name, columns) + rightAligned("Assets") + rightAligned("Pending"));
  for (const auto& container : containers) {
    console.result(padded(shortened(shownTitle(container), columns), columns) +
                   rightAligned(groupedNumber(container.assets.size())) +
                   rightAligned(groupedNumber(container.pending.count)));
  }
}

std::string lastSyncText(const DeviceDump& dump, const std::optional<Date>& lastSync) {
  if (dump.lastSynced) {
    return lastSync ? "whole, " + lastSync->description() : std::string("whole");
  }
  return dump.currentLibraryUUID ? "not whole: the next sync goes on from here" : "never";
}

void printStatus(Console& console, const DeviceDump& dump, const std::optional<Date>& lastSync) {
  const Totals totals = totalsOf(dump);
  const auto text = [](const std::optional<std::string>& value) { return value.value_or("none"); };
  std::string library = text(dump.currentLibraryUUID);
  if (dump.syncAgent && dump.syncAgent->libraryKind) {
    library += " (" + *dump.syncAgent->libraryKind + ")";
  }
  std::string assets = groupedNumber(totals.synced) + " synced";
  if (totals.deviceMade > 0)
    assets += ", " + groupedNumber(totals.deviceMade) + " of the device's own";
  if (totals.videos > 0) assets += ", " + groupedNumber(totals.videos) + " of them videos";
  if (totals.incomplete > 0) assets += ", " + groupedNumber(totals.incomplete) + " incomplete";
  console.result("Library    " + library);
  if (dump.syncAgent && dump.syncAgent->userAgent) {
    console.result("Host       " + *dump.syncAgent->userAgent);
  }
  console.result("Last sync  " + lastSyncText(dump, lastSync));
  console.result("Assets     " + assets);
  console.result("Pending    " + groupedNumber(dump.syncProgress.count));
  const std::size_t columns = titleColumns(dump);
  printContainers(console, "Albums", dump.albums, columns);
  printContainers(console, "Events", dump.events, columns);
  printContainers(console, kFaceAlbums, dump.faceAlbums, columns);
}

int runStatus(Context& context, const std::string& root) {
  ErrorPtr error;
  const std::optional<DeviceDump> dump = readDevice(context, root, false, &error);
  if (!dump) return reportFailure(context, error, exitCodeForDeviceError(error));
  const std::optional<Date> lastSync = lastSyncDate(root);
  if (context.options.json) {
    context.console.raw(jsonLine(statusJson(*dump, lastSync)));
  } else {
    printStatus(context.console, *dump, lastSync);
  }
  return kExitDone;
}

}  // namespace

void addStatusCommand(CLI::App& app, Action& chosen) {
  auto root = std::make_shared<std::string>();
  CLI::App* command = app.add_subcommand("status", "Say what is on the device and what is pending");
  command->add_option("DEVICE", *root, "The directory of the device")
      ->required()
      ->type_name("PATH");
  command->footer(kStatusExamples);
  command->callback(
      [root, &chosen] { chosen = [root](Context& context) { return runStatus(context, *root); }; });
}

}  // namespace kx::cli
