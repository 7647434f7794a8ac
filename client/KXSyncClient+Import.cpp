#include "client/KXSyncClient.h"
#include "client/LogSource.h"
#include "platform/foundation/Text.h"
#include "records/TesselDates.h"

namespace kx {
namespace {

constexpr const char* kImportFunction = "_syncAssetTransfer";
constexpr const char* kMediaDirectory = "/var/mobile/Media";
constexpr double kSaveIntervalSeconds = 3.0;

double orZero(const std::optional<Number>& number) { return number ? number->doubleValue() : 0.0; }

std::string mediaPath(std::string_view path) {
  while (path.starts_with('/')) path.remove_prefix(1);
  return pathByAppending(kMediaDirectory, path);
}

Value arrayOf(const std::optional<ArrayView>& view) {
  if (!view) return Value();
  Array elements;
  elements.reserve(view->size());
  for (const Value& element : *view) elements.push_back(element);
  return Value::array(std::move(elements));
}

// For an asset without a record: in the order of the containers.
std::vector<std::string_view> albumsThatList(std::string_view asset, const KXSItemMap& containers) {
  std::vector<std::string_view> keys;
  for (const auto& entry : containers) {
    const auto* album = dynamic_cast<const KXSAlbum*>(entry.value.get());
    const std::optional<ArrayView> assets = album != nullptr ? album->assetUUIDs() : std::nullopt;
    if (!assets) continue;
    bool isListed = false;
    for (std::size_t i = 0; i < assets->size() && !isListed; ++i) {
      isListed = assets->stringAt(i, kKXSAlbumAssetUUIDsKey) == asset;
    }
    if (isListed) keys.push_back(entry.key.stringValue());
  }
  return keys;
}

}  // namespace

void KXSyncClient::_syncAssetTransfer(const FRAssetPtr& request, bool succeeded,
                                      const ErrorPtr& error) {
  KX_LOG(kClientSource, kImportFunction, LogLevel::kInfo,
         "Sync asset: %@   isAvailableAtPath: %@ success: %@ error: %@", request, request->path(),
         succeeded ? "YES" : "NO", error);
  if (error && !succeeded && !isRecoverableTransferError(*error)) {
    giveUpSyncAsset(request, error);
    return;
  }
  if (!succeeded) {
    KX_LOG(kClientSource, kImportFunction, LogLevel::kError, "Asset transfer was not successful!");
    return;
  }
  const std::shared_ptr<TransferList> outstanding = outstandingAssets();
  if (!outstanding || !outstanding->contains(request)) {
    KX_LOG(kClientSource, kImportFunction, LogLevel::kWarning,
           "Got transfer notification of unknown asset: %@", request);
    return;
  }
  if (!request->isDownload()) {
    KX_LOG(kClientSource, kImportFunction, LogLevel::kError,
           "Asset upload complete--erm...unsupported...how did this happen??");
    return;
  }
  if (!request->path()) {
    KX_LOG(kClientSource, kImportFunction, LogLevel::kError, "Asset with no path: %@, ignoring.",
           request);
    return;
  }
  const KXSyncSaveJobPtr job = saveJobForRequest(*request);
  KX_LOG(kClientSource, kImportFunction, LogLevel::kDebug, "Adding asset %@", job);
  _enqueueSyncSaveJob(job);
  if (_timeSinceLastSave() >= kSaveIntervalSeconds) _saveOutstandingSyncJobs();
  outstanding->remove(request);
}

void KXSyncClient::giveUpSyncAsset(const FRAssetPtr& request, const ErrorPtr& error) {
  KX_LOG(kClientSource, kImportFunction, LogLevel::kInfo,
         "Encountered unrecoverable error %@ for asset %@ during sync", error, request);
  if (const std::shared_ptr<TransferList> outstanding = outstandingAssets()) {
    outstanding->remove(request);
  }
  submitTransaction(libraryGroup_, [library = library_] {
    if (const KXGenericAlbumPtr progress = library->syncProgressAlbum()) {
      progress->reducePendingItemsCountBy(1);
    }
  });
}

KXSyncSaveJobPtr KXSyncClient::saveJobForRequest(const FRAsset& request) {
  // Without a record every field of it reads as absent.
  static const KXSAssetPtr kNoRecord = KXSAsset::initFromPropertyList(Value());
  const KXSAssetPtr* found =
      uuidToKXSAsset_ ? uuidToKXSAsset_->find(request.identifier()) : nullptr;
  const KXSAsset& host = found != nullptr ? **found : *kNoRecord;

  KXSyncSaveJobPtr job = platform_.sharedAssetsSaver().newSyncSaveJob();
  job->setOriginalAssetURL(mediaPath(*request.path()));
  job->setIsVideo(host.isVideo());
  job->setUuid(request.identifier());
  const Coordinate location{orZero(host.latitude()), orZero(host.longitude())};
  if (canUseCoordinate(location)) job->setLocation(location);
  job->setFacesInfo(arrayOf(host.facesInfo()));
  job->setCreationDate(dateWithTesselTimeInterval(host.exposureDate()));
  job->setModificationDate(dateWithTesselTimeInterval(host.modificationDate()));
  const double* token = sortTokens_ ? sortTokens_->find(request.identifier()) : nullptr;
  job->setSortToken(token != nullptr ? std::optional<double>(*token) : std::nullopt);
  if (const OptionalString name = host.originalFileName()) {
    job->setOriginalFileName(std::string(*name));
  }
  job->setAlbumURIs(albumURIsForAsset(request.identifier(), host.eventUUID()));
  return job;
}

std::vector<std::string> KXSyncClient::albumURIsForAsset(std::string_view uuid,
                                                         OptionalString eventUUID) {
  std::vector<std::string> uris;
  if (!albumsAndEvents_) return uris;
  KXSAssetMap::Cursor cursor;
  const std::vector<std::string_view> containers =
      hostAssets().find(uuid, cursor) != nullptr
          ? memberships().containersOf(cursor.place(), eventUUID)
          : albumsThatList(uuid, *albumsAndEvents_);
  for (const std::string_view container : containers) {
    const std::string* uri = _albumURIForAlbumUUID(container);
    if (uri != nullptr) uris.push_back(*uri);
  }
  return uris;
}

}  // namespace kx
