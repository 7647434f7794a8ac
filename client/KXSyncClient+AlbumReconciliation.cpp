#include <cerrno>
#include <unordered_set>

#include "client/KXSyncClient.h"
#include "client/LogSource.h"
#include "platform/foundation/Text.h"
#include "records/KXSFolder.h"

namespace kx {
namespace {

constexpr const char* kReconcileAlbums = "_reconcileAlbums";
constexpr const char* kThumbnailExtension = ".JPG";
constexpr std::int64_t kFaceAlbumSubclass = 3;
constexpr std::int64_t kEventAlbumSubclass = 4;

const std::vector<int>& syncedKinds() {
  static const std::vector<int> kKinds = {kKXAlbumKindSyncedAlbum, kKXAlbumKindSyncedEvent,
                                          kKXAlbumKindSyncedFaceAlbum};
  return kKinds;
}

// What the device container of a snapshot record is to be.
struct ContainerForm {
  std::int32_t kind = kKXAlbumKindSyncedEvent;
  OptionalString name;
};

ContainerForm formOf(const KXSItem& record) {
  if (const auto* album = dynamic_cast<const KXSAlbum*>(&record)) {
    const std::optional<Number> number = album->albumSubclass();
    const std::int64_t subclass = number ? number->int64Value() : 0;
    std::int32_t kind = kKXAlbumKindSyncedAlbum;
    if (subclass == kFaceAlbumSubclass) kind = kKXAlbumKindSyncedFaceAlbum;
    if (subclass == kEventAlbumSubclass) kind = kKXAlbumKindSyncedEvent;
    return {kind, album->name()};
  }
  if (const auto* event = dynamic_cast<const KXSEvent*>(&record)) {
    return {kKXAlbumKindSyncedEvent, event->name()};
  }
  return {kKXAlbumKindSyncedEvent, std::nullopt};
}

// Null when the record has no name at all; otherwise its name, which may be null.
std::optional<OptionalString> nameOf(const KXSItem& record) {
  if (const auto* album = dynamic_cast<const KXSAlbum*>(&record)) return album->name();
  if (const auto* event = dynamic_cast<const KXSEvent*>(&record)) return event->name();
  if (const auto* folder = dynamic_cast<const KXSFolder*>(&record)) return folder->name();
  return std::nullopt;
}

}  // namespace

KXSyncClient::DeviceAlbumMap KXSyncClient::_onDeviceAlbumsByUUID() {
  return onDeviceAlbumsByUUID(*library_);
}

KXSyncClient::DeviceAlbumMap KXSyncClient::onDeviceAlbumsByUUID(KXPhotoLibrary& library) {
  const std::vector<KXGenericAlbumPtr> albums = library.albumsOfKinds(syncedKinds());
  DeviceAlbumMap map;
  map.reserve(albums.size());
  for (const KXGenericAlbumPtr& album : albums) {
    if (const OptionalString uuid = album->uuid()) map.set(*uuid, album);
  }
  return map;
}

KXGenericAlbumPtr KXSyncClient::_addAlbumNamed(OptionalString name, std::string_view uuid,
                                               std::int32_t kindValue) {
  KXGenericAlbumPtr album;
  if (kindValue == kKXAlbumKindSyncedEvent) {
    album = library_->insertNewSyncedEvent();
  } else if (kindValue == kKXAlbumKindSyncedFaceAlbum) {
    album = library_->insertNewFaceAlbum();
  } else {
    album = library_->insertNewAlbum();
  }
  if (!album) return nullptr;
  album->setTitle(name);
  album->setUuid(uuid);
  album->setKindValue(kindValue);
  album->setPendingItemsType(kKXPendingItemsSync);
  album->setPendingItemsCount(0);
  return album;
}

void KXSyncClient::_reconcileAlbums(const DispatchGroupPtr& group) {
  submitTransaction(group, [this] { reconcileAlbumsInTransaction(); });
}

void KXSyncClient::reconcileAlbumsInTransaction() {
  KX_LOG(kClientSource, kReconcileAlbums, LogLevel::kInfo, "Transaction for album reconciliation");
  DeviceAlbumMap onDevice = _onDeviceAlbumsByUUID();
  std::vector<Value> kept = deleteAlbums(onDevice);
  createAlbums(onDevice, kept);
  static const KXSItemList kNoOrder;
  const bool hasOrder = snapshot_ && snapshot_->orderedAlbums();
  _reconcileDeviceAlbumListSortingWithAlbums(onDevice,
                                             hasOrder ? *snapshot_->orderedAlbums() : kNoOrder);
  _persistAssetAlbumOrderStructures();
  if (!isResync_) renameAndSortAlbums(onDevice, kept);
}

// Deletes what the host no longer has, everything in a resync, and returns the identifiers that
// were on the device before and still are.
std::vector<Value> KXSyncClient::deleteAlbums(DeviceAlbumMap& onDevice) {
  std::vector<Value> doomed;
  std::vector<Value> kept;
  for (const auto& entry : onDevice) {
    const bool atHost = albumsAndEvents_ && albumsAndEvents_->contains(entry.key.stringValue());
    (isResync_ || !atHost ? doomed : kept).push_back(entry.key);
  }
  for (const Value& uuid : doomed) {
    if (!deleteAlbum(onDevice, uuid.stringValue())) kept.push_back(uuid);
  }
  return kept;
}

// False when the album has to stay.
bool KXSyncClient::deleteAlbum(DeviceAlbumMap& onDevice, std::string_view uuid) {
  const KXGenericAlbumPtr album = *onDevice.find(uuid);
  KXManagedAlbum* const managed = album->asManagedAlbum();
  if (managed == nullptr) {
    KX_LOG(kClientSource, kReconcileAlbums, LogLevel::kError,
           "can't delete album because it's not of type %@", KXManagedAlbum::kClassName);
    return false;
  }
  if (managed->kindValue() == kKXAlbumKindSyncedFaceAlbum) {
    if (const OptionalString own = managed->uuid()) removeFaceThumbnail(*own);
  }
  onDevice.remove(uuid);
  managed->deleteObject();
  return true;
}

void KXSyncClient::removeFaceThumbnail(std::string_view uuid) {
  const std::string name = std::string(uuid) + kThumbnailExtension;
  const std::string path =
      pathByAppending(platform_.photoLibrary().tesselSyncedFaceAlbumThumbnailsDirectory(), name);
  ErrorPtr error;
  if (name.find('/') != std::string::npos) {
    // The identifier came from a host: it must not lead out of the directory.
    error = Error::make(kPosixErrorDomain, EINVAL, "not a file name");
  } else if (platform_.files().removeItem(path, &error)) {
    return;
  }
  if (!error) return;
  KX_LOG(kClientSource, kReconcileAlbums, LogLevel::kWarning,
         "Could not remove face thumbnail at path %@ Error: %@", path, error);
}

void KXSyncClient::createAlbums(DeviceAlbumMap& onDevice, const std::vector<Value>& kept) {
  if (!albumsAndEvents_) return;
  std::unordered_set<std::string_view> present;
  for (const Value& uuid : kept) present.insert(uuid.stringValue());
  for (const auto& entry : *albumsAndEvents_) {
    if (!isResync_ && present.contains(entry.key.stringValue())) continue;
    if (!entry.value) continue;
    const KXSItem& record = *entry.value;
    const ContainerForm form = formOf(record);
    const OptionalString uuid = record.uuid();
    KX_LOG(kClientSource, kReconcileAlbums, LogLevel::kInfo,
           "Creating managed album with name %@, uuid: %@, kind: %d!", form.name, uuid, form.kind);
    const KXGenericAlbumPtr album =
        _addAlbumNamed(form.name, uuid.value_or(std::string_view()), form.kind);
    if (!album) continue;
    if (const OptionalString own = album->uuid()) onDevice.set(*own, album);
  }
}

void KXSyncClient::renameAndSortAlbums(const DeviceAlbumMap& onDevice,
                                       const std::vector<Value>& kept) {
  if (!albumsAndEvents_) return;
  for (const Value& uuid : kept) {
    const KXGenericAlbumPtr* album = onDevice.find(uuid.stringValue());
    const KXSItemPtr* record = albumsAndEvents_->find(uuid.stringValue());
    if (album == nullptr || record == nullptr) continue;
    const std::optional<OptionalString> name = nameOf(**record);
    if (name && *name != (*album)->title()) {
      KX_LOG(kClientSource, kReconcileAlbums, LogLevel::kInfo, "Updating album %@ to have title %@",
             *album, *name);
      (*album)->setTitle(*name);
    }
    if (KXManagedAlbum* const managed = (*album)->asManagedAlbum()) {
      managed->sortAssetsUsingTesselAlbumOrder();
    }
  }
}

}  // namespace kx
