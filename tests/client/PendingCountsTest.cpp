#include <thread>

#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class PendingCountsTest : public ClientTest {
 protected:
  static SnapshotBuilder::Asset inEvent(const std::string& uuid, const std::string& event) {
    SnapshotBuilder::Asset asset;
    asset.uuid = uuid;
    asset.eventUUID = event;
    return asset;
  }
  std::vector<std::pair<std::string, unsigned>> counts() {
    std::vector<std::pair<std::string, unsigned>> all;
    for (const auto& entry : *client->pendingAssetsPerContainer()) {
      all.emplace_back(entry.key.stringValue(), entry.value);
    }
    return all;
  }
  using Counts = std::vector<std::pair<std::string, unsigned>>;
  void SetUp() override { knowLibrary(); }
};

TEST_F(PendingCountsTest, NothingOutstandingTouchesNoContainer) {
  addSynced("A");
  addAlbum("AL", "Trip", {"A"});
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("A").album("AL", "Trip", {"A"})));
  EXPECT_EQ(albums(), "Trip[A]");
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t2 n0");
  EXPECT_EQ(counts(), Counts{});
}

TEST_F(PendingCountsTest, AnAssetCountsInEachOfItsContainers) {
  EXPECT_TRUE(reconcile(SnapshotBuilder()
                            .asset(inEvent("A", "EV"))
                            .asset("B")
                            .album("AL1", "One", {"A"})
                            .album("AL2", "Two", {"A", "B", "B"})
                            .event("EV", "Day")));
  EXPECT_EQ(counts(), (Counts{{"EV", 1}, {"AL1", 1}, {"AL2", 3}}));
  EXPECT_EQ(albums(), "One(t2 n1)[] Two(t2 n3)[]");
  EXPECT_EQ(events(), "Day(t2 n1)[]");
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t2 n2");
}

TEST_F(PendingCountsTest, EachCountIsLogged) {
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("A").album("AL", "Trip", {"A"})));
  const Texts texts = loggedBy("_setPendingAlbumCounts");
  ASSERT_EQ(texts.size(), 2U);
  EXPECT_TRUE(texts[0].starts_with(
      "Album: Trip (KXManagedAlbum,kind 1550) id=AL pendingItemsCount=0 CD_ID=Album/p"));
  EXPECT_EQ(texts[1], "     Setting pendingItemsCount to be 1");
  for (const std::string& text : texts) EXPECT_TRUE(logged(LogLevel::kInfo, text));
}

TEST_F(PendingCountsTest, AContainerThatIsNotOnTheDeviceIsLoggedAlone) {
  platform.library.setFault([](std::string_view operation) {
    return operation == "insertAlbum" ? Error::make("Store", 1) : nullptr;
  });
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("A").album("AL", "Trip", {"A"})));
  EXPECT_EQ(loggedBy("_setPendingAlbumCounts"),
            (Texts{"Album: (null) ((null),(null)) id=(null) pendingItemsCount=0 CD_ID=(null)",
                   "     Setting pendingItemsCount to be 1"}));
}

TEST_F(PendingCountsTest, AnEventThatIsNoEventRecordCountsNowhere) {
  EXPECT_TRUE(reconcile(SnapshotBuilder()
                            .asset(inEvent("A", "AL"))
                            .asset(inEvent("B", "UNKNOWN"))
                            .asset(inEvent("C", ""))
                            .album("AL", "Trip", {})));
  EXPECT_EQ(counts(), Counts{});
}

TEST_F(PendingCountsTest, AnEmptyIdentifierCountsNowhere) {
  EXPECT_TRUE(reconcile(
      SnapshotBuilder().asset(inEvent("", "EV")).album("AL", "Trip", {""}).event("EV", "Day")));
  EXPECT_EQ(counts(), Counts{});
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t2 n1");
}

TEST_F(PendingCountsTest, CountsAddUpFromOne) {
  EXPECT_TRUE(reconcile(SnapshotBuilder()));
  client->_incrementPendingCountForContainerUUID(Value::string("X"));
  client->_incrementPendingCountForContainerUUID(Value::string("X"));
  EXPECT_EQ(counts(), (Counts{{"X", 2}}));
  client->_clearSyncState();
  client->_incrementPendingCountForContainerUUID(Value::string("X"));
  EXPECT_FALSE(client->pendingAssetsPerContainer().has_value());
}

TEST_F(PendingCountsTest, AnEndingSyncPutsEverySyncedContainerToRest) {
  addAlbum("OWN", "Own", {}, 2);
  platform.library.perform([](InMemoryLibraryState& state) {
    state.store.albums[state.store.albumWithUUID("OWN")].pendingItemsCount = 9;
  });
  EXPECT_TRUE(reconcile(SnapshotBuilder()
                            .asset(inEvent("A", "EV"))
                            .album("AL", "Trip", {"A"})
                            .album("FA", "Ann", {"A"}, SnapshotBuilder::kFaceAlbum)
                            .event("EV", "Day")));
  setPending(OwnAlbum::kShoebox, 4, 3);
  client->_clearPendingCounts();
  client->libraryGroup()->wait();
  EXPECT_EQ(albums(), "Own(t1 n9)[] Trip[]");
  EXPECT_EQ(events() + faceAlbums(), "Day[]Ann[]");
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t1 n0");
  EXPECT_EQ(pending(OwnAlbum::kShoebox), "t4 n3");
  EXPECT_EQ(loggedBy("_clearPendingCounts"),
            (Texts{"_clearPendingCounts: _syncRequested=YES", "_clearPendingCounts completed"}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "_clearPendingCounts completed"));
}

TEST_F(PendingCountsTest, AnEndingRestoreResetsTheCameraAndTheRestoreProgressAlbum) {
  AlbumSeed synced;
  synced.uuid = "AL";
  synced.title = "Trip";
  synced.pendingItemsType = 2;
  synced.pendingItemsCount = 5;
  platform.library.addAlbum(synced);
  setPending(OwnAlbum::kShoebox, 4, 3);
  setPending(OwnAlbum::kRestoreProgress, 4, 3);
  setPending(OwnAlbum::kSyncProgress, 2, 3);
  client->_initializeLibrary();
  client->_clearPendingCounts();
  client->libraryGroup()->wait();
  EXPECT_EQ(pending(OwnAlbum::kShoebox), "t1 n0");
  EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t1 n0");
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t2 n3");
  EXPECT_EQ(albums(), "Trip(t2 n5)[]");
  EXPECT_TRUE(logged(LogLevel::kInfo, "_clearPendingCounts: _syncRequested=NO"));
}

TEST_F(PendingCountsTest, WhatIsAtRestIsNotWritten) {
  addAlbum("AL", "Trip");
  client->setSyncRequested(true);
  client->_initializeLibrary();
  client->_clearPendingCounts();
  client->libraryGroup()->wait();
  EXPECT_EQ(platform.library.rowsWritten(), 0U);
}

TEST_F(PendingCountsTest, EmptyAlbumsAndEventsGoFaceAlbumsStay) {
  addSynced("A");
  addAlbum("FULL", "Full", {"A"});
  addAlbum("EMPTY", "Empty");
  addAlbum("OWN", "Own", {}, 2);
  addAlbum("EV", "Day", {}, kKXAlbumKindSyncedEvent);
  addAlbum("FA", "Ann", {}, kKXAlbumKindSyncedFaceAlbum);
  client->_initializeLibrary();
  client->_clearEmptySyncAlbums();
  client->libraryGroup()->wait();
  EXPECT_EQ(albums(), "Full[A] Own[]");
  EXPECT_EQ(events(), "");
  EXPECT_EQ(faceAlbums(), "Ann[]");
  EXPECT_EQ(loggedBy("_clearEmptySyncAlbums"),
            (Texts{"_clearEmptySyncAlbums",
                   "_clearEmptySyncAlbums deleting empty album <KXManagedAlbum: EMPTY \"Empty\">",
                   "_clearEmptySyncAlbums deleting empty album <KXManagedAlbum: EV \"Day\">",
                   "_clearEmptySyncAlbums completed"}));
  for (const std::string& text : loggedBy("_clearEmptySyncAlbums")) {
    EXPECT_TRUE(logged(LogLevel::kInfo, text));
  }
}

TEST_F(PendingCountsTest, EmptyAlbumsAreLookedForAfterTheLibrarysEarlierWork) {
  addSynced("A");
  addAlbum("AL", "Trip");
  client->_initializeLibrary();
  const KXPhotoLibraryPtr library = client->library();
  const DispatchGroupPtr group = client->libraryGroup();
  group->enter();
  std::thread work([&] {
    const auto own = std::make_shared<DispatchGroup>();
    library->withDispatchGroupPerformTransaction(own, [&] {
      const KXGenericAlbumPtr album = library->albumWithUUID("AL");
      ASSERT_NE(album, nullptr);
      album->asManagedAlbum()->addAssetUsingTesselAlbumOrder(library->assetWithUUID("A"));
    });
    own->wait();
    group->leave();
  });
  client->_clearEmptySyncAlbums();
  work.join();
  group->wait();
  EXPECT_EQ(albums(), "Trip[A]");
}

TEST_F(PendingCountsTest, AFailedFetchOfEmptyAlbumsIsIgnored) {
  addAlbum("EMPTY", "Empty");
  platform.library.setFault([](std::string_view operation) {
    return operation == "fetchEmptyAlbums" ? Error::make("Store", 1) : nullptr;
  });
  client->_initializeLibrary();
  client->_clearEmptySyncAlbums();
  client->libraryGroup()->wait();
  EXPECT_EQ(albums(), "Empty[]");
  EXPECT_TRUE(logged(LogLevel::kInfo, "_clearEmptySyncAlbums completed"));
}

TEST_F(PendingCountsTest, TheResetWaitsForTheLibrarysEarlierWork) {
  client->_initializeLibrary();
  client->setSyncRequested(true);
  client->library()->withDispatchGroupPerformTransaction(client->libraryGroup(), [this] {
    client->library()->syncProgressAlbum()->setPendingItemsCount(4);
  });
  client->_clearPendingCounts();
  client->libraryGroup()->wait();
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t1 n0");
}

}  // namespace
}  // namespace kx
