#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/library/KXManagedObjects.h"

namespace kx {

// What a test puts into a device library before it begins. Plain values; defaults make an ordinary
// synced asset or album.
struct FaceSeed {
  std::uint16_t identifier = 0;
  Rect relativeRect;
  std::optional<std::string> albumUUID;
};

struct AssetSeed {
  std::optional<std::string> uuid;
  std::int32_t savedAssetType = kKXSavedAssetTypeSynced;
  bool isVideo = false;
  std::optional<Date> creationDate = Date{};
  std::optional<Date> modificationDate = Date{};
  std::optional<double> sortToken;
  std::optional<Coordinate> location;
  std::optional<std::string> originalFileName;
  std::vector<FaceSeed> faces;
  // Absolute device paths of all files but thumbnails, main file first; none is written.
  std::vector<std::string> files;
  std::optional<std::int64_t> originalFilesize;  // bytes
  std::vector<std::int64_t> sidecarSizes;        // bytes
  bool incomplete = false;
};

enum class SeedList { kAlbums, kEvents, kFaceAlbums };

struct AlbumSeed {
  std::optional<std::string> uuid;
  std::optional<std::string> title;
  std::int32_t kind = kKXAlbumKindSyncedAlbum;
  SeedList list = SeedList::kAlbums;  // goes to the end of that list
  bool inList = true;
  bool managed = true;
  std::int32_t pendingItemsType = kKXPendingItemsNone;
  std::uint32_t pendingItemsCount = 0;
  std::vector<std::string> assets;  // UUIDs of assets that are there already
};

}  // namespace kx
