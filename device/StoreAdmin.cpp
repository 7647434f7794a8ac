#include "device/StoreAdmin.h"

#include <cmath>

#include "device/DeviceErrors.h"
#include "device/DeviceLibrary.h"

namespace kx {
namespace {

std::optional<double> secondsOf(const std::optional<Date>& date) {
  if (!date) return std::nullopt;
  return date->secondsSinceReference;
}

bool isFinite(const std::optional<double>& number) { return !number || std::isfinite(*number); }

bool isFinite(const NewDeviceAsset& asset) {
  bool finite = isFinite(secondsOf(asset.creationDate)) &&
                isFinite(secondsOf(asset.modificationDate)) && isFinite(asset.sortToken);
  if (asset.location) {
    finite = finite && std::isfinite(asset.location->latitude) &&
             std::isfinite(asset.location->longitude);
  }
  for (const DeviceFace& face : asset.faces) {
    finite = finite && std::isfinite(face.relativeRect.x) && std::isfinite(face.relativeRect.y) &&
             std::isfinite(face.relativeRect.width) && std::isfinite(face.relativeRect.height);
  }
  return finite;
}

RowId assetRow(SqliteDatabase& database, const std::string& uuid) {
  SqliteStatement row(database, "SELECT pk FROM assets WHERE uuid = ?");
  row.text(uuid);
  if (!row.step()) {
    throw DeviceFailure(deviceError(DeviceError::kMissing, "there is no asset " + uuid));
  }
  return row.integerAt(0);
}

}  // namespace

bool StoreAdmin::write(const LibraryStore::Work& work, ErrorPtr* error) {
  ErrorPtr failure;
  store_->queue().sync([&] { failure = store_->write(work); });
  if (!failure) return true;
  setError(error, std::move(failure));
  return false;
}

bool StoreAdmin::addAsset(const NewDeviceAsset& asset, ErrorPtr* error) {
  if (DeviceRoot::checkPath(asset.path) != 0) {
    setError(error, deviceError(DeviceError::kBadFile, asset.path + " is no device path"));
    return false;
  }
  if (!isFinite(asset)) {
    setError(error, deviceError(DeviceError::kBadFile, asset.uuid + " has a number that is none"));
    return false;
  }
  WholeAssetRow row;
  row.asset = {asset.uuid,
               asset.savedAssetType,
               asset.isVideo,
               asset.incomplete,
               secondsOf(asset.modificationDate),
               asset.sortToken,
               asset.location};
  row.creationDate = secondsOf(asset.creationDate);
  row.originalFileName = asset.originalFileName;
  row.path = asset.path;
  struct stat status;
  if (root_->status(asset.path, &status) == 0) row.size = status.st_size;
  return write(
      [&](LibraryWriter& writer) {
        const RowId pk = writer.insertAsset(row);
        if (asset.originalFileSize) writer.setOriginalFileSize(pk, *asset.originalFileSize);
        for (const std::int64_t bytes : asset.sidecarSizes) writer.insertSidecar(pk, bytes);
        for (std::size_t i = 0; i < asset.files.size(); ++i) {
          writer.insertAssetFile(pk, static_cast<std::int64_t>(i), asset.files[i]);
        }
        for (const DeviceFace& face : asset.faces) {
          writer.insertFace(store_->newFaceId(), pk,
                            {face.identifier, face.relativeRect, face.albumUUID});
        }
      },
      error);
}

bool StoreAdmin::addAlbum(const NewDeviceAlbum& album, ErrorPtr* error) {
  AlbumRow row;
  row.uuid = album.uuid;
  row.kind = album.kind;
  row.title = album.title;
  row.pendingType = album.pendingItemsType;
  row.pendingCount = album.pendingItemsCount;
  row.managed = album.managed;
  return write(
      [&](LibraryWriter& writer) {
        const RowId pk = store_->newAlbumId();
        const ListId list = listOfKind(album.kind);
        writer.insertAlbum(pk, row, album.inList ? std::optional(list) : std::nullopt);
        if (album.inList && album.index) writer.moveInList(list, pk, *album.index);
        std::int64_t position = 0;
        for (const std::string& uuid : album.assets) {
          writer.appendMembership(pk, assetRow(writer.database(), uuid), position++);
        }
        // The user's doing is none of a sync's changes.
        writer.changes() = {};
      },
      error);
}

bool StoreAdmin::removeAsset(const std::string& uuid, ErrorPtr* error) {
  return write(
      [&](LibraryWriter& writer) { writer.deleteAsset(assetRow(writer.database(), uuid)); }, error);
}

bool StoreAdmin::setAssetFields(KXPhotoLibrary& library, const std::string& uuid,
                                const DeviceAssetFields& fields) {
  auto* const own = dynamic_cast<DeviceLibrary*>(&library);
  if (own == nullptr) return false;
  const std::shared_ptr<StoredAsset> asset = own->context().assetWithUUID(uuid);
  if (!asset) return false;
  asset->setFields(fields);
  return true;
}

}  // namespace kx
