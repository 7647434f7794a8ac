#include "client/KXSyncClient.h"
#include "client/LogSource.h"
#include "platform/foundation/TextNumbers.h"

namespace kx {
namespace {

bool isAtRest(const KXGenericAlbum& album) {
  return album.pendingItemsType() == kKXPendingItemsNone && album.pendingItemsCount() == 0;
}

void putToRest(KXGenericAlbum& album) {
  album.setPendingItemsType(kKXPendingItemsNone);
  album.setPendingItemsCount(0);
}

// Leaves an album that is at rest untouched, so that the transaction does not write it.
void putToRestIfNeeded(const KXGenericAlbumPtr& album) {
  if (album && !isAtRest(*album)) putToRest(*album);
}

void setPendingCount(const KXGenericAlbumPtr& album, unsigned count) {
  constexpr const char* kFunction = "_setPendingAlbumCounts";
  if (count == 0) {
    putToRestIfNeeded(album);
    return;
  }
  const auto text = [&album](std::string (KXGenericAlbum::*read)() const) {
    return album ? std::optional<std::string>((*album.*read)()) : std::nullopt;
  };
  KX_LOG(kClientSource, kFunction, LogLevel::kInfo,
         "Album: %@ (%@,%@) id=%@ pendingItemsCount=%lu CD_ID=%@",
         text(&KXGenericAlbum::localizedTitle), text(&KXGenericAlbum::className),
         text(&KXGenericAlbum::_kindDescription), album ? album->uuid() : OptionalString(),
         album ? album->pendingItemsCount() : 0U, text(&KXGenericAlbum::shortObjectIDURI));
  KX_LOG(kClientSource, kFunction, LogLevel::kInfo, "     Setting pendingItemsCount to be %lu",
         count);
  if (!album) return;
  album->setPendingItemsCount(count);
  album->setPendingItemsType(kKXPendingItemsSync);
}

}  // namespace

void KXSyncClient::_incrementPendingCountForContainerUUID(const Value& uuid) {
  if (!pendingAssetsPerContainer_) return;
  if (unsigned* count = pendingAssetsPerContainer_->find(uuid.stringValue())) {
    ++*count;
  } else {
    pendingAssetsPerContainer_->set(uuid, 1U);
  }
}

void KXSyncClient::_setPendingAlbumCounts(const DispatchGroupPtr& group) {
  if (!pendingAssetsPerContainer_) pendingAssetsPerContainer_.emplace();
  submitTransaction(group, [this] { setPendingCountsInTransaction(); });
}

void KXSyncClient::setPendingCountsInTransaction() {
  const std::shared_ptr<TransferList> outstanding = outstandingAssets();
  if (outstanding) countPendingAssets(*outstanding);
  const DeviceAlbumMap onDevice = _onDeviceAlbumsByUUID();
  for (const auto& entry : *pendingAssetsPerContainer_) {
    const KXGenericAlbumPtr* album = onDevice.find(entry.key.stringValue());
    setPendingCount(album != nullptr ? *album : nullptr, entry.value);
  }
  if (const KXGenericAlbumPtr progress = library_->syncProgressAlbum()) {
    progress->setPendingItemsCount(
        static_cast<std::uint32_t>(outstanding ? outstanding->size() : 0));
    progress->setPendingItemsType(kKXPendingItemsSync);
  }
}

void KXSyncClient::countPendingAssets(const TransferList& outstanding) {
  // Each identifier once, the empty one never.
  TextNumbers identifiers(outstanding.size());
  for (const FRAssetPtr& request : outstanding) {
    if (!request->identifier().empty()) identifiers.add(request->identifier());
  }
  if (identifiers.empty() || !albumsAndEvents_) return;

  for (const std::string_view identifier : identifiers.texts()) {
    const KXSAssetPtr* asset = uuidToKXSAsset_ ? uuidToKXSAsset_->find(identifier) : nullptr;
    const OptionalString event = asset != nullptr ? (*asset)->eventUUID() : OptionalString();
    if (!event || event->empty()) continue;
    const KXSItemPtr* record = albumsAndEvents_->find(*event);
    if (record == nullptr || dynamic_cast<const KXSEvent*>(record->get()) == nullptr) continue;
    _incrementPendingCountForContainerUUID(Value::string(*event));
  }
  for (const auto& entry : *albumsAndEvents_) {
    const auto* album = dynamic_cast<const KXSAlbum*>(entry.value.get());
    if (album == nullptr) continue;
    const std::optional<ArrayView> assets = album->assetUUIDs();
    if (!assets) continue;
    for (std::size_t i = 0; i < assets->size(); ++i) {
      if (identifiers.contains(*assets->stringAt(i, kKXSAlbumAssetUUIDsKey))) {
        _incrementPendingCountForContainerUUID(entry.key);
      }
    }
  }
}

// The blocks of the two clean-up operations hold all that they need: the client does not wait.
void KXSyncClient::_clearPendingCounts() {
  constexpr const char* kFunction = "_clearPendingCounts";
  if (libraryGroup_) libraryGroup_->wait();
  submitTransaction(libraryGroup_, [library = library_, syncRequested = syncRequested_] {
    KX_LOG(kClientSource, kFunction, LogLevel::kInfo, "_clearPendingCounts: _syncRequested=%@",
           syncRequested ? "YES" : "NO");
    if (syncRequested) {
      for (const auto& entry : onDeviceAlbumsByUUID(*library)) putToRestIfNeeded(entry.value);
      if (const KXGenericAlbumPtr progress = library->syncProgressAlbum()) putToRest(*progress);
    } else {
      putToRestIfNeeded(library->shoeboxAlbum());
      putToRestIfNeeded(library->otaRestoreProgressAlbum());
    }
    KX_LOG(kClientSource, kFunction, LogLevel::kInfo, "_clearPendingCounts completed");
  });
}

void KXSyncClient::_clearEmptySyncAlbums() {
  constexpr const char* kFunction = "_clearEmptySyncAlbums";
  KX_LOG(kClientSource, kFunction, LogLevel::kInfo, "_clearEmptySyncAlbums");
  if (libraryGroup_) libraryGroup_->wait();
  submitTransaction(libraryGroup_, [library = library_] {
    const auto albums = library->managedObjectContext().fetchEmptyAlbums(
        {kKXAlbumKindSyncedAlbum, kKXAlbumKindSyncedEvent}, nullptr);
    if (albums) {
      for (const KXGenericAlbumPtr& album : *albums) {
        KX_LOG(kClientSource, kFunction, LogLevel::kInfo,
               "_clearEmptySyncAlbums deleting empty album %@", album);
        album->deleteObject();
      }
    }
    KX_LOG(kClientSource, kFunction, LogLevel::kInfo, "_clearEmptySyncAlbums completed");
  });
}

}  // namespace kx
