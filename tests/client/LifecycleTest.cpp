#include <thread>

#include "platform/foundation/Exceptions.h"
#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class LifecycleTest : public ClientTest {};

TEST_F(LifecycleTest, ServesPhotosWithAConstantAnchor) {
  EXPECT_EQ(client->supportedDataclasses(), (StringList{"Photo"}));
  EXPECT_EQ(client->currentSyncAnchor(), "1");
  EXPECT_FALSE(client->reconcileSync(1, "7", {}, nullptr));
  EXPECT_EQ(client->currentSyncAnchor(), "1");
  wholeSync(SnapshotBuilder().asset("A"));
  EXPECT_EQ(client->currentSyncAnchor(), "1");
}

TEST_F(LifecycleTest, RespondsToItsOperationsAndNoOther) {
  const std::vector<FROperation> absent = {
      FROperation::kRegisterMessageHandlersWithLink,
      FROperation::kCancelSyncOperations,
      FROperation::kReconcileRestoreWithError,
      FROperation::kOutstandingAssetTransfersWithDownloadManager,
      FROperation::kAssetTransferUpdatedProgress,
      FROperation::kMetadataUpdate,
      FROperation::kAssetInstallFailed,
      FROperation::kAssetInstallSucceeded,
      FROperation::kPrioritizeAsset,
      FROperation::kPrepareForBackup,
      FROperation::kBackupEnded,
      FROperation::kShouldRestoreFile,
      FROperation::kShouldBackgroundRestorePath,
      FROperation::kShouldBackgroundRestoreFile,
      FROperation::kClearSyncData,
      FROperation::kDisabledAssetTypes};
  for (const FROperation operation : absent) EXPECT_FALSE(client->respondsTo(operation));
  const std::vector<FROperation> present = {
      FROperation::kSupportedDataclasses,          FROperation::kCurrentSyncAnchor,
      FROperation::kPrepareForSyncWithHostAnchor,  FROperation::kReconcileSync,
      FROperation::kSyncEndedWithSuccess,          FROperation::kRestoreEndedWithError,
      FROperation::kOutstandingAssetTransfers,     FROperation::kAssetTransfer,
      FROperation::kAssetTransferEndedWithSuccess, FROperation::kPathsToBackup,
      FROperation::kInstalledAssetMetrics};
  for (const FROperation operation : present) EXPECT_TRUE(client->respondsTo(operation));
  EXPECT_THROW(client->clearSyncData(), InternalInconsistency);
}

TEST_F(LifecycleTest, PrepareLogsANullLibraryOnAFreshClientAndOpensIt) {
  EXPECT_EQ(client->library(), nullptr);
  EXPECT_TRUE(prepare());
  EXPECT_TRUE(logged(LogLevel::kInfo, "Library before: (null)"));
  EXPECT_NE(client->library(), nullptr);
  EXPECT_NE(client->libraryGroup(), nullptr);
  EXPECT_TRUE(client->isListeningToMemoryPressure());
}

TEST_F(LifecycleTest, PrepareLogsItsStepsInOrder) {
  EXPECT_TRUE(prepare());
  Texts texts = platform.captured.texts();
  std::erase(texts, "_saveOutstandingSyncJobs: completed call to saveSyncedAssets");
  EXPECT_EQ(texts, (Texts{"prepareForSyncWithHostAnchor", "Library before: (null)",
                          "Initializing library", "_enqueueRemoteSyncCleanupJob",
                          "_saveOutstandingSyncJobs: about to call saveSyncedAssets",
                          "prepareForSyncWithHostAnchor - finished in 0.000000 seconds"}));
  EXPECT_TRUE(logged(LogLevel::kDebug, "prepareForSyncWithHostAnchor"));
  EXPECT_TRUE(logged(LogLevel::kInfo, "_enqueueRemoteSyncCleanupJob"));
  EXPECT_TRUE(
      logged(LogLevel::kDebug, "prepareForSyncWithHostAnchor - finished in 0.000000 seconds"));
  EXPECT_EQ(platform.captured.firstWithPrefix("Library before").source, kSource);
  EXPECT_EQ(platform.captured.firstWithPrefix("Library before").function,
            "prepareForSyncWithHostAnchor");
  EXPECT_EQ(platform.captured.firstWithPrefix("Library before").facility, kBundleIdentifier);
}

TEST_F(LifecycleTest, PrepareAsksForACleanUpOfWhatIsOlderThanASecond) {
  platform.fakeClock.setNow(Date{5000.0});
  EXPECT_TRUE(prepare());
  const auto jobs = platform.saver.jobs();
  ASSERT_EQ(jobs.size(), 1U);
  EXPECT_TRUE(jobs[0].cleanupSyncState);
  EXPECT_EQ(jobs[0].cleanupBeforeDate, Date{4999.0});
  EXPECT_FALSE(jobs[0].isSyncComplete);
}

TEST_F(LifecycleTest, PrepareOnTheMainThreadRaises) {
  platform.onMainThread = true;
  try {
    prepare();
    FAIL() << "no exception";
  } catch (const InternalInconsistency& exception) {
    EXPECT_STREQ(exception.what(),
                 "Ferrule plugins should only be run on a non-main-thread queue!");
  }
  EXPECT_TRUE(platform.captured.texts().empty());
}

TEST_F(LifecycleTest, ACleanUpErrorMakesPrepareFalseAfterTheWait) {
  platform.saver.failNextBatch(Error::make("quarryd", 12, "busy"));
  ErrorPtr error;
  EXPECT_FALSE(client->prepareForSyncWithHostAnchor("1", {}, &error));
  EXPECT_EQ(error, nullptr);
  EXPECT_TRUE(logged(LogLevel::kError,
                     "prepareForSyncWithHostAnchor - error waiting for cleanup in quarryd: Error "
                     "Domain=quarryd Code=12 \"busy\""));
  EXPECT_TRUE(
      logged(LogLevel::kDebug, "prepareForSyncWithHostAnchor - finished in 0.000000 seconds"));
  drain();
  EXPECT_TRUE(prepare());
}

TEST_F(LifecycleTest, PrepareTimesOutAfterEightHours) {
  platform.saver.hold();
  bool prepared = true;
  std::thread daemon([&] { prepared = prepare(); });
  platform.fakeClock.awaitWaiters(1);
  platform.fakeClock.advance(28799.0);
  platform.fakeClock.advance(1.0);
  daemon.join();
  EXPECT_FALSE(prepared);
  EXPECT_TRUE(logged(LogLevel::kError,
                     "prepareForSyncWithHostAnchor - timed out after waiting 28800 seconds for "
                     "sync cleanup in quarryd"));
  EXPECT_TRUE(
      logged(LogLevel::kDebug, "prepareForSyncWithHostAnchor - finished in 28800.000000 seconds"));
  platform.saver.release();
}

TEST_F(LifecycleTest, ALateCleanUpCompletionMeetsNoOne) {
  platform.saver.hold();
  platform.fakeClock.setTimeOutAtOnce(true);
  platform.saver.failNextBatch(Error::make("quarryd", 1));
  EXPECT_FALSE(prepare());
  std::thread daemon([&] { client = nullptr; });  // waits for the batch in flight
  platform.saver.release();
  daemon.join();
  drain();
  EXPECT_TRUE(logged(LogLevel::kError,
                     "prepareForSyncWithHostAnchor - error waiting for cleanup in quarryd: Error "
                     "Domain=quarryd Code=1"));
}

TEST_F(LifecycleTest, ASecondInitialisationKeepsTheLibrary) {
  client->_initializeLibrary();
  const KXPhotoLibraryPtr first = client->library();
  const DispatchGroupPtr group = client->libraryGroup();
  EXPECT_FALSE(logged(LogLevel::kDebug, "_library is nonnil"));
  client->_initializeLibrary();
  EXPECT_EQ(client->library(), first);
  EXPECT_EQ(client->libraryGroup(), group);
  EXPECT_EQ(platform.captured.count(LogLevel::kInfo, "Initializing library"), 2U);
  EXPECT_EQ(platform.captured.count(LogLevel::kDebug, "_library is nonnil"), 1U);
}

TEST_F(LifecycleTest, UninitialisingReleasesTheLibraryAfterItsWork) {
  client->_initializeLibrary();
  bool ran = false;
  client->library()->withDispatchGroupPerformBlock(client->libraryGroup(), [&] { ran = true; });
  client->_uninitializeLibrary();
  EXPECT_TRUE(ran);
  EXPECT_EQ(client->library(), nullptr);
  EXPECT_EQ(client->libraryGroup(), nullptr);
  drain();
  EXPECT_EQ(platform.library.openLibraries(), 0U);
  EXPECT_EQ(loggedBy("_uninitializeLibrary"),
            (Texts{"Uninitializing library", "Done uninitializing library."}));
}

TEST_F(LifecycleTest, ClearingAFreshClientOnlyLogs) {
  client->_clearSyncState();
  EXPECT_EQ(platform.captured.texts(), (Texts{"Clearing sync state"}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Clearing sync state"));
}

TEST_F(LifecycleTest, ClearingDropsThePerSyncFieldsAndKeepsTheOthers) {
  knowLibrary("OTHER");
  ASSERT_TRUE(
      reconcile(SnapshotBuilder().asset("A").album("AL", "Trip", {"A"}).masterAlbum({"A"})));
  client->_enqueueSyncSaveJob(std::make_shared<KXSyncSaveJob>());
  client->_startListeningToMemoryPressureEvents();
  platform.fakeClock.advance(5);
  const double saved = client->lastSyncJobsSaveTime();
  EXPECT_NE(client->masterAlbum(), nullptr);
  EXPECT_TRUE(client->isResync());
  client->_clearSyncState();
  EXPECT_EQ(client->albumsAndEvents(), nullptr);
  EXPECT_EQ(client->masterAlbum(), nullptr);
  EXPECT_EQ(client->uuidToKXSAsset(), nullptr);
  EXPECT_EQ(client->libraryChangeSnapshot(), nullptr);
  EXPECT_EQ(client->outstandingAssets(), nullptr);
  EXPECT_FALSE(client->albumUUIDToObjectIDMap().has_value());
  EXPECT_FALSE(client->assetUUIDtoSortToken().has_value());
  EXPECT_FALSE(client->pendingAssetsPerContainer().has_value());
  EXPECT_EQ(client->restorePathToAssetGroup(), nullptr);
  EXPECT_FALSE(client->restoreContext().has_value());
  EXPECT_FALSE(client->outstandingSyncJobs().has_value());
  EXPECT_FALSE(client->syncRequested());
  EXPECT_FALSE(client->isListeningToMemoryPressure());
  EXPECT_EQ(platform.memoryPressure.listening(), 0U);
  EXPECT_TRUE(client->isResync());
  EXPECT_EQ(client->lastSyncJobsSaveTime(), saved);
  EXPECT_NE(client->library(), nullptr);
  EXPECT_NE(client->libraryGroup(), nullptr);
}

TEST_F(LifecycleTest, DestructionClosesTheLibraryAndClears) {
  EXPECT_TRUE(prepare());
  platform.captured.clear();
  client = nullptr;
  EXPECT_EQ(
      platform.captured.texts(),
      (Texts{"Uninitializing library", "Done uninitializing library.", "Clearing sync state"}));
  drain();
  EXPECT_EQ(platform.library.openLibraries(), 0U);
  EXPECT_EQ(platform.memoryPressure.listening(), 0U);
}

TEST_F(LifecycleTest, SavingNothingOnlyRestartsTheInterval) {
  client->_initializeLibrary();
  platform.fakeClock.setNow(Date{1234.5});
  EXPECT_EQ(client->lastSyncJobsSaveTime(), 0.0);
  EXPECT_EQ(client->_timeSinceLastSave(), 1234.5);
  client->_saveOutstandingSyncJobs();
  EXPECT_EQ(client->lastSyncJobsSaveTime(), 1234.5);
  EXPECT_EQ(client->_timeSinceLastSave(), 0.0);
  EXPECT_TRUE(platform.saver.batches().empty());
  EXPECT_TRUE(loggedBy("_saveOutstandingSyncJobs").empty());
  client->libraryGroup()->wait();  // was not entered
}

TEST_F(LifecycleTest, ABatchHandsOverEveryJobThatHasAForm) {
  client->_initializeLibrary();
  platform.saver.failSerialization(1);
  Texts finished;
  for (const char* name : {"formless", "plain", "last"}) {
    const KXSyncSaveJobPtr job = platform.saver.newSyncSaveJob();
    job->setUuid(name);
    job->setFinishedBlock([&finished, name](const ErrorPtr& error) {
      finished.push_back(std::string(name) + (error ? " failed" : " ok"));
    });
    client->_enqueueSyncSaveJob(job);
  }
  platform.saver.failNextBatch(Error::make("quarryd", 3));
  client->_saveOutstandingSyncJobs();
  EXPECT_TRUE(client->outstandingSyncJobs()->empty());
  client->libraryGroup()->wait();
  drain();
  const auto jobs = platform.saver.jobs();
  ASSERT_EQ(jobs.size(), 2U);
  EXPECT_EQ(jobs[0].uuid, "plain");
  EXPECT_EQ(jobs[1].uuid, "last");
  EXPECT_EQ(finished, (Texts{"formless failed", "plain failed", "last failed"}));
  EXPECT_EQ(loggedBy("_saveOutstandingSyncJobs"),
            (Texts{"_saveOutstandingSyncJobs: about to call saveSyncedAssets",
                   "_saveOutstandingSyncJobs: completed call to saveSyncedAssets"}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "_saveOutstandingSyncJobs: about to call saveSyncedAssets"));
  EXPECT_TRUE(
      logged(LogLevel::kInfo, "_saveOutstandingSyncJobs: completed call to saveSyncedAssets"));
}

TEST_F(LifecycleTest, ABatchWithoutLibraryGroupIsSavedAllTheSame) {
  bool finished = false;
  const KXSyncSaveJobPtr job = platform.saver.newSyncSaveJob();
  job->setFinishedBlock([&finished](const ErrorPtr&) { finished = true; });
  client->_enqueueSyncSaveJob(job);
  client->_saveOutstandingSyncJobs();
  drain();
  EXPECT_TRUE(finished);
}

TEST_F(LifecycleTest, JobsQueuedAfterAnEndGoWithTheNextCleanUp) {
  const KXSyncSaveJobPtr job = platform.saver.newSyncSaveJob();
  job->setUuid("EARLY");
  client->_enqueueSyncSaveJob(job);
  EXPECT_TRUE(prepare());
  const auto batches = platform.saver.batches();
  ASSERT_EQ(batches.size(), 1U);
  ASSERT_EQ(batches[0].size(), 2U);
  EXPECT_EQ(batches[0][0].uuid, "EARLY");
  EXPECT_TRUE(batches[0][1].cleanupSyncState);
}

TEST_F(LifecycleTest, TheRestoreContextPathIsMadeOncePerPlatform) {
  const std::string caches = platform.library.photoDataCachesDirectory();
  EXPECT_FALSE(platform.memoryFiles.fileExists(caches));
  const std::string* first = &KXSyncClient::pathToRestoreContext(platform);
  EXPECT_EQ(*first, caches + "/restoreContext.plist");
  EXPECT_TRUE(platform.memoryFiles.fileExists(caches));
  platform.memoryFiles.removeItem(caches, nullptr);
  EXPECT_EQ(&KXSyncClient::pathToRestoreContext(platform), first);
  EXPECT_FALSE(platform.memoryFiles.fileExists(caches));
}

TEST_F(LifecycleTest, AFailureToMakeTheCachesDirectoryIsIgnored) {
  platform.faultyFiles.setFault([](std::string_view operation, const std::string&) {
    return operation == "createDirectoryWithIntermediates" ? posixError(28) : nullptr;
  });
  EXPECT_EQ(KXSyncClient::pathToRestoreContext(platform),
            platform.library.photoDataCachesDirectory() + "/restoreContext.plist");
}

}  // namespace
}  // namespace kx
