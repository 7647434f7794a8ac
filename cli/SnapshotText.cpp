#include "cli/SnapshotText.h"

#include <algorithm>
#include <cstdio>
#include <unordered_map>

#include "cli/Progress.h"
#include "records/TesselDates.h"

namespace kx::cli {

namespace {

constexpr std::int64_t kFaceAlbumSubclass = 3;
constexpr std::int64_t kEventSubclass = 4;
constexpr std::int64_t kMasterSubclass = 5;
constexpr std::size_t kNameColumns = 40;

enum class ContainerKind { kAlbum, kEvent, kFaceAlbum, kMasterAlbum };

ContainerKind kindOf(const KXSItem& item) {
  const auto* album = dynamic_cast<const KXSAlbum*>(&item);
  if (album == nullptr) return ContainerKind::kEvent;
  const auto subclass = album->albumSubclass();
  if (!subclass) return ContainerKind::kAlbum;
  if (subclass->int64Value() == kFaceAlbumSubclass) return ContainerKind::kFaceAlbum;
  if (subclass->int64Value() == kEventSubclass) return ContainerKind::kEvent;
  if (subclass->int64Value() == kMasterSubclass) return ContainerKind::kMasterAlbum;
  return ContainerKind::kAlbum;
}

const char* nameOf(ContainerKind kind) {
  switch (kind) {
    case ContainerKind::kAlbum:
      return "album";
    case ContainerKind::kEvent:
      return "event";
    case ContainerKind::kFaceAlbum:
      return "face album";
    case ContainerKind::kMasterAlbum:
      return "master album";
  }
  return "";
}

OptionalString titleOf(const KXSItem& item) {
  if (const auto* album = dynamic_cast<const KXSAlbum*>(&item)) return album->name();
  if (const auto* event = dynamic_cast<const KXSEvent*>(&item)) return event->name();
  return std::nullopt;
}

// Assets by the event that they name: an event does not list its assets.
using EventSizes = std::unordered_map<std::string, std::size_t>;

EventSizes eventSizes(const KXSLibraryChangeSnapshot& snapshot) {
  EventSizes sizes;
  for (const auto& entry : *snapshot.assetsByUUID()) {
    if (const OptionalString event = entry.value->eventUUID()) ++sizes[std::string(*event)];
  }
  return sizes;
}

std::size_t sizeOf(const KXSItem& item, const EventSizes& events) {
  const auto* album = dynamic_cast<const KXSAlbum*>(&item);
  const std::optional<ArrayView> members = album == nullptr ? std::nullopt : album->assetUUIDs();
  if (members) return members->size();
  const auto found = events.find(std::string(item.uuid().value_or("")));
  return found == events.end() ? 0 : found->second;
}

std::string shownText(OptionalString text, const char* ifNull) {
  return printable(text ? *text : std::string_view(ifNull));
}

std::string column(const std::string& text) {
  return padded(shortened(text, kNameColumns), kNameColumns);
}

std::string counted(std::size_t number, const char* one, const char* many) {
  return groupedNumber(number) + " " + (number == 1 ? one : many);
}

void describeContainers(const KXSLibraryChangeSnapshot& snapshot, LineSink& lines) {
  const EventSizes events = eventSizes(snapshot);
  lines.line("");
  lines.heading(padded("Kind", 14) + column("Name") + "  Assets");
  for (const KXSItemPtr& item : *snapshot.orderedAlbums()) {
    lines.line(padded(nameOf(kindOf(*item)), 14) + column(shownText(titleOf(*item), "(no name)")) +
               "  " + groupedNumber(sizeOf(*item, events)));
  }
}

std::string placeOf(const KXSAsset& asset) {
  const auto latitude = asset.latitude();
  const auto longitude = asset.longitude();
  if (!latitude || !longitude) return "";
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), "  %.5f, %.5f", latitude->doubleValue(),
                longitude->doubleValue());
  return text.data();
}

std::string describeAsset(const KXSAsset& asset) {
  std::string line = column(shownText(asset.originalFileName(), "(no file name)"));
  const auto exposure = asset.exposureDate();
  line += "  " + (exposure ? dateWithTesselTimeInterval(exposure->doubleValue()).description()
                           : std::string("(no date)"));
  line += placeOf(asset);
  if (asset.isVideo()) line += "  video";
  const std::optional<ArrayView> faces = asset.facesInfo();
  if (faces && !faces->empty()) line += "  " + counted(faces->size(), "face", "faces");
  return line;
}

nlohmann::ordered_json textJson(OptionalString text) {
  return text ? nlohmann::ordered_json(*text) : nlohmann::ordered_json(nullptr);
}

}  // namespace

SnapshotCounts countSnapshot(const KXSLibraryChangeSnapshot& snapshot) {
  SnapshotCounts counts;
  for (const KXSItemPtr& item : *snapshot.orderedAlbums()) {
    switch (kindOf(*item)) {
      case ContainerKind::kAlbum:
        ++counts.albums;
        break;
      case ContainerKind::kEvent:
        ++counts.events;
        break;
      case ContainerKind::kFaceAlbum:
        ++counts.faceAlbums;
        break;
      case ContainerKind::kMasterAlbum:
        ++counts.masterAlbums;
        break;
    }
  }
  for (const auto& entry : *snapshot.assetsByUUID()) {
    const KXSAsset& asset = *entry.value;
    ++counts.assets;
    counts.videos += asset.isVideo() ? 1U : 0U;
    counts.located += asset.latitude() && asset.longitude() ? 1U : 0U;
    const std::optional<ArrayView> faces = asset.facesInfo();
    counts.faces += faces ? faces->size() : 0U;
  }
  counts.deletes = snapshot.deletes()->size();
  return counts;
}

nlohmann::ordered_json countsJson(const KXSLibraryChangeSnapshot& snapshot) {
  const SnapshotCounts counts = countSnapshot(snapshot);
  nlohmann::ordered_json json;
  json["libraryUUID"] = textJson(snapshot.libraryUUID());
  json["libraryKind"] = textJson(snapshot.libraryKind());
  json["isFolderSync"] = snapshot.isFolderSync();
  json["counts"] = {{"assets", counts.assets},         {"videos", counts.videos},
                    {"located", counts.located},       {"faces", counts.faces},
                    {"albums", counts.albums},         {"events", counts.events},
                    {"faceAlbums", counts.faceAlbums}, {"masterAlbums", counts.masterAlbums},
                    {"deletes", counts.deletes}};
  return json;
}

void describeSnapshot(const KXSLibraryChangeSnapshot& snapshot, bool summary, LineSink& lines) {
  const SnapshotCounts counts = countSnapshot(snapshot);
  lines.line("Library     " + shownText(snapshot.libraryUUID(), "none"));
  lines.line("Kind        " + shownText(snapshot.libraryKind(), "none"));
  lines.line("Assets      " + groupedNumber(counts.assets) + " (" +
             counted(counts.videos, "video", "videos") + ", " + groupedNumber(counts.located) +
             " with a place, " + counted(counts.faces, "face", "faces") + ")");
  lines.line("Containers  " + counted(counts.albums, "album", "albums") + ", " +
             counted(counts.events, "event", "events") + ", " +
             counted(counts.faceAlbums, "face album", "face albums") + ", " +
             counted(counts.masterAlbums, "master album", "master albums"));
  lines.line("Deletes     " + groupedNumber(counts.deletes));
  if (summary) return;
  if (!snapshot.orderedAlbums()->empty()) describeContainers(snapshot, lines);
  if (snapshot.assetsByUUID()->empty()) return;
  lines.line("");
  lines.heading(column("Asset") + "  Taken");
  for (const auto& entry : *snapshot.assetsByUUID()) lines.line(describeAsset(*entry.value));
}

}  // namespace kx::cli
