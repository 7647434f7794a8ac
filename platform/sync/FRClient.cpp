#include "platform/sync/FRClient.h"

#include "platform/foundation/Exceptions.h"

namespace kx {
namespace {

[[noreturn]] void absent(const char* operation) {
  throw InternalInconsistency(std::string("the plug-in has no operation ") + operation);
}

}  // namespace

StringList FRClient::supportedDataclasses() { absent("supportedDataclasses"); }
void FRClient::registerMessageHandlersWithLink(HostLink&) {
  absent("registerMessageHandlersWithLink");
}
std::string FRClient::currentSyncAnchor() { absent("currentSyncAnchor"); }
bool FRClient::prepareForSyncWithHostAnchor(const std::string&, const ProgressCallback&,
                                            ErrorPtr*) {
  absent("prepareForSyncWithHostAnchor");
}
bool FRClient::reconcileSync(std::uint32_t, const std::string&, const ProgressCallback&,
                             ErrorPtr*) {
  absent("reconcileSync");
}
void FRClient::syncEndedWithSuccess(bool) { absent("syncEndedWithSuccess"); }
void FRClient::cancelSyncOperations() { absent("cancelSyncOperations"); }
bool FRClient::reconcileRestoreWithError(ErrorPtr*) { absent("reconcileRestoreWithError"); }
void FRClient::restoreEndedWithError(const ErrorPtr&) { absent("restoreEndedWithError"); }
std::vector<FRAssetPtr> FRClient::outstandingAssetTransfers() {
  absent("outstandingAssetTransfers");
}
std::vector<FRAssetPtr> FRClient::outstandingAssetTransfersWithDownloadManager(DownloadManager&) {
  absent("outstandingAssetTransfersWithDownloadManager");
}
void FRClient::assetTransfer(const FRAssetPtr&, bool, const ErrorPtr&) { absent("assetTransfer"); }
void FRClient::assetTransferUpdatedProgress(const FRAssetPtr&, double) {
  absent("assetTransferUpdatedProgress");
}
void FRClient::metadataUpdate(const Value&, const FRAssetPtr&, const std::string&) {
  absent("metadataUpdate");
}
void FRClient::assetInstallFailed(const FRAssetPtr&, const ErrorPtr&) {
  absent("assetInstallFailed");
}
void FRClient::assetInstallSucceeded(const FRAssetPtr&) { absent("assetInstallSucceeded"); }
void FRClient::assetTransferEndedWithSuccess(bool) { absent("assetTransferEndedWithSuccess"); }
void FRClient::prioritizeAsset(const FRAssetPtr&) { absent("prioritizeAsset"); }
void FRClient::prepareForBackup() { absent("prepareForBackup"); }
void FRClient::backupEnded() { absent("backupEnded"); }
void FRClient::pathsToBackup(StringList*, StringList*) { absent("pathsToBackup"); }
bool FRClient::shouldRestoreFile(const std::string&, QBManager&) { absent("shouldRestoreFile"); }
bool FRClient::shouldBackgroundRestorePath(const std::string&, QBManager&) {
  absent("shouldBackgroundRestorePath");
}
bool FRClient::shouldBackgroundRestoreFile(const std::string&, QBManager&) {
  absent("shouldBackgroundRestoreFile");
}
void FRClient::clearSyncData() { absent("clearSyncData"); }
StringList FRClient::disabledAssetTypes() { absent("disabledAssetTypes"); }
Value FRClient::installedAssetMetrics() { absent("installedAssetMetrics"); }

}  // namespace kx
