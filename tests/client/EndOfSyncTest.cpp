#include <algorithm>
#include <thread>

#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class EndOfSyncTest : public ClientTest {
 protected:
  static SnapshotBuilder plainSnapshot() {
    return SnapshotBuilder()
        .asset("A")
        .asset("B")
        .album("AL", "Trip", {"B", "A"})
        .album("EMPTY", "Empty", {})
        .masterAlbum({"A", "B"});
  }
  std::size_t cleanUps() {
    std::size_t count = 0;
    for (const auto& job : platform.saver.jobs()) count += job.cleanupSyncState ? 1 : 0;
    return count;
  }
};

TEST_F(EndOfSyncTest, TheMetadataEndOnlyStopsListening) {
  ASSERT_TRUE(prepare());
  ASSERT_TRUE(reconcile(plainSnapshot()));
  platform.captured.clear();
  client->syncEndedWithSuccess(false);
  EXPECT_EQ(platform.captured.texts(), (Texts{"syncEndedWithSuccess 0"}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "syncEndedWithSuccess 0"));
  EXPECT_FALSE(client->isListeningToMemoryPressure());
  EXPECT_NE(client->library(), nullptr);
  EXPECT_NE(client->libraryChangeSnapshot(), nullptr);
  client->syncEndedWithSuccess(true);
  EXPECT_TRUE(logged(LogLevel::kInfo, "syncEndedWithSuccess 1"));
}

TEST_F(EndOfSyncTest, ASuccessIsSealedWithOneJobAndCleanedUp) {
  ASSERT_TRUE(prepare());
  ASSERT_TRUE(reconcile(plainSnapshot()));
  arriveAll();
  platform.captured.clear();
  client->assetTransferEndedWithSuccess(true);
  std::vector<KXSyncSaveJob::Fields> seals;
  for (const auto& job : platform.saver.jobs()) {
    if (job.isSyncComplete) seals.push_back(job);
  }
  ASSERT_EQ(seals.size(), 1U);
  EXPECT_EQ(seals[0].originalAssetPath, "/var/mobile/Media/Photos/Sync/PhotoLibrary.plist");
  EXPECT_EQ(cleanUps(), 2U);
  EXPECT_EQ(platform.saver.jobs().back().cleanupBeforeDate, std::nullopt);
  EXPECT_EQ(client->library(), nullptr);
  EXPECT_EQ(client->libraryChangeSnapshot(), nullptr);
  EXPECT_FALSE(client->syncRequested());
  EXPECT_TRUE(platform.porter.finalizations().empty());
  EXPECT_EQ(albums(), "Trip[B A]");
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t1 n0");
  EXPECT_TRUE(platform.memoryFiles.fileExists(KXPreviousMetadataSyncFilePath));
}

TEST_F(EndOfSyncTest, TheCleanUpLogsItsStepsInOrder) {
  ASSERT_TRUE(prepare());
  ASSERT_TRUE(reconcile(plainSnapshot()));
  arriveAll();
  platform.captured.clear();
  client->assetTransferEndedWithSuccess(true);
  Texts onPluginQueue = platform.captured.texts();
  const auto place = [all = onPluginQueue](const char* text) {
    return std::find(all.begin(), all.end(), text) - all.begin();
  };
  // Each step waits for the library's work of the one before.
  EXPECT_LT(place("_saveOutstandingSyncJobs: completed call to saveSyncedAssets"),
            place("_clearPendingCounts: _syncRequested=YES"));
  EXPECT_LT(place("_clearPendingCounts completed"), place("_clearEmptySyncAlbums completed"));
  EXPECT_LT(place("_clearEmptySyncAlbums completed"), place("Done uninitializing library."));
  // What other queues log may come between.
  for (const char* text :
       {"_saveOutstandingSyncJobs: completed call to saveSyncedAssets",
        "_clearPendingCounts: _syncRequested=YES", "_clearPendingCounts completed",
        "_clearEmptySyncAlbums deleting empty album <KXManagedAlbum: EMPTY \"Empty\">",
        "_clearEmptySyncAlbums completed"}) {
    EXPECT_TRUE(logged(LogLevel::kInfo, text)) << text;
    std::erase(onPluginQueue, text);
  }
  EXPECT_EQ(
      onPluginQueue,
      (Texts{"assetTransferEndedWithSuccess: YES", "_cleanupAfterSyncOrRestore: _syncRequested=YES",
             "_enqueueRemoteSyncCleanupJob",
             "_saveOutstandingSyncJobs: about to call saveSyncedAssets", "_clearEmptySyncAlbums",
             "Uninitializing library", "Done uninitializing library.", "Clearing sync state"}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "assetTransferEndedWithSuccess: YES"));
  EXPECT_TRUE(logged(LogLevel::kInfo, "_cleanupAfterSyncOrRestore: _syncRequested=YES"));
}

TEST_F(EndOfSyncTest, AFailureCleansUpWithoutASeal) {
  ASSERT_TRUE(prepare());
  ASSERT_TRUE(reconcile(plainSnapshot()));
  arrive(request("A"));
  client->assetTransferEndedWithSuccess(false);
  EXPECT_TRUE(logged(LogLevel::kInfo, "assetTransferEndedWithSuccess: NO"));
  EXPECT_TRUE(logged(LogLevel::kDebug, "========= Photos Sync did not end with success ======"));
  for (const auto& job : platform.saver.jobs()) EXPECT_FALSE(job.isSyncComplete);
  EXPECT_EQ(client->library(), nullptr);
  EXPECT_EQ(assets(), "A");
  EXPECT_FALSE(platform.memoryFiles.fileExists(KXPreviousMetadataSyncFilePath));
}

TEST_F(EndOfSyncTest, AnOutstandingTransferLeavesTheRemoteCleanUpUndone) {
  ASSERT_TRUE(prepare());
  ASSERT_TRUE(reconcile(plainSnapshot()));
  arrive(request("A"));
  client->assetTransfer(request("B"), false, frError(7));
  client->assetTransferEndedWithSuccess(false);
  EXPECT_EQ(cleanUps(), 1U);  // that of prepare
  EXPECT_EQ(albums(), "Trip[A]");
  EXPECT_EQ(assets(), "A");
  EXPECT_EQ(client->library(), nullptr);
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t1 n0");
}

TEST_F(EndOfSyncTest, ARestoreIsFinalizedByWhereItsListCameFrom) {
  struct Row {
    const char* description;
    std::optional<Dictionary> context;
    bool recreate;
  };
  const std::vector<Row> rows = {
      {"no context", std::nullopt, true},
      {"no key", Dictionary(), true},
      {"false", Dictionary({{kKXSyncRestoreContextUseDatabaseKey, Value::boolean(false)}}), true},
      {"true", Dictionary({{kKXSyncRestoreContextUseDatabaseKey, Value::boolean(true)}}), false},
      {"no number", Dictionary({{kKXSyncRestoreContextUseDatabaseKey, Value::string("1")}}), true}};
  std::vector<bool> expected;
  for (const Row& row : rows) {
    SCOPED_TRACE(row.description);
    client->setRestoreContext(row.context);
    client->_cleanupAfterSyncOrRestoreWithError(nullptr);
    expected.push_back(row.recreate);
    EXPECT_EQ(platform.porter.finalizations(), expected);
  }
  EXPECT_EQ(cleanUps(), 0U);
  EXPECT_TRUE(logged(LogLevel::kInfo, "_cleanupAfterSyncOrRestore: _syncRequested=NO"));
  EXPECT_TRUE(loggedBy("_clearEmptySyncAlbums").empty());
}

TEST_F(EndOfSyncTest, ARestoreWithFilesMissingIsNotFinalized) {
  platform.backup.paths = {"/var/mobile/Media/DCIM/100AB/1.JPG"};
  EXPECT_EQ(client->outstandingAssetTransfers().size(), 1U);
  client->assetTransferEndedWithSuccess(false);
  EXPECT_TRUE(platform.porter.finalizations().empty());
  EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t1 n0");
}

TEST_F(EndOfSyncTest, TheEndCallsStandAnyOrderAndRepetition) {
  const SnapshotBuilder snapshot = plainSnapshot();
  const std::vector<std::string> orders = {"ts", "st", "tt", "ss", "tsts", "stst", "ttss"};
  for (const std::string& order : orders) {
    SCOPED_TRACE(order);
    ASSERT_TRUE(prepare());
    ASSERT_TRUE(reconcile(snapshot));
    arriveAll();
    for (const char call : order) {
      if (call == 't') {
        client->assetTransferEndedWithSuccess(true);
      } else {
        client->syncEndedWithSuccess(true);
      }
    }
    client->assetTransferEndedWithSuccess(true);
    EXPECT_EQ(client->library(), nullptr);
    EXPECT_EQ(client->outstandingAssets(), nullptr);
    EXPECT_FALSE(client->isListeningToMemoryPressure());
    EXPECT_EQ(albums(), "Trip[B A]");
    EXPECT_EQ(assets(), "A B");
  }
}

TEST_F(EndOfSyncTest, TheEndCallsStandAFreshClient) {
  client->syncEndedWithSuccess(true);
  client->syncEndedWithSuccess(false);
  client->assetTransferEndedWithSuccess(false);
  client->assetTransferEndedWithSuccess(true);
  client->restoreEndedWithError(nullptr);
  drain();
  EXPECT_EQ(client->library(), nullptr);
  EXPECT_EQ(platform.library.rowsWritten(), 0U);
  EXPECT_EQ(platform.library.openedLibraries(), 0U);
}

TEST_F(EndOfSyncTest, TheEndWaitsForTheBatchInFlight) {
  ASSERT_TRUE(prepare());
  ASSERT_TRUE(reconcile(plainSnapshot()));
  arriveAll();
  client->assetTransferEndedWithSuccess(true);
  // Nothing had to be drained: the assets are there when the call returns.
  EXPECT_EQ(assets(), "A B");
  EXPECT_TRUE(platform.library.blockExceptions().empty());
}

TEST_F(EndOfSyncTest, TheRemoteCleanUpIsAskedForAfterTheLibrarysEarlierWork) {
  ASSERT_TRUE(prepare());
  ASSERT_TRUE(reconcile(plainSnapshot()));
  arriveAll();
  platform.captured.clear();
  const DispatchGroupPtr group = client->libraryGroup();
  group->enter();
  std::thread work([&] {
    while (!logged(LogLevel::kInfo, "_cleanupAfterSyncOrRestore: _syncRequested=YES")) {
      std::this_thread::yield();
    }
    // Long enough for an end that does not wait to be past its clean-up.
    for (int i = 0; i < 100; ++i) platform.library.perform([](InMemoryLibraryState&) {});
    KX_LOG("Test", "work", LogLevel::kInfo, "earlier work is done");
    group->leave();
  });
  client->assetTransferEndedWithSuccess(true);
  work.join();
  const Texts texts = platform.captured.texts();
  EXPECT_LT(std::find(texts.begin(), texts.end(), "earlier work is done"),
            std::find(texts.begin(), texts.end(), "_enqueueRemoteSyncCleanupJob"));
}

TEST_F(EndOfSyncTest, ASecondSyncDoesNothing) {
  const SnapshotBuilder snapshot = plainSnapshot();
  wholeSync(snapshot);
  const std::size_t rows = platform.library.rowsWritten();
  platform.captured.clear();
  wholeSync(snapshot);
  EXPECT_TRUE(logged(LogLevel::kDebug, "NULL PHOTO SYNC DETECTED - NO RECONCILING NEEDED"));
  EXPECT_EQ(platform.library.rowsWritten(), rows);
  EXPECT_EQ(albums(), "Trip[B A]");
}

}  // namespace
}  // namespace kx
