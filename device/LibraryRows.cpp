#include "device/LibraryRows.h"

#include "device/Sqlite.h"

namespace kx {
namespace {

bool isWanted(const std::atomic<bool>* wanted) {
  return wanted == nullptr || wanted->load(std::memory_order_relaxed);
}

}  // namespace

AssetRow readAssetRow(const SqliteStatement& row, int first) {
  AssetRow asset;
  asset.uuid = row.textAt(first);
  asset.savedType = static_cast<std::int32_t>(row.integerAt(first + 1));
  asset.isVideo = row.integerAt(first + 2) != 0;
  asset.incomplete = row.integerAt(first + 3) != 0;
  asset.modificationDate = row.optionalRealAt(first + 4);
  asset.sortToken = row.optionalRealAt(first + 5);
  if (!row.isNull(first + 6)) {
    asset.location = Coordinate{row.realAt(first + 6), row.realAt(first + 7)};
  }
  return asset;
}

std::optional<AssetRow> assetRow(SqliteDatabase& database, RowId pk) {
  SqliteStatement row(database,
                      "SELECT uuid, saved_type, is_video, incomplete, modification_date, "
                      "sort_token, latitude, longitude FROM assets WHERE pk = ?");
  row.integer(pk);
  if (!row.step()) return std::nullopt;
  return readAssetRow(row, 0);
}

FaceRow readFaceRow(const SqliteStatement& row, int first) {
  FaceRow face;
  face.identifier = static_cast<std::uint16_t>(row.integerAt(first));
  face.relativeRect = Rect{row.realAt(first + 1), row.realAt(first + 2), row.realAt(first + 3),
                           row.realAt(first + 4)};
  face.albumUUID = row.optionalTextAt(first + 5);
  return face;
}

AlbumRow readAlbumRow(const SqliteStatement& row, int first) {
  AlbumRow album;
  album.uuid = row.optionalTextAt(first);
  album.kind = static_cast<std::int32_t>(row.integerAt(first + 1));
  album.title = row.optionalTextAt(first + 2);
  album.pendingType = static_cast<std::int32_t>(row.integerAt(first + 3));
  album.pendingCount = static_cast<std::uint32_t>(row.integerAt(first + 4));
  album.managed = row.integerAt(first + 5) != 0;
  return album;
}

std::vector<FaceOfAsset> readFaces(SqliteDatabase& database, const std::atomic<bool>* wanted) {
  std::vector<FaceOfAsset> faces;
  SqliteStatement row(database,
                      "SELECT asset, pk, identifier, x, y, width, height, album_uuid FROM faces "
                      "ORDER BY asset, pk");
  while (isWanted(wanted) && row.step()) {
    faces.push_back({row.integerAt(0), row.integerAt(1), readFaceRow(row, 2)});
  }
  return faces;
}

std::vector<AlbumOfAsset> readMemberships(SqliteDatabase& database,
                                          const std::atomic<bool>* wanted) {
  std::vector<AlbumOfAsset> albums;
  SqliteStatement row(database, "SELECT asset, album FROM memberships ORDER BY asset, album");
  while (isWanted(wanted) && row.step()) albums.push_back({row.integerAt(0), row.integerAt(1)});
  return albums;
}

}  // namespace kx
