#pragma once

#include <cstdint>
#include <future>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "client/BlockFailure.h"
#include "client/HostWork.h"
#include "client/KXSyncAssetGroup.h"
#include "client/Memberships.h"
#include "client/TransferList.h"
#include "platform/Platform.h"
#include "platform/foundation/OrderedMap.h"
#include "platform/sync/FRClient.h"
#include "platform/sync/SyncPaths.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

inline constexpr const char* kKXSyncRestoreContextRestoredFilesKey =
    "kKXSyncRestoreContextRestoredFilesKey";
inline constexpr const char* kKXSyncRestoreContextUseDatabaseKey =
    "kKXSyncRestoreContextUseDatabaseKey";
inline constexpr const char* kKXPhotoDataclass = "Photo";
inline constexpr std::int64_t kKXErrorNoSnapshot = -2;  // domain kBundleIdentifier

// Whether a failed transfer may still succeed: every error but those of domain "FRError" outside a
// fixed set of codes.
bool isRecoverableTransferError(const Error& error);

class DeviceAssets;

// The plug-in's principal class: syncs, restores and measures the device's photo library as the
// sync daemon asks. Threads: called on the daemon's plug-in queue, one call at a time, and
// destroyed there; it blocks that queue while the library works. Lifetime: the platform outlives
// it; it serves many syncs, and what belongs to one of them is dropped at its end. Errors:
// reconcileSync alone has any; InternalInconsistency for a call on the main thread.
class KXSyncClient final : public FRClient {
 public:
  using DeviceAlbumMap = OrderedMap<KXGenericAlbumPtr>;
  using SaveJobs = std::vector<KXSyncSaveJobPtr>;
  using AssetGroupMap = OrderedMap<std::shared_ptr<KXSyncAssetGroup>>;
  // UUID to path of the main file, of every asset whose files are not all present.
  using IncompletePaths = std::vector<std::pair<std::string, std::string>>;
  using FinishedBlock = KXSyncSaveJob::FinishedBlock;

  explicit KXSyncClient(Platform& platform);
  ~KXSyncClient() override;
  KXSyncClient(const KXSyncClient&) = delete;
  KXSyncClient& operator=(const KXSyncClient&) = delete;

  // What the daemon calls.
  bool respondsTo(FROperation operation) const override;
  StringList supportedDataclasses() override;
  std::string currentSyncAnchor() override;
  bool prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                    const ProgressCallback& progressCallback,
                                    ErrorPtr* error) override;
  bool reconcileSync(std::uint32_t syncType, const std::string& newAnchor,
                     const ProgressCallback& progressCallback, ErrorPtr* error) override;
  void syncEndedWithSuccess(bool success) override;
  void restoreEndedWithError(const ErrorPtr& error) override;
  std::vector<FRAssetPtr> outstandingAssetTransfers() override;
  void assetTransfer(const FRAssetPtr& asset, bool succeeded, const ErrorPtr& error) override;
  void assetTransferEndedWithSuccess(bool success) override;
  void pathsToBackup(StringList* pathsToBackup, StringList* pathsNotToBackup) override;
  Value installedAssetMetrics() override;

  // Everything below is internal to the plug-in; it is public so that each step can be tested.

  // Properties. Null stands for a field that is not set.
  const KXSAlbumPtr& masterAlbum() const { return masterAlbum_; }
  void setMasterAlbum(KXSAlbumPtr album) { masterAlbum_ = std::move(album); }
  std::shared_ptr<TransferList> outstandingAssets() const;
  void setOutstandingAssets(std::shared_ptr<TransferList> assets);
  const std::optional<SaveJobs>& outstandingSyncJobs() const { return outstandingSyncJobs_; }
  void setOutstandingSyncJobs(std::optional<SaveJobs> jobs);
  const KXSAssetMapPtr& uuidToKXSAsset() const { return uuidToKXSAsset_; }
  void setUuidToKXSAsset(KXSAssetMapPtr assets);
  const KXSLibraryChangeSnapshotPtr& libraryChangeSnapshot() const { return snapshot_; }
  void setLibraryChangeSnapshot(KXSLibraryChangeSnapshotPtr snapshot);
  const std::shared_ptr<AssetGroupMap>& restorePathToAssetGroup() const { return restoreGroups_; }
  void setRestorePathToAssetGroup(std::shared_ptr<AssetGroupMap> groups);
  bool isResync() const { return isResync_; }
  void setIsResync(bool isResync) { isResync_ = isResync; }

  // Other fields.
  const KXSItemMapPtr& albumsAndEvents() const { return albumsAndEvents_; }
  void setAlbumsAndEvents(KXSItemMapPtr items);
  const KXPhotoLibraryPtr& library() const { return library_; }
  const DispatchGroupPtr& libraryGroup() const { return libraryGroup_; }
  const std::optional<SortTokens>& assetUUIDtoSortToken() const { return sortTokens_; }
  const std::optional<OrderedMap<std::string>>& albumUUIDToObjectIDMap() const {
    return albumURIs_;
  }
  const std::optional<OrderedMap<unsigned>>& pendingAssetsPerContainer() const {
    return pendingAssetsPerContainer_;
  }
  const std::optional<Dictionary>& restoreContext() const { return restoreContext_; }
  void setRestoreContext(std::optional<Dictionary> context);
  bool syncRequested() const { return syncRequested_; }
  void setSyncRequested(bool requested) { syncRequested_ = requested; }
  double lastSyncJobsSaveTime() const { return lastSyncJobsSaveTime_; }
  bool isListeningToMemoryPressure() const { return memoryPressureSource_ != nullptr; }

  // Library lifecycle and the save-job queue.
  void _initializeLibrary();
  void _uninitializeLibrary();
  void _clearSyncState();
  void _enqueueSyncSaveJob(const KXSyncSaveJobPtr& job);
  void _enqueueRemoteSyncCleanupJobBeforeDate(std::optional<Date> date, FinishedBlock finished);
  double _timeSinceLastSave();
  void _saveOutstandingSyncJobs();
  // Made, with its directory, at the first call for the platform. Any thread.
  static const std::string& pathToRestoreContext(Platform& platform);

  // Reconciling. The operations with a group submit their work to the library under it and return.
  void _pullOutMasterAlbumFromAlbumsAndEvents();
  void _reconcileMetadata();
  void _reconcileAlbums(const DispatchGroupPtr& group);
  void _reconcileAssets(const DispatchGroupPtr& group);
  void _setPendingAlbumCounts(const DispatchGroupPtr& group);
  void _createAlbumUUIDToObjectIDMap(const DispatchGroupPtr& group);
  // The following ones run on the library's queue.
  // Null when the fetch failed.
  std::optional<DeviceAssets> _onDeviceAssetsByUUID();
  DeviceAlbumMap _onDeviceAlbumsByUUID();
  KXGenericAlbumPtr _addAlbumNamed(OptionalString name, std::string_view uuid,
                                   std::int32_t kindValue);
  void _reconcileDeviceAlbumListSortingWithAlbums(const DeviceAlbumMap& onDevice,
                                                  const KXSItemList& tesselAlbumOrder);
  // `indexes` ascending.
  void _reorderAlbumListProxy(KXManagedAlbumList& list, const std::vector<std::size_t>& indexes,
                              const std::vector<KXGenericAlbumPtr>& newOrder);
  void _persistAssetAlbumOrderStructures();
  // Null for null and for an album that is not on the device. Good until the map changes.
  const std::string* _albumURIForAlbumUUID(OptionalString uuid) const;
  void _incrementPendingCountForContainerUUID(const Value& uuid);
  // These two wait for the library's work, then submit theirs and return.
  void _clearPendingCounts();
  void _clearEmptySyncAlbums();

  // Transfers.
  void _initializeOutstandingAssets();
  void _syncAssetTransfer(const FRAssetPtr& request, bool succeeded, const ErrorPtr& error);
  void _cleanupAfterSyncOrRestoreWithError(const ErrorPtr& error);

  // Restore. Blocks until planned; sorted by path.
  std::vector<FRAssetPtr> _neededRestoreAssets();
  void _loadRestoreContext();
  void _writeRestoreContext();
  // On the library's queue.
  StringList _restorePathsFromIncompletePaths(const IncompletePaths& incomplete);
  StringList _restorePathsFromBackupList(const std::vector<QBFile>& backupList);
  std::vector<FRAssetPtr> _getAssetsToRestoreFromPaths(const StringList& paths);
  void _populateRestorePathToAssetGroupDictionary(const StringList& paths,
                                                  const IncompletePaths& uuidPaths);
  void _restoreAssetTransfer(const FRAssetPtr& request, bool succeeded, const ErrorPtr& error);

  // Memory pressure.
  void _startListeningToMemoryPressureEvents();
  void _stopListeningToMemoryPressureEvents();

  // Metrics. Counts of blocks of _fileSystemBlockSize bytes; the first two on a library's queue.
  std::uint64_t _assetCountInManagedObjectContext(KXManagedObjectContext& context, bool synced);
  std::uint64_t _imageFileBlockCountInManagedObjectContext(KXManagedObjectContext& context,
                                                           bool synced);
  std::uint64_t _extraFileBlockCount();
  StringList _allAssetDirectoryURLs();
  StringList _allAssetMetricBaseURLs();
  std::uint32_t _fileSystemBlockSize();

 private:
  struct AssetReconciliation;
  struct RestorePlan;

  void assertNotOnMainThread() const;

  // Reconcile driver.
  struct PreviousSnapshot {
    KXSLibraryChangeSnapshotPtr snapshot;  // null when there is none
    bool isTwin = false;                   // not decoded: its bytes are the new one's
  };
  KXSLibraryChangeSnapshotPtr decodeNewSnapshot(std::future<PreviousSnapshot>* previous,
                                                ErrorPtr* error, ErrorPtr* decoderError);
  void removeSyncUserAgentInfoFile(const std::string& path);
  PreviousSnapshot readPreviousSnapshot(const DataPtr& bytes);
  bool equalsPreviousSnapshot(const KXSLibraryChangeSnapshot& snapshot,
                              const PreviousSnapshot& previous,
                              std::optional<std::string>* libraryUUID);
  bool decideResync(OptionalString previousUUID, const KXSLibraryChangeSnapshot& snapshot);
  void startHostWork(const KXSLibraryChangeSnapshot& snapshot);
  void startHostWork();
  void reconcileSnapshot(const KXSLibraryChangeSnapshotPtr& snapshot, bool isResync);
  void writeDictionary(const std::string& path, Dictionary dictionary);
  Value readDictionary(const std::string& path);

  // Submission to the library under a group; nothing happens without a library.
  // Runs `submit`; what it throws, and what the blocks that it submits throw, goes to `failure`.
  void submitWatched(BlockFailure& failure, const Block& submit);
  void submitTransaction(const DispatchGroupPtr& group, Block block);
  void submitBlock(const DispatchGroupPtr& group, Block block);

  // Asset reconciliation.
  const KXSAssetMap& hostAssets() const;
  Memberships& memberships();
  void forgetMemberships();
  void reconcileAssetsInTransaction();
  void deleteAssets(AssetReconciliation& run);
  void requestNewAssets(AssetReconciliation& run);
  void updateAssets(AssetReconciliation& run);
  // Takes the asset away when it does.
  bool deleteAssetIfStale(std::string_view uuid, const KXSAsset& host, KXManagedAssetPtr& present);
  // By the host's asset's place.
  void updateSortToken(KXManagedAsset& device, std::size_t place);
  void updateLocation(KXManagedAsset& device, const KXSAsset& host);
  void updateFaces(KXManagedAsset& device, const KXSAsset& host);
  void updateAlbums(AssetReconciliation& run, std::size_t index, std::string_view uuid,
                    const KXManagedAssetPtr& device);
  void requestDownload(std::string_view uuid, const KXSAsset& host);

  // Album reconciliation.
  void reconcileAlbumsInTransaction();
  static DeviceAlbumMap onDeviceAlbumsByUUID(KXPhotoLibrary& library);
  std::vector<Value> deleteAlbums(DeviceAlbumMap& onDevice);
  bool deleteAlbum(DeviceAlbumMap& onDevice, std::string_view uuid);
  void removeFaceThumbnail(std::string_view uuid);
  void createAlbums(DeviceAlbumMap& onDevice, const std::vector<Value>& kept);
  void renameAndSortAlbums(const DeviceAlbumMap& onDevice, const std::vector<Value>& kept);

  // Pending counts.
  void countPendingAssets(const TransferList& outstanding);
  void setPendingCountsInTransaction();

  // Import.
  void giveUpSyncAsset(const FRAssetPtr& request, const ErrorPtr& error);
  KXSyncSaveJobPtr saveJobForRequest(const FRAsset& request);
  std::vector<std::string> albumURIsForAsset(std::string_view uuid, OptionalString eventUUID);

  // Restore.
  void planRestore(RestorePlan& plan);
  StringList restorePathsForPlan(RestorePlan& plan, const std::vector<QBFile>& backupList);
  StringList pathsOfFirstRestoreAttempt(RestorePlan& plan, const std::vector<QBFile>& backupList);
  void setRestorePendingCounts(bool usedBackupList);
  bool restoreUsesDatabase() const;
  StringList restoredFiles() const;
  void appendRestoredFiles(const StringList& paths);
  void judgeRestoreGroup(const std::shared_ptr<KXSyncAssetGroup>& group);

  Value measureAssets(KXManagedObjectContext& context);

  Platform& platform_;

  // Fields that live as long as the client, or as the link to the library.
  KXPhotoLibraryPtr library_;
  DispatchGroupPtr libraryGroup_;
  bool isResync_ = false;
  double lastSyncJobsSaveTime_ = 0.0;  // seconds since the reference date
  std::unique_ptr<MemoryPressureSource> memoryPressureSource_;

  // Fields of one sync or restore.
  KXSItemMapPtr albumsAndEvents_;  // less the master album
  KXSAlbumPtr masterAlbum_;
  mutable std::mutex outstandingAssetsMutex_;
  std::shared_ptr<TransferList> outstandingAssets_;
  std::optional<SaveJobs> outstandingSyncJobs_;
  KXSAssetMapPtr uuidToKXSAsset_;
  std::optional<OrderedMap<std::string>> albumURIs_;  // albumUUIDToObjectIDMap
  std::optional<SortTokens> sortTokens_;              // assetUUIDtoSortToken
  KXSLibraryChangeSnapshotPtr snapshot_;              // libraryChangeSnapshot
  std::optional<OrderedMap<unsigned>> pendingAssetsPerContainer_;
  HostWork hostWork_;  // what has not been taken yet of that for the last reconciliation
  std::shared_ptr<AssetGroupMap> restoreGroups_;  // restorePathToAssetGroup
  std::optional<Dictionary> restoreContext_;
  bool syncRequested_ = false;
  // Of uuidToKXSAsset_ and albumsAndEvents_, when first needed.
  std::optional<Memberships> memberships_;
  BlockFailure* blockFailure_ = nullptr;  // of the caller who waits for submitted blocks
};

}  // namespace kx
