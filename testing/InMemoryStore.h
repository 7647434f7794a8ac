#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "testing/LibrarySeeds.h"

namespace kx {

// The saved rows of an in-memory photo library. Row numbers start at 1 and are never used again.
// Used on the library's queue alone.
struct InMemoryFaceRow {
  std::uint16_t identifier = 0;
  Rect relativeRect;
  std::optional<std::string> albumUUID;
  std::int64_t asset = 0;
};

struct InMemoryAssetRow {
  std::optional<std::string> uuid;
  std::int32_t savedAssetType = 0;
  bool isVideo = false;
  std::optional<Date> creationDate;
  std::optional<Date> modificationDate;
  std::optional<double> sortToken;
  std::optional<Coordinate> location;
  std::optional<std::string> originalFileName;
  std::vector<std::string> files;
  std::optional<std::int64_t> originalFilesize;
  std::vector<std::int64_t> sidecarSizes;
  bool incomplete = false;
  std::set<std::int64_t> faces;
  std::set<std::int64_t> albums;
};

struct InMemoryAlbumRow {
  std::optional<std::string> uuid;
  std::optional<std::string> title;
  std::int32_t kind = 0;
  bool managed = true;
  std::int32_t pendingItemsType = kKXPendingItemsNone;
  std::uint32_t pendingItemsCount = 0;
  std::vector<std::int64_t> assets;  // in the album's order
};

struct InMemoryStore {
  static constexpr std::size_t kLists = 3;  // by SeedList

  InMemoryStore();

  std::map<std::int64_t, InMemoryAlbumRow> albums;
  std::map<std::int64_t, InMemoryAssetRow> assets;
  std::map<std::int64_t, InMemoryFaceRow> faces;
  std::array<std::vector<std::int64_t>, kLists> lists;
  std::unordered_map<std::string, std::int64_t> assetsByUUID;
  std::int64_t nextRow = 1;
  // The library's own albums.
  std::int64_t shoebox = 0;
  std::int64_t syncProgress = 0;
  std::int64_t otaRestoreProgress = 0;

  std::int64_t addAsset(const AssetSeed& seed);
  std::int64_t addAlbum(const AlbumSeed& seed);
  // With its faces and memberships.
  void removeAsset(std::int64_t row);
  void removeAlbum(std::int64_t row);
  std::int64_t albumWithUUID(std::string_view uuid) const;  // 0 when absent
  std::int64_t assetWithUUID(std::string_view uuid) const;  // 0 when absent
};

}  // namespace kx
