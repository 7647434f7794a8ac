#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/foundation/Rect.h"
#include "platform/library/KXManagedObjects.h"

namespace kx {

// Rows of the library's tables as plain values. pk: the row's number, ascending in the order made.
using RowId = std::int64_t;

struct AssetRow {
  std::string uuid;
  std::int32_t savedType = 0;
  bool isVideo = false;
  bool incomplete = false;
  std::optional<double> modificationDate;  // seconds since the reference date
  std::optional<double> sortToken;
  std::optional<Coordinate> location;
};

// An asset with all that only an import, the camera or a dump handles.
struct WholeAssetRow {
  AssetRow asset;
  std::optional<double> creationDate;
  std::optional<std::string> originalFileName;
  std::string path;
  std::int64_t size = 0;
};

struct FaceRow {
  std::uint16_t identifier = 0;
  Rect relativeRect;
  std::optional<std::string> albumUUID;
};

struct AlbumRow {
  std::optional<std::string> uuid;
  std::int32_t kind = 0;
  std::optional<std::string> title;
  std::int32_t pendingType = 1;
  std::uint32_t pendingCount = 0;
  bool managed = true;
  friend bool operator==(const AlbumRow&, const AlbumRow&) = default;
};

enum class ListId : int { kAlbums = 1, kEvents = 2, kFaceAlbums = 3 };
inline constexpr int kListCount = 3;
// The list in which albums of the kind stand.
inline ListId listOfKind(std::int32_t kind) {
  if (kind == kKXAlbumKindSyncedEvent) return ListId::kEvents;
  return kind == kKXAlbumKindSyncedFaceAlbum ? ListId::kFaceAlbums : ListId::kAlbums;
}
inline bool isSyncedKind(std::int32_t kind) {
  return kind == kKXAlbumKindSyncedAlbum || kind == kKXAlbumKindSyncedEvent ||
         kind == kKXAlbumKindSyncedFaceAlbum;
}

class SqliteDatabase;
class SqliteStatement;
// Rows as the columns from `first` on hold them: uuid, saved_type, is_video, incomplete,
// modification_date, sort_token, latitude, longitude; identifier, x, y, width, height, album_uuid;
// uuid, kind, title, pending_type, pending_count, managed.
AssetRow readAssetRow(const SqliteStatement& row, int first);
FaceRow readFaceRow(const SqliteStatement& row, int first);
AlbumRow readAlbumRow(const SqliteStatement& row, int first);
// As the table has it now; null for an asset that is not there. Throws SqliteError.
std::optional<AssetRow> assetRow(SqliteDatabase& database, RowId pk);

// What all assets are related to, as the tables hold it: by asset, then row or album.
struct FaceOfAsset {
  RowId asset = 0;
  RowId pk = 0;
  FaceRow face;
};
struct AlbumOfAsset {
  RowId asset = 0;
  RowId album = 0;
};
struct RelationRows {
  std::vector<FaceOfAsset> faces;
  std::vector<AlbumOfAsset> albums;
};
// Each ends early when `wanted`, unless it is null, becomes false. They throw SqliteError.
std::vector<FaceOfAsset> readFaces(SqliteDatabase& database, const std::atomic<bool>* wanted);
std::vector<AlbumOfAsset> readMemberships(SqliteDatabase& database,
                                          const std::atomic<bool>* wanted);

// Which rows one committed transaction has touched, so that contexts can refresh them.
struct RowChanges {
  std::set<RowId> assets;  // their rows, faces or memberships
  std::set<RowId> deletedAssets;
  std::set<RowId> albums;
  std::set<RowId> deletedAlbums;
  bool lists = false;
};

}  // namespace kx
