#include "testing/InMemoryStore.h"

#include <algorithm>
#include <stdexcept>

namespace kx {
namespace {

// Kinds of the library's own albums; no sync handles them.
constexpr std::int32_t kShoeboxKind = 1000;
constexpr std::int32_t kSyncProgressKind = 1500;
constexpr std::int32_t kOTARestoreProgressKind = 1501;

}  // namespace

InMemoryStore::InMemoryStore() {
  AlbumSeed own;
  own.inList = false;
  own.kind = kShoeboxKind;
  own.title = "Camera";
  shoebox = addAlbum(own);
  own.kind = kSyncProgressKind;
  own.title = "Syncing";
  syncProgress = addAlbum(own);
  own.kind = kOTARestoreProgressKind;
  own.title = "Restoring";
  otaRestoreProgress = addAlbum(own);
}

std::int64_t InMemoryStore::addAsset(const AssetSeed& seed) {
  const std::int64_t row = nextRow++;
  InMemoryAssetRow asset;
  asset.uuid = seed.uuid;
  asset.savedAssetType = seed.savedAssetType;
  asset.isVideo = seed.isVideo;
  asset.creationDate = seed.creationDate;
  asset.modificationDate = seed.modificationDate;
  asset.sortToken = seed.sortToken;
  asset.location = seed.location;
  asset.originalFileName = seed.originalFileName;
  asset.files = seed.files;
  asset.originalFilesize = seed.originalFilesize;
  asset.sidecarSizes = seed.sidecarSizes;
  asset.incomplete = seed.incomplete;
  for (const FaceSeed& face : seed.faces) {
    const std::int64_t faceRow = nextRow++;
    faces[faceRow] = InMemoryFaceRow{face.identifier, face.relativeRect, face.albumUUID, row};
    asset.faces.insert(faceRow);
  }
  if (seed.uuid) assetsByUUID[*seed.uuid] = row;
  assets[row] = std::move(asset);
  return row;
}

std::int64_t InMemoryStore::addAlbum(const AlbumSeed& seed) {
  const std::int64_t row = nextRow++;
  InMemoryAlbumRow album{
      seed.uuid, seed.title, seed.kind, seed.managed, seed.pendingItemsType, seed.pendingItemsCount,
      {}};
  for (const std::string& uuid : seed.assets) {
    const std::int64_t asset = assetWithUUID(uuid);
    if (asset == 0) throw std::invalid_argument("no asset " + uuid + " for an album");
    album.assets.push_back(asset);
    assets[asset].albums.insert(row);
  }
  albums[row] = std::move(album);
  if (seed.inList) lists[static_cast<std::size_t>(seed.list)].push_back(row);
  return row;
}

void InMemoryStore::removeAsset(std::int64_t row) {
  const auto asset = assets.find(row);
  if (asset == assets.end()) return;
  for (const std::int64_t face : asset->second.faces) faces.erase(face);
  for (const std::int64_t album : asset->second.albums) std::erase(albums[album].assets, row);
  const auto named =
      asset->second.uuid ? assetsByUUID.find(*asset->second.uuid) : assetsByUUID.end();
  if (named != assetsByUUID.end() && named->second == row) assetsByUUID.erase(named);
  assets.erase(asset);
}

void InMemoryStore::removeAlbum(std::int64_t row) {
  const auto album = albums.find(row);
  if (album == albums.end()) return;
  for (const std::int64_t asset : album->second.assets) assets[asset].albums.erase(row);
  for (std::vector<std::int64_t>& list : lists) std::erase(list, row);
  albums.erase(album);
}

std::int64_t InMemoryStore::albumWithUUID(std::string_view uuid) const {
  for (const auto& entry : albums) {
    if (entry.second.uuid == uuid) return entry.first;
  }
  return 0;
}

std::int64_t InMemoryStore::assetWithUUID(std::string_view uuid) const {
  const auto found = assetsByUUID.find(std::string(uuid));
  return found == assetsByUUID.end() ? 0 : found->second;
}

}  // namespace kx
