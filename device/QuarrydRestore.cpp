#include <algorithm>
#include <cerrno>
#include <unordered_map>
#include <unordered_set>

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/LibraryReturn.h"
#include "device/Quarryd.h"
#include "platform/foundation/Text.h"
#include "platform/library/KXPhotoLibrary.h"

namespace kx {
namespace {

// Every file that the library knows, with the asset's row.
std::unordered_map<std::string, RowId> rowsByPath(SqliteDatabase& database) {
  std::unordered_map<std::string, RowId> rows;
  SqliteStatement file(database,
                       "SELECT path, pk FROM assets UNION ALL SELECT path, asset FROM asset_files");
  while (file.step()) rows.emplace(file.textAt(0), file.integerAt(1));
  return rows;
}

RowId insertCameraAsset(LibraryWriter& writer, const CameraAsset& asset) {
  WholeAssetRow row;
  row.asset.uuid = UUIDString();
  row.asset.isVideo = asset.isVideo;
  row.asset.location = asset.place;
  if (asset.modificationDate) {
    row.asset.modificationDate = asset.modificationDate->secondsSinceReference;
  }
  if (asset.creationDate) row.creationDate = asset.creationDate->secondsSinceReference;
  row.path = asset.files.front().path;
  row.size = asset.files.front().size;
  row.originalFileName = std::string(lastPathComponent(row.path));
  const RowId pk = writer.insertAsset(row);
  writer.setOriginalFileSize(pk, row.size);
  for (std::size_t i = 1; i < asset.files.size(); ++i) {
    if (i == 1) writer.insertAssetFile(pk, 0, row.path);
    writer.insertAssetFile(pk, static_cast<std::int64_t>(i), asset.files[i].path);
    writer.insertSidecar(pk, asset.files[i].size);
  }
  writer.changes().importedAssets.insert(row.asset.uuid);
  return pk;
}

// An album without an identifier counts as there when one of its kind and title is.
bool isThere(SqliteDatabase& database, const RestoredAlbum& album) {
  if (album.uuid) {
    SqliteStatement row(database, "SELECT 1 FROM albums WHERE uuid = ?");
    row.text(*album.uuid);
    return row.step();
  }
  SqliteStatement row(database,
                      "SELECT 1 FROM albums WHERE uuid IS NULL AND role IS NULL AND kind = ? AND "
                      "title IS ?");
  row.integer(album.kind).optionalText(album.title);
  return row.step();
}

}  // namespace

void Quarryd::updateRestoredAsset(std::optional<std::string> uuid, std::vector<std::string> paths) {
  if (!uuid || uuid->empty() || paths.empty()) return;
  {
    const std::lock_guard<std::mutex> lock(restoredMutex_);
    restored_.push_back(std::move(*uuid));
  }
  // Whatever has been told of by then is one transaction.
  work_->async([this] {
    std::vector<std::string> uuids;
    {
      const std::lock_guard<std::mutex> lock(restoredMutex_);
      uuids.swap(restored_);
    }
    static_cast<void>(completeAssets(uuids));  // a failure is in the device's health
  });
}

ErrorPtr Quarryd::completeAssets(const std::vector<std::string>& uuids) {
  if (uuids.empty()) return nullptr;
  ErrorPtr failure;
  LibraryStore& store = *parts_.store;
  const auto isThere = [this](const std::string& path, std::int64_t size) {
    struct stat status;
    return parts_.root->status(path, &status) == 0 && S_ISREG(status.st_mode) &&
           status.st_size > 0 && (size == 0 || status.st_size == size);
  };
  store.queue().sync([&] {
    try {
      std::vector<RowId> whole;
      for (const std::string& uuid : uuids) {
        SqliteStatement row(store.database(),
                            "SELECT a.pk, coalesce(f.path, a.path), "
                            "CASE WHEN coalesce(f.path, a.path) = a.path THEN a.size ELSE 0 END "
                            "FROM assets a LEFT JOIN asset_files f ON f.asset = a.pk "
                            "WHERE a.uuid = ? AND a.incomplete = 1");
        row.text(uuid);
        RowId pk = 0;
        bool allThere = true;
        while (allThere && row.step()) {
          pk = row.integerAt(0);
          allThere = isThere(row.textAt(1), row.integerAt(2));
        }
        if (pk != 0 && allThere) whole.push_back(pk);
      }
      if (whole.empty()) return;
      DeviceAssetFields complete;
      complete.incomplete = false;
      failure = store.write([&](LibraryWriter& writer) {
        for (const RowId pk : whole) writer.updateAsset(pk, complete);
      });
    } catch (const SqliteError& error) {
      failure = error.asError();
      store.health().noteFailure("restored assets cannot be looked up", failure);
    }
  });
  return failure;
}

void Quarryd::finalizeRestore(bool recreateAlbums) {
  work_->async([this, recreateAlbums] {
    try {
      endRestore(recreateAlbums);
    } catch (const std::exception& exception) {
      parts_.store->health().noteFailure("a restore cannot be ended",
                                         deviceError(DeviceError::kIo, exception.what()));
    }
  });
}

// The marker goes last: until then the next restore of that backup comes here again.
void Quarryd::endRestore(bool recreateAlbums) {
  const std::optional<RestoreMarker> marker = readRestoreMarker(*parts_.root);
  if (!marker) return;
  std::vector<std::string> incomplete;
  parts_.store->queue().sync([&] {
    SqliteStatement row(parts_.store->database(),
                        "SELECT uuid FROM assets WHERE incomplete = 1 ORDER BY pk");
    while (row.step()) incomplete.push_back(row.textAt(0));
  });
  if (completeAssets(incomplete)) return;
  if (recreateAlbums && registerCameraFiles(marker->albums)) return;
  ErrorPtr failure;
  parts_.store->queue().sync([&] { failure = forgetLibraryReturn(*parts_.store); });
  if (failure) return;
  for (const char* path : {device_paths::kRestoreContext, device_paths::kRestoreMarker}) {
    const int failed = parts_.root->remove(path);
    if (failed == 0 || failed == ENOENT) continue;
    parts_.store->health().noteFailure("a restore cannot be ended",
                                       systemError("cannot remove", path, failed));
    return;
  }
}

std::vector<CameraAsset> Quarryd::unknownCameraAssets() {
  std::unordered_set<std::string> known;
  parts_.store->queue().sync([&] {
    for (const auto& [path, pk] : rowsByPath(parts_.store->database())) known.insert(path);
  });
  return findCameraAssets(*parts_.root, files_, known, parts_.store->log());
}

ErrorPtr Quarryd::registerCameraFiles(const std::vector<RestoredAlbum>& albums) {
  const std::vector<CameraAsset> found = unknownCameraAssets();
  ErrorPtr failure;
  LibraryStore& store = *parts_.store;
  store.queue().sync([&] {
    std::vector<const RestoredAlbum*> missing;
    for (const RestoredAlbum& album : albums) {
      if (!isSyncedKind(album.kind) && !isThere(store.database(), album)) {
        missing.push_back(&album);
      }
    }
    if (found.empty() && missing.empty()) return;
    failure = store.write([&](LibraryWriter& writer) {
      for (const CameraAsset& asset : found) insertCameraAsset(writer, asset);
      if (missing.empty()) return;
      const auto rows = rowsByPath(writer.database());
      for (const RestoredAlbum* album : missing) recreateAlbum(writer, *album, rows);
    });
  });
  return failure;
}

void Quarryd::recreateAlbum(LibraryWriter& writer, const RestoredAlbum& album,
                            const std::unordered_map<std::string, RowId>& rows) {
  AlbumRow row;
  row.uuid = album.uuid;
  row.kind = album.kind;
  row.title = album.title;
  const RowId pk = parts_.store->newAlbumId();
  writer.insertAlbum(pk, row, album.list);
  writer.moveInList(album.list, pk, album.position);
  std::int64_t position = 0;
  for (const std::string& path : album.members) {
    const auto asset = rows.find(path);
    if (asset != rows.end()) writer.appendMembership(pk, asset->second, position++);
  }
  writer.changes().createdContainers.insert(album.uuid.value_or(std::to_string(pk)));
}

}  // namespace kx
