#include "client/KXSyncClient.h"

#include <atomic>
#include <exception>

#include "client/LogSource.h"
#include "platform/foundation/Exceptions.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr const char* kAnchor = "1";
constexpr const char* kRestoreContextFileName = "restoreContext.plist";
constexpr int kCleanupWaitSeconds = 28800;
constexpr double kCleanupMarginSeconds = 1.0;

// Shared by the one who waits for the clean-up and the completion, which may come late.
struct CleanupWait {
  DispatchSemaphore done{0};
  std::atomic<bool> succeeded{true};
};

}  // namespace

KXSyncClient::KXSyncClient(Platform& platform) : platform_(platform) {}

KXSyncClient::~KXSyncClient() {
  _uninitializeLibrary();
  _clearSyncState();
}

bool KXSyncClient::respondsTo(FROperation operation) const {
  switch (operation) {
    case FROperation::kSupportedDataclasses:
    case FROperation::kCurrentSyncAnchor:
    case FROperation::kPrepareForSyncWithHostAnchor:
    case FROperation::kReconcileSync:
    case FROperation::kSyncEndedWithSuccess:
    case FROperation::kRestoreEndedWithError:
    case FROperation::kOutstandingAssetTransfers:
    case FROperation::kAssetTransfer:
    case FROperation::kAssetTransferEndedWithSuccess:
    case FROperation::kPathsToBackup:
    case FROperation::kInstalledAssetMetrics:
      return true;
    default:
      return false;
  }
}

StringList KXSyncClient::supportedDataclasses() { return {kKXPhotoDataclass}; }

std::string KXSyncClient::currentSyncAnchor() { return kAnchor; }

void KXSyncClient::assertNotOnMainThread() const {
  if (platform_.isMainThread()) {
    throw InternalInconsistency("Ferrule plugins should only be run on a non-main-thread queue!");
  }
}

bool KXSyncClient::prepareForSyncWithHostAnchor(const std::string& /*hostAnchor*/,
                                                const ProgressCallback& /*progressCallback*/,
                                                ErrorPtr* /*error*/) {
  constexpr const char* kFunction = "prepareForSyncWithHostAnchor";
  assertNotOnMainThread();
  KX_LOG(kClientSource, kFunction, LogLevel::kDebug, "prepareForSyncWithHostAnchor");
  Clock& clock = platform_.clock();
  const double start = clock.absoluteTime();
  _startListeningToMemoryPressureEvents();
  KX_LOG(kClientSource, kFunction, LogLevel::kInfo, "Library before: %@", library_);
  _initializeLibrary();

  const auto wait = std::make_shared<CleanupWait>();
  const Date cutoff{clock.now().secondsSinceReference - kCleanupMarginSeconds};
  _enqueueRemoteSyncCleanupJobBeforeDate(cutoff, [wait](const ErrorPtr& error) {
    if (error) {
      KX_LOG(kClientSource, kFunction, LogLevel::kError,
             "prepareForSyncWithHostAnchor - error waiting for cleanup in quarryd: %@", error);
      wait->succeeded = false;
    }
    wait->done.signal();
  });
  _saveOutstandingSyncJobs();
  if (!clock.wait(wait->done, kCleanupWaitSeconds)) {
    KX_LOG(kClientSource, kFunction, LogLevel::kError,
           "prepareForSyncWithHostAnchor - timed out after waiting %d seconds for sync cleanup in "
           "quarryd",
           kCleanupWaitSeconds);
    wait->succeeded = false;
  }
  KX_LOG(kClientSource, kFunction, LogLevel::kDebug,
         "prepareForSyncWithHostAnchor - finished in %f seconds", clock.absoluteTime() - start);
  return wait->succeeded;
}

void KXSyncClient::_initializeLibrary() {
  KX_LOG(kClientSource, "_initializeLibrary", LogLevel::kInfo, "Initializing library");
  if (library_) {
    KX_LOG(kClientSource, "_initializeLibrary", LogLevel::kDebug, "_library is nonnil");
  } else {
    library_ = platform_.photoLibrary().newPhotoLibrary();
  }
  if (!libraryGroup_) libraryGroup_ = std::make_shared<DispatchGroup>();
}

void KXSyncClient::_uninitializeLibrary() {
  KX_LOG(kClientSource, "_uninitializeLibrary", LogLevel::kInfo, "Uninitializing library");
  if (libraryGroup_) {
    libraryGroup_->wait();
    libraryGroup_ = nullptr;
  }
  library_ = nullptr;
  KX_LOG(kClientSource, "_uninitializeLibrary", LogLevel::kInfo, "Done uninitializing library.");
}

void KXSyncClient::_clearSyncState() {
  KX_LOG(kClientSource, "_clearSyncState", LogLevel::kInfo, "Clearing sync state");
  _stopListeningToMemoryPressureEvents();
  setAlbumsAndEvents(nullptr);
  setUuidToKXSAsset(nullptr);
  snapshot_ = nullptr;
  setOutstandingAssets(nullptr);
  albumURIs_ = std::nullopt;
  masterAlbum_ = nullptr;
  sortTokens_ = std::nullopt;
  hostWork_ = {};
  restoreGroups_ = nullptr;
  restoreContext_ = std::nullopt;
  syncRequested_ = false;
  pendingAssetsPerContainer_ = std::nullopt;
  setOutstandingSyncJobs(std::nullopt);
}

std::shared_ptr<TransferList> KXSyncClient::outstandingAssets() const {
  std::lock_guard<std::mutex> lock(outstandingAssetsMutex_);
  return outstandingAssets_;
}

void KXSyncClient::setOutstandingAssets(std::shared_ptr<TransferList> assets) {
  // The old list is released after the lock.
  std::lock_guard<std::mutex> lock(outstandingAssetsMutex_);
  outstandingAssets_.swap(assets);
}

void KXSyncClient::setOutstandingSyncJobs(std::optional<SaveJobs> jobs) {
  outstandingSyncJobs_ = std::move(jobs);
}

void KXSyncClient::setUuidToKXSAsset(KXSAssetMapPtr assets) {
  uuidToKXSAsset_ = std::move(assets);
  forgetMemberships();
}

void KXSyncClient::setLibraryChangeSnapshot(KXSLibraryChangeSnapshotPtr snapshot) {
  snapshot_ = std::move(snapshot);
}

void KXSyncClient::setRestorePathToAssetGroup(std::shared_ptr<AssetGroupMap> groups) {
  restoreGroups_ = std::move(groups);
}

void KXSyncClient::setAlbumsAndEvents(KXSItemMapPtr items) {
  albumsAndEvents_ = std::move(items);
  forgetMemberships();
}

void KXSyncClient::setRestoreContext(std::optional<Dictionary> context) {
  restoreContext_ = std::move(context);
}

void KXSyncClient::_enqueueSyncSaveJob(const KXSyncSaveJobPtr& job) {
  if (!outstandingSyncJobs_) outstandingSyncJobs_.emplace();
  outstandingSyncJobs_->push_back(job);
}

void KXSyncClient::_enqueueRemoteSyncCleanupJobBeforeDate(std::optional<Date> date,
                                                          FinishedBlock finished) {
  KX_LOG(kClientSource, "_enqueueRemoteSyncCleanupJobBeforeDate", LogLevel::kInfo,
         "_enqueueRemoteSyncCleanupJob");
  const KXSyncSaveJobPtr job = platform_.sharedAssetsSaver().newSyncSaveJob();
  job->setCleanupSyncState(true);
  job->setCleanupBeforeDate(date);
  job->setFinishedBlock(std::move(finished));
  _enqueueSyncSaveJob(job);
}

double KXSyncClient::_timeSinceLastSave() {
  return platform_.clock().now().secondsSinceReference - lastSyncJobsSaveTime_;
}

void KXSyncClient::_saveOutstandingSyncJobs() {
  constexpr const char* kFunction = "_saveOutstandingSyncJobs";
  lastSyncJobsSaveTime_ = platform_.clock().now().secondsSinceReference;
  if (!outstandingSyncJobs_ || outstandingSyncJobs_->empty()) return;

  std::vector<DataPtr> serialized;
  serialized.reserve(outstandingSyncJobs_->size());
  for (const KXSyncSaveJobPtr& job : *outstandingSyncJobs_) {
    if (DataPtr data = job->serializedData()) serialized.push_back(std::move(data));
  }
  SaveJobs jobs = std::move(*outstandingSyncJobs_);
  outstandingSyncJobs_->clear();

  // The completion may come when this client is gone: it holds all that it needs.
  const DispatchGroupPtr group = libraryGroup_;
  if (group) group->enter();
  KX_LOG(kClientSource, kFunction, LogLevel::kInfo,
         "_saveOutstandingSyncJobs: about to call saveSyncedAssets");
  platform_.sharedAssetsSaver().saveSyncedAssets(
      std::move(serialized),
      [group, jobs = std::move(jobs)](std::size_t /*imported*/, const ErrorPtr& outcome) {
        KX_LOG(kClientSource, kFunction, LogLevel::kInfo,
               "_saveOutstandingSyncJobs: completed call to saveSyncedAssets");
        if (group) group->leave();
        for (const KXSyncSaveJobPtr& job : jobs) {
          if (job->finishedBlock()) job->finishedBlock()(outcome);
        }
      });
}

const std::string& KXSyncClient::pathToRestoreContext(Platform& platform) {
  return platform.once().value<std::string>("KXSyncClient.pathToRestoreContext", [&platform] {
    const std::string directory = platform.photoLibrary().photoDataCachesDirectory();
    if (!platform.files().fileExists(directory)) {
      platform.files().createDirectoryWithIntermediates(directory, nullptr);
    }
    return pathByAppending(directory, kRestoreContextFileName);
  });
}

void KXSyncClient::submitWatched(BlockFailure& failure, const Block& submit) {
  blockFailure_ = &failure;
  try {
    submit();
  } catch (...) {
    failure.noteOfSubmitter(std::current_exception());
  }
  blockFailure_ = nullptr;
}

void KXSyncClient::submitTransaction(const DispatchGroupPtr& group, Block block) {
  if (!library_) return;
  if (blockFailure_ != nullptr) block = blockFailure_->guard(std::move(block));
  library_->withDispatchGroupPerformTransaction(group, std::move(block));
}

void KXSyncClient::submitBlock(const DispatchGroupPtr& group, Block block) {
  if (!library_) return;
  if (blockFailure_ != nullptr) block = blockFailure_->guard(std::move(block));
  library_->withDispatchGroupPerformBlock(group, std::move(block));
}

}  // namespace kx
