#include "client/KXSyncClient.h"
#include "client/LogSource.h"

namespace kx {
void KXSyncClient::syncEndedWithSuccess(bool success) {
  KX_LOG(kClientSource, "syncEndedWithSuccess", LogLevel::kInfo, "syncEndedWithSuccess %d",
         success ? 1 : 0);
  _stopListeningToMemoryPressureEvents();
}

void KXSyncClient::assetTransferEndedWithSuccess(bool success) {
  constexpr const char* kFunction = "assetTransferEndedWithSuccess";
  KX_LOG(kClientSource, kFunction, LogLevel::kInfo, "assetTransferEndedWithSuccess: %@",
         success ? "YES" : "NO");
  if (success) {
    const KXSyncSaveJobPtr job = platform_.sharedAssetsSaver().newSyncSaveJob();
    job->setIsSyncComplete(true);
    job->setOriginalAssetURL(kKXSnapshotPath);
    _enqueueSyncSaveJob(job);
  } else {
    KX_LOG(kClientSource, kFunction, LogLevel::kDebug,
           "========= Photos Sync did not end with success ======");
  }
  _cleanupAfterSyncOrRestoreWithError(nullptr);
}

void KXSyncClient::_cleanupAfterSyncOrRestoreWithError(const ErrorPtr& /*error*/) {
  KX_LOG(kClientSource, "_cleanupAfterSyncOrRestoreWithError", LogLevel::kInfo,
         "_cleanupAfterSyncOrRestore: _syncRequested=%@", syncRequested_ ? "YES" : "NO");
  const std::shared_ptr<TransferList> outstanding = outstandingAssets();
  const bool nothingOutstanding = !outstanding || outstanding->empty();
  if (!syncRequested_ && nothingOutstanding) {
    platform_.porterClient().finalizeOTARestoreRecreatingAlbums(!restoreUsesDatabase());
  }
  if (syncRequested_ && nothingOutstanding) {
    if (libraryGroup_) libraryGroup_->wait();
    _enqueueRemoteSyncCleanupJobBeforeDate(std::nullopt, nullptr);
  }
  _saveOutstandingSyncJobs();
  _clearPendingCounts();
  if (syncRequested_) _clearEmptySyncAlbums();
  _stopListeningToMemoryPressureEvents();
  _uninitializeLibrary();
  _clearSyncState();
}

}  // namespace kx
