#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class AssetReconciliationTest : public ClientTest {
 protected:
  static SnapshotBuilder::Asset hostAsset(const std::string& uuid) {
    SnapshotBuilder::Asset asset;
    asset.uuid = uuid;
    return asset;
  }
  InMemoryAssetRow row(const std::string& uuid) {
    InMemoryAssetRow copy;
    platform.library.perform([&](InMemoryLibraryState& state) {
      copy = state.store.assets.at(state.store.assetWithUUID(uuid));
    });
    return copy;
  }
  // "identifier x y" of each face, in row order.
  Texts faces(const std::string& uuid) {
    Texts texts;
    platform.library.perform([&](InMemoryLibraryState& state) {
      const InMemoryAssetRow& asset = state.store.assets.at(state.store.assetWithUUID(uuid));
      for (const std::int64_t face : asset.faces) {
        const InMemoryFaceRow& data = state.store.faces.at(face);
        texts.push_back(std::to_string(data.identifier) + " " +
                        std::to_string(static_cast<int>(data.relativeRect.x * 100)) + " " +
                        data.albumUUID.value_or("-"));
      }
    });
    return texts;
  }
  double token(const std::string& uuid) {
    const double* found = client->assetUUIDtoSortToken()->find(uuid);
    return found == nullptr ? -1.0 : *found;
  }
  void SetUp() override { knowLibrary(); }
};

TEST_F(AssetReconciliationTest, EqualSidesChangeNothing) {
  addSynced("A");
  addSynced("B");
  addAlbum("AL", "Trip", {"A"});
  EXPECT_TRUE(reconcile(
      SnapshotBuilder().asset("A").asset("B").album("AL", "Trip", {"A"}).masterAlbum({"A"})));
  EXPECT_EQ(assets(), "A B");
  EXPECT_TRUE(outstanding().empty());
  EXPECT_EQ(albums(), "Trip[A]");
  EXPECT_EQ(loggedBy("_reconcileAssets"), (Texts{"Transaction for Reconciling Assets"}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Transaction for Reconciling Assets"));
  // The sync progress album's type alone is written.
  EXPECT_EQ(platform.library.rowsWritten(), 1U);
}

TEST_F(AssetReconciliationTest, WhatTheHostNoLongerHasIsDeletedWithItsFaces) {
  AssetSeed gone = syncedAsset("GONE");
  gone.faces = {{1, Rect{}, std::nullopt}};
  platform.library.addAsset(gone);
  addSynced("A");
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("A")));
  EXPECT_EQ(assets(), "A");
  std::size_t faceCount = 0;
  platform.library.perform([&](InMemoryLibraryState& s) { faceCount = s.store.faces.size(); });
  EXPECT_EQ(faceCount, 0U);
  const CapturedMessage message = platform.captured.firstWithPrefix("deleted photo with GONE is ");
  EXPECT_EQ(message.level, LogLevel::kInfo);
  EXPECT_EQ(message.source, kSource);
  EXPECT_EQ(message.function, "_reconcileAssets");
}

TEST_F(AssetReconciliationTest, TheDevicesOwnAssetsAreNeverTouched) {
  AssetSeed own;
  own.uuid = "OWN";
  own.savedAssetType = 0;
  platform.library.addAsset(own);
  AssetSeed nameless = syncedAsset("X");
  nameless.uuid = std::nullopt;
  platform.library.addAsset(nameless);
  client->setIsResync(true);
  EXPECT_TRUE(reconcile(SnapshotBuilder().library("OTHER")));
  std::size_t count = 0;
  platform.library.perform([&](InMemoryLibraryState& s) { count = s.store.assets.size(); });
  EXPECT_EQ(count, 2U);
}

TEST_F(AssetReconciliationTest, NewAssetsAreRequestedInSnapshotOrderThenChangedOnes) {
  addSynced("STALE");
  addSynced("KEPT");
  SnapshotBuilder::Asset stale = hostAsset("STALE");
  stale.modificationDate = kHostTime + 0.001;
  stale.caption = "Sunset";
  SnapshotBuilder::Asset bare = hostAsset("N2");
  bare.caption = std::nullopt;
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("N1").asset(stale).asset("KEPT").asset(bare)));
  EXPECT_EQ(outstanding(), (Texts{"N1", "N2", "STALE"}));
  EXPECT_EQ(assets(), "KEPT");
  const FRAssetPtr changed = request("STALE");
  EXPECT_EQ(changed->dataclass(), "Photo");
  EXPECT_EQ(changed->prettyName(), "Sunset");
  EXPECT_TRUE(changed->isDownload());
  EXPECT_FALSE(changed->isRestore());
  EXPECT_EQ(request("N2")->prettyName(), std::nullopt);
  Texts texts = loggedBy("_reconcileAssets");
  ASSERT_EQ(texts.size(), 6U);
  EXPECT_EQ(texts[1], "Download request for asset: " + request("N1")->description());
  EXPECT_EQ(texts[3], "Deleting stale asset: <KXManagedAsset: STALE>");
  EXPECT_EQ(texts[4], "=========== ASSET STALE HAS CHANGED, RE-REQUESTING DOWNLOAD");
  EXPECT_EQ(texts[5], "Download request for asset: " + changed->description());
  for (const std::string& text : texts) EXPECT_TRUE(logged(LogLevel::kInfo, text)) << text;
}

TEST_F(AssetReconciliationTest, AHostCopyThatIsOlderHasChangedToo) {
  addSynced("A");
  SnapshotBuilder::Asset older = hostAsset("A");
  older.modificationDate = kHostTime - 0.001;
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset(older)));
  EXPECT_EQ(outstanding(), (Texts{"A"}));
  EXPECT_EQ(assets(), "");
}

TEST_F(AssetReconciliationTest, ATimeThatEqualsTheStartOfTheWalkGetsATieBreak) {
  SnapshotBuilder::Asset first = hostAsset("A");
  first.exposureDate = 3061152000.0 - 1.0;  // the walk begins with a time of -1
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset(first).masterAlbum({"A"})));
  EXPECT_EQ(token("A"), -1.0 + 1 / 100000.0);
}

TEST_F(AssetReconciliationTest, AnAssetWithoutModificationDateOnTheDeviceHasChanged) {
  AssetSeed seed = syncedAsset("A");
  seed.modificationDate = std::nullopt;
  platform.library.addAsset(seed);
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("A")));
  EXPECT_EQ(outstanding(), (Texts{"A"}));
}

TEST_F(AssetReconciliationTest, ANullHostDateCountsAsZero) {
  AssetSeed seed = syncedAsset("A");
  seed.modificationDate = deviceTime(0.0);
  platform.library.addAsset(seed);
  SnapshotBuilder::Asset host = hostAsset("A");
  host.modificationDate = std::nullopt;
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset(host)));
  EXPECT_TRUE(outstanding().empty());
}

TEST_F(AssetReconciliationTest, AResyncFetchesEverythingAgain) {
  addSynced("A");
  addSynced("GONE");
  EXPECT_TRUE(reconcile(SnapshotBuilder().library("OTHER").asset("A").asset("B")));
  EXPECT_EQ(assets(), "");
  EXPECT_EQ(outstanding(), (Texts{"A", "B"}));
  EXPECT_TRUE(platform.captured.firstWithPrefix("deleted photo with A is ").source == kSource);
  EXPECT_EQ(platform.captured.firstWithPrefix("Deleting stale asset").source, "");
}

TEST_F(AssetReconciliationTest, AFailedFetchRequestsEverythingAndDeletesNothing) {
  addSynced("A");
  addSynced("GONE");
  platform.library.setFault([](std::string_view operation) {
    return operation == "fetchAssets" ? Error::make("Store", 5) : nullptr;
  });
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("A").asset("B")));
  EXPECT_EQ(assets(), "A GONE");
  EXPECT_EQ(outstanding(), (Texts{"A", "B"}));
  EXPECT_TRUE(logged(LogLevel::kError,
                     "Error Reconciling Photos: Cannot fetch on device photos Error Domain=Store "
                     "Code=5"));
}

TEST_F(AssetReconciliationTest, EqualNeighboursInMasterOrderGetTieBreaks) {
  SnapshotBuilder snapshot;
  for (const char* uuid : {"A", "B", "C", "D"}) snapshot.asset(uuid);
  SnapshotBuilder::Asset other = hostAsset("OTHER");
  other.exposureDate = kHostTime + 7;
  snapshot.asset(other).masterAlbum({"A", "B", "C", "OTHER", "D"});
  EXPECT_TRUE(reconcile(snapshot));
  const double t = deviceTime().secondsSinceReference;
  EXPECT_EQ(token("A"), t);
  EXPECT_EQ(token("B"), t + 1 / 100000.0);
  EXPECT_EQ(token("C"), t + 2 / 100000.0);
  EXPECT_EQ(token("OTHER"), t + 7);
  EXPECT_EQ(token("D"), t);
}

TEST_F(AssetReconciliationTest, AMasterMemberWithoutRecordIsPassedOver) {
  EXPECT_TRUE(
      reconcile(SnapshotBuilder().asset("A").asset("B").masterAlbum({"A", "UNKNOWN", "B"})));
  EXPECT_EQ(token("B"), deviceTime().secondsSinceReference + 1 / 100000.0);
  EXPECT_EQ(token("UNKNOWN"), -1.0);
}

TEST_F(AssetReconciliationTest, ANullExposureDateCountsAsZeroInTheToken) {
  SnapshotBuilder::Asset host = hostAsset("A");
  host.exposureDate = host.modificationDate = std::nullopt;
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset(host).masterAlbum({"A"})));
  EXPECT_EQ(token("A"), -3061152000.0);
}

TEST_F(AssetReconciliationTest, ADifferentTokenIsSet) {
  AssetSeed none = syncedAsset("NONE");
  none.sortToken = std::nullopt;
  platform.library.addAsset(none);
  AssetSeed outside = syncedAsset("OUTSIDE");
  outside.sortToken = 3.0;
  platform.library.addAsset(outside);
  const double time = deviceTime().secondsSinceReference;
  AssetSeed close = syncedAsset("CLOSE");
  close.sortToken = time + 2 / 100000.0;
  platform.library.addAsset(close);
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("NONE").asset("OUTSIDE").asset("CLOSE").masterAlbum(
      {"NONE", "CLOSE"})));
  EXPECT_EQ(row("NONE").sortToken, time);
  EXPECT_EQ(row("CLOSE").sortToken, time + 1 / 100000.0);
  EXPECT_EQ(row("OUTSIDE").sortToken, 3.0);
}

TEST_F(AssetReconciliationTest, LocationsFollowTheHost) {
  struct Row {
    const char* description;
    std::optional<double> latitude, longitude;
    std::optional<Coordinate> onDevice, expected;
    const char* message;
  };
  constexpr const char* kRemoving = "Removing location for asset";
  const std::vector<Row> rows = {
      {"equal", 48.0, 11.0, Coordinate{48, 11}, Coordinate{48, 11}, ""},
      {"moved", 48.5, 11.0, Coordinate{48, 11}, Coordinate{48.5, 11},
       "Updating onDeviceAsset for its new location: <48.5,11>"},
      {"new", 48.0, 11.0, std::nullopt, Coordinate{48, 11},
       "Updating onDeviceAsset for its new location: <48,11>"},
      {"no latitude", std::nullopt, 11.0, Coordinate{48, 11}, std::nullopt, kRemoving},
      {"no longitude", 48.0, std::nullopt, Coordinate{48, 11}, std::nullopt, kRemoving},
      {"none on both sides", std::nullopt, std::nullopt, std::nullopt, std::nullopt, ""},
      {"zero", 0.0, 0.0, Coordinate{48, 11}, std::nullopt, kRemoving},
      {"beyond the pole", 91.0, 0.0, Coordinate{48, 11}, std::nullopt, kRemoving}};
  for (const Row& r : rows) {
    SCOPED_TRACE(r.description);
    platform.library.perform([](InMemoryLibraryState& state) {
      const std::int64_t present = state.store.assetWithUUID("A");
      if (present != 0) state.store.removeAsset(present);
    });
    AssetSeed seed = syncedAsset("A");
    seed.location = r.onDevice;
    platform.library.addAsset(seed);
    SnapshotBuilder::Asset host = hostAsset("A");
    host.latitude = r.latitude;
    host.longitude = r.longitude;
    platform.captured.clear();
    EXPECT_TRUE(reconcile(SnapshotBuilder().asset(host)));
    EXPECT_EQ(row("A").location, r.expected);
    const Texts texts = loggedBy("_reconcileAssets");
    EXPECT_EQ(texts.size(), *r.message == '\0' ? 1U : 2U);
    if (*r.message == '\0') continue;
    EXPECT_TRUE(logged(LogLevel::kInfo, r.message)) << texts.back();
  }
}

TEST_F(AssetReconciliationTest, FacesAreDeletedAndAddedNeverEdited) {
  AssetSeed seed = syncedAsset("A");
  seed.faces = {{1, Rect{0.1, 0, 0, 0}, "KEPT"},
                {2, Rect{0.2, 0, 0, 0}, "MOVED"},
                {3, Rect{0.3, 0, 0, 0}, "GONE"}};
  platform.library.addAsset(seed);
  SnapshotBuilder::Asset host = hostAsset("A");
  host.faces = {{1, 0.1, 0, 0, 0, "OTHER ALBUM"},
                {2, 0.25, 0, 0, 0, "MOVED"},
                {4, 0.4, 0, 0, 0, std::nullopt}};
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset(host)));
  EXPECT_EQ(faces("A"), (Texts{"1 10 KEPT", "2 25 MOVED", "4 40 -"}));
  EXPECT_EQ(loggedBy("_reconcileAssets"),
            (Texts{"Transaction for Reconciling Assets", "Deleting face with index: 2",
                   "Deleting face with index: 3", "adding face: 2", "adding face: 4"}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Deleting face with index: 2"));
  EXPECT_TRUE(logged(LogLevel::kInfo, "adding face: 2"));
}

TEST_F(AssetReconciliationTest, FaceIdentifiersAreComparedAsSixteenBits) {
  AssetSeed seed = syncedAsset("A");
  seed.faces = {{65535, Rect{0.5, 0, 0, 0}, std::nullopt}};
  platform.library.addAsset(seed);
  SnapshotBuilder::Asset host = hostAsset("A");
  host.faces = {{-1, 0.5, 0, 0, 0, std::nullopt}};
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset(host)));
  EXPECT_EQ(loggedBy("_reconcileAssets").size(), 1U);
}

TEST_F(AssetReconciliationTest, OfSeveralFacesWithOneIdentifierTheEqualOneMatches) {
  AssetSeed seed = syncedAsset("A");
  seed.faces = {{1, Rect{0.2, 0, 0, 0}, std::nullopt}, {1, Rect{0.2, 0, 0, 0}, std::nullopt}};
  platform.library.addAsset(seed);
  SnapshotBuilder::Asset host = hostAsset("A");
  host.faces = {{1, 0.1, 0, 0, 0, std::nullopt}, {1, 0.2, 0, 0, 0, std::nullopt}};
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset(host)));
  // Both device faces are met by the second host face; only the first one is added.
  EXPECT_EQ(faces("A"), (Texts{"1 20 -", "1 20 -", "1 10 -"}));
}

TEST_F(AssetReconciliationTest, MembershipsFollowTheHost) {
  SnapshotBuilder::Asset host = hostAsset("A");
  host.eventUUID = "EV";
  addSynced("A");
  addAlbum("KEPT", "Kept", {"A"});
  addAlbum("LEFT", "Left", {"A"});
  addAlbum("JOINED", "Joined");
  addAlbum("EV", "Day", {}, kKXAlbumKindSyncedEvent);
  EXPECT_TRUE(reconcile(SnapshotBuilder()
                            .asset(host)
                            .album("KEPT", "Kept", {"A"})
                            .album("LEFT", "Left", {})
                            .album("JOINED", "Joined", {"A", "A"})
                            .event("EV", "Day")));
  EXPECT_EQ(albums(), "Kept[A] Left[] Joined[A]");
  EXPECT_EQ(events(), "Day[A]");
  EXPECT_EQ(loggedBy("_reconcileAssets"),
            (Texts{"Transaction for Reconciling Assets",
                   "Asset <KXManagedAsset: A> A removed from album <KXManagedAlbum: LEFT "
                   "\"Left\"> LEFT",
                   "Asset <KXManagedAsset: A> A added to album <KXManagedAlbum: EV \"Day\"> EV",
                   "Asset <KXManagedAsset: A> A added to album <KXManagedAlbum: JOINED "
                   "\"Joined\"> JOINED"}));
  for (const std::string& text : loggedBy("_reconcileAssets")) {
    EXPECT_TRUE(logged(LogLevel::kInfo, text));
  }
}

TEST_F(AssetReconciliationTest, AContainerThatIsNotOnTheDeviceIsLoggedAlone) {
  addSynced("A");
  addAlbum("OWN", "My best", {"A"}, 2);
  SnapshotBuilder::Asset host = hostAsset("A");
  host.eventUUID = "NOWHERE";
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset(host)));
  EXPECT_EQ(albums(), "My best[A]");
  EXPECT_TRUE(logged(LogLevel::kInfo, "Asset <KXManagedAsset: A> A removed from album (null) OWN"));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Asset <KXManagedAsset: A> A added to album (null) NOWHERE"));
}

TEST_F(AssetReconciliationTest, AUsersAlbumLosesOnlyDeletedAssets) {
  addSynced("A");
  addSynced("GONE");
  addAlbum("OWN", "My best", {"A", "GONE"}, 2);
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("A")));
  EXPECT_EQ(albums(), "My best[A]");
}

TEST_F(AssetReconciliationTest, ABlockWithoutLibraryDoesNothing) {
  const auto group = std::make_shared<DispatchGroup>();
  client->_reconcileAlbums(group);
  client->_reconcileAssets(group);
  client->_setPendingAlbumCounts(group);
  client->_createAlbumUUIDToObjectIDMap(group);
  client->_clearPendingCounts();
  client->_clearEmptySyncAlbums();
  group->wait();
  EXPECT_EQ(platform.captured.texts(), (Texts{"_clearEmptySyncAlbums"}));
}

}  // namespace
}  // namespace kx
