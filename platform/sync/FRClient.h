#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/foundation/Error.h"
#include "platform/foundation/Value.h"
#include "platform/sync/FRAsset.h"

namespace kx {

class DownloadManager;
class HostLink;
class Platform;
class QBManager;

// The operations of a sync plug-in. Optional ones that a plug-in lacks are absent: respondsTo says
// false and the daemon does not call them (calling one all the same raises InternalInconsistency).
enum class FROperation {
  kSupportedDataclasses,
  kRegisterMessageHandlersWithLink,
  kCurrentSyncAnchor,
  kPrepareForSyncWithHostAnchor,
  kReconcileSync,
  kSyncEndedWithSuccess,
  kCancelSyncOperations,
  kReconcileRestoreWithError,
  kRestoreEndedWithError,
  kOutstandingAssetTransfers,
  kOutstandingAssetTransfersWithDownloadManager,
  kAssetTransfer,
  kAssetTransferUpdatedProgress,
  kMetadataUpdate,
  kAssetInstallFailed,
  kAssetInstallSucceeded,
  kAssetTransferEndedWithSuccess,
  kPrioritizeAsset,
  kPrepareForBackup,
  kBackupEnded,
  kPathsToBackup,
  kShouldRestoreFile,
  kShouldBackgroundRestorePath,
  kShouldBackgroundRestoreFile,
  kClearSyncData,
  kDisabledAssetTypes,
  kInstalledAssetMetrics,
};

using ProgressCallback = std::function<void(double fraction)>;
using StringList = std::vector<std::string>;

// A sync plug-in's principal class as the daemon sees it. The daemon calls it on one queue that is
// not the main thread, one call at a time, and destroys it there. Errors come back through
// out-parameters, which may be null; programming errors raise InternalInconsistency.
class FRClient {
 public:
  virtual ~FRClient() = default;

  virtual bool respondsTo(FROperation operation) const = 0;

  virtual StringList supportedDataclasses();
  virtual void registerMessageHandlersWithLink(HostLink& link);
  virtual std::string currentSyncAnchor();
  virtual bool prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                            const ProgressCallback& progressCallback,
                                            ErrorPtr* error);
  virtual bool reconcileSync(std::uint32_t syncType, const std::string& newAnchor,
                             const ProgressCallback& progressCallback, ErrorPtr* error);
  virtual void syncEndedWithSuccess(bool success);
  virtual void cancelSyncOperations();
  virtual bool reconcileRestoreWithError(ErrorPtr* error);
  virtual void restoreEndedWithError(const ErrorPtr& error);
  // The list itself may change at the next call into the plug-in: the daemon works over a copy.
  virtual std::vector<FRAssetPtr> outstandingAssetTransfers();
  virtual std::vector<FRAssetPtr> outstandingAssetTransfersWithDownloadManager(
      DownloadManager& manager);
  virtual void assetTransfer(const FRAssetPtr& asset, bool succeeded, const ErrorPtr& error);
  virtual void assetTransferUpdatedProgress(const FRAssetPtr& asset, double fraction);
  virtual void metadataUpdate(const Value& update, const FRAssetPtr& asset,
                              const std::string& newAnchor);
  virtual void assetInstallFailed(const FRAssetPtr& asset, const ErrorPtr& error);
  virtual void assetInstallSucceeded(const FRAssetPtr& asset);
  virtual void assetTransferEndedWithSuccess(bool success);
  virtual void prioritizeAsset(const FRAssetPtr& asset);
  virtual void prepareForBackup();
  virtual void backupEnded();
  // Null pointers are allowed: the caller does not want that list.
  virtual void pathsToBackup(StringList* pathsToBackup, StringList* pathsNotToBackup);
  virtual bool shouldRestoreFile(const std::string& path, QBManager& manager);
  virtual bool shouldBackgroundRestorePath(const std::string& path, QBManager& manager);
  virtual bool shouldBackgroundRestoreFile(const std::string& path, QBManager& manager);
  virtual void clearSyncData();
  virtual StringList disabledAssetTypes();
  virtual Value installedAssetMetrics();
};

inline constexpr std::uint32_t kFRInterfaceVersion = 1;

// The one entry point of a plug-in module, exported under the name below. Returns a new client that
// the daemon destroys with delete on its plug-in queue before the platform goes; null when the
// interface version is not the plug-in's. Never throws.
using FRPluginEntry = FRClient* (*)(Platform* platform, std::uint32_t interfaceVersion);
inline constexpr const char* kFRPluginEntryName = "kxsync_plugin_create_client";

}  // namespace kx
