#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

#include "client/Memberships.h"
#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class ImportTest : public ClientTest {
 protected:
  void SetUp() override {
    knowLibrary();
    platform.fakeClock.setNow(Date{1000.0});
  }
  KXSyncSaveJob::Fields onlyJob() {
    if (!client->outstandingSyncJobs() || client->outstandingSyncJobs()->size() != 1U) {
      ADD_FAILURE() << "not one job";
      return {};
    }
    return client->outstandingSyncJobs()->front()->fields();
  }
};

TEST_F(ImportTest, AJobCarriesEverythingTheHostSaid) {
  SnapshotBuilder::Asset host;
  host.uuid = "A";
  host.exposureDate = kHostTime + 0.125;
  host.modificationDate = kHostTime + 9;
  host.originalFileName = "IMG_1.JPG";
  host.isVideo = true;
  host.faces = {{3, 0.1, 0.2, 0.3, 0.4, "FA"}};
  ASSERT_TRUE(reconcile(SnapshotBuilder().asset(host).masterAlbum({"A"})));
  const FRAssetPtr r = request("A");
  r->setPath("Photos/In/A.MOV");
  client->assetTransfer(r, true, nullptr);
  const KXSyncSaveJob::Fields job = onlyJob();
  EXPECT_EQ(job.originalAssetPath, "/var/mobile/Media/Photos/In/A.MOV");
  EXPECT_TRUE(job.isVideo);
  EXPECT_EQ(job.uuid, "A");
  EXPECT_EQ(job.location, (Coordinate{48.0, 11.0}));
  ASSERT_TRUE(job.facesInfo.isArray());
  EXPECT_EQ(job.facesInfo.arrayValue().size(), 1U);
  EXPECT_EQ(job.creationDate, deviceTime(kHostTime + 0.125));
  EXPECT_EQ(job.modificationDate, deviceTime(kHostTime + 9));
  EXPECT_EQ(job.sortToken, deviceTime(kHostTime + 0.125).secondsSinceReference);
  EXPECT_EQ(job.originalFileName, "IMG_1.JPG");
  EXPECT_EQ(job.albumURIs, Texts{});
  EXPECT_FALSE(job.isSyncComplete);
  EXPECT_FALSE(job.cleanupSyncState);
  EXPECT_EQ(job.cleanupBeforeDate, std::nullopt);
  EXPECT_TRUE(outstanding().empty());
  EXPECT_EQ(loggedBy("_syncAssetTransfer"),
            (Texts{"Sync asset: " + r->description() +
                       "   isAvailableAtPath: Photos/In/A.MOV success: YES error: (null)",
                   "Adding asset " + client->outstandingSyncJobs()->front()->description()}));
  EXPECT_EQ(platform.captured.firstWithPrefix("Adding asset").level, LogLevel::kDebug);
  EXPECT_EQ(platform.captured.firstWithPrefix("Sync asset").level, LogLevel::kInfo);
}

TEST_F(ImportTest, AbsentFieldsStayAbsent) {
  SnapshotBuilder::Asset host;
  host.uuid = "A";
  host.exposureDate = host.modificationDate = host.latitude = host.longitude = std::nullopt;
  ASSERT_TRUE(reconcile(SnapshotBuilder().asset(host)));
  arrive(request("A"));
  const KXSyncSaveJob::Fields job = onlyJob();
  EXPECT_EQ(job.location, std::nullopt);  // (0, 0) cannot be used
  EXPECT_EQ(job.creationDate, Date{-3061152000.0});
  EXPECT_EQ(job.modificationDate, Date{-3061152000.0});
  EXPECT_EQ(job.sortToken, std::nullopt);
  EXPECT_EQ(job.originalFileName, std::nullopt);
}

TEST_F(ImportTest, OneMissingCoordinateReadsAsZero) {
  SnapshotBuilder::Asset host;
  host.uuid = "A";
  host.longitude = std::nullopt;
  ASSERT_TRUE(reconcile(SnapshotBuilder().asset(host)));
  arrive(request("A"));
  EXPECT_EQ(onlyJob().location, (Coordinate{48.0, 0.0}));
}

TEST_F(ImportTest, AnAssetWithoutRecordMakesAJobOfItsIdentifier) {
  ASSERT_TRUE(reconcile(SnapshotBuilder()
                            .album("AL1", "One", {"X", "Y"})
                            .event("X", "Day")
                            .album("AL2", "Two", {"Y"})));
  const FRAssetPtr r = FRAsset::downloadAssetWithIdentifier("X", "Photo", std::nullopt);
  client->outstandingAssets()->append(r);
  arrive(r);
  const KXSyncSaveJob::Fields job = onlyJob();
  EXPECT_EQ(job.uuid, "X");
  EXPECT_FALSE(job.isVideo);
  EXPECT_TRUE(job.facesInfo.isNull());
  EXPECT_EQ(job.location, std::nullopt);
  EXPECT_EQ(job.albumURIs, Texts{*client->_albumURIForAlbumUUID("AL1")});
}

// Whatever was known of the libraries before.
TEST_F(ImportTest, AlbumsAreThoseOfTheRecordsAtHand) {
  SnapshotBuilder::Asset host;
  host.uuid = "A";
  ASSERT_TRUE(reconcile(
      SnapshotBuilder().asset(host).album("AL1", "One", {"A"}).album("AL2", "Two", {"B"})));
  auto assets = std::make_shared<KXSAssetMap>();
  for (const char* uuid : {"C", "B"}) assets->set(uuid, KXSAsset::assetWithUUID(uuid));
  client->setUuidToKXSAsset(assets);
  const FRAssetPtr r = FRAsset::downloadAssetWithIdentifier("B", "Photo", std::nullopt);
  client->outstandingAssets()->append(r);
  arrive(r);
  EXPECT_EQ(onlyJob().albumURIs, Texts{*client->_albumURIForAlbumUUID("AL2")});
}

TEST_F(ImportTest, AlbumURIsFollowTheContainersThatAreOnTheDevice) {
  SnapshotBuilder::Asset host;
  host.uuid = "A";
  host.eventUUID = "EV";
  ASSERT_TRUE(reconcile(SnapshotBuilder()
                            .asset(host)
                            .album("AL1", "One", {"A", "A"})
                            .event("EV", "Day")
                            .album("AL2", "Two", {"A"})
                            .album("OTHER", "Other", {})
                            .album("LOST", "Lost", {"A"})));
  Texts expected;
  for (const char* uuid : {"AL1", "EV", "AL2"}) {
    expected.push_back(*client->_albumURIForAlbumUUID(uuid));
  }
  inTransaction([&] { client->library()->albumWithUUID("LOST")->deleteObject(); });
  const auto group = std::make_shared<DispatchGroup>();
  client->_createAlbumUUIDToObjectIDMap(group);
  group->wait();
  arrive(request("A"));
  EXPECT_EQ(onlyJob().albumURIs, expected);
}

TEST_F(ImportTest, FailuresAreSortedByTheirError) {
  struct Row {
    const char* description;
    ErrorPtr error;
    bool givenUp;
  };
  const std::vector<Row> rows = {{"recoverable code", frError(7), false},
                                 {"unrecoverable code", frError(5), true},
                                 {"missing at the host", frError(2), true},
                                 {"another domain", posixError(5), false},
                                 {"no error", nullptr, false}};
  for (const Row& row : rows) {
    SCOPED_TRACE(row.description);
    ASSERT_TRUE(reconcile(SnapshotBuilder().asset("A").asset("B")));
    const FRAssetPtr r = request("A");
    platform.captured.clear();
    client->assetTransfer(r, false, row.error);
    client->libraryGroup()->wait();
    EXPECT_EQ(outstanding(), row.givenUp ? (Texts{"B"}) : (Texts{"A", "B"}));
    EXPECT_EQ(pending(OwnAlbum::kSyncProgress), row.givenUp ? "t2 n1" : "t2 n2");
    EXPECT_EQ(logged(LogLevel::kError, "Asset transfer was not successful!"), !row.givenUp);
    const std::string message = "Encountered unrecoverable error " +
                                (row.error ? row.error->description() : "") + " for asset " +
                                r->description() + " during sync";
    EXPECT_EQ(logged(LogLevel::kInfo, message), row.givenUp);
    EXPECT_FALSE(client->outstandingSyncJobs().has_value());
  }
}

TEST_F(ImportTest, ASuccessWithAnErrorIsASuccess) {
  ASSERT_TRUE(reconcile(SnapshotBuilder().asset("A")));
  const FRAssetPtr r = request("A");
  r->setPath("In/A");
  client->assetTransfer(r, true, frError(5));
  EXPECT_EQ(onlyJob().uuid, "A");
}

TEST_F(ImportTest, OddReportsChangeNothing) {
  ASSERT_TRUE(reconcile(SnapshotBuilder().asset("A")));
  const FRAssetPtr unknown = FRAsset::downloadAssetWithIdentifier("A", "Photo", std::nullopt);
  unknown->setPath("In/A");
  client->assetTransfer(unknown, true, nullptr);
  EXPECT_TRUE(logged(LogLevel::kWarning,
                     "Got transfer notification of unknown asset: " + unknown->description()));
  const FRAssetPtr upload = FRAsset::uploadAssetWithIdentifier("U", "Photo", std::nullopt);
  client->outstandingAssets()->append(upload);
  client->assetTransfer(upload, true, nullptr);
  EXPECT_TRUE(
      logged(LogLevel::kError, "Asset upload complete--erm...unsupported...how did this happen??"));
  client->assetTransfer(request("A"), true, nullptr);
  EXPECT_TRUE(logged(LogLevel::kError,
                     "Asset with no path: " + request("A")->description() + ", ignoring."));
  EXPECT_EQ(outstanding(), (Texts{"A", "U"}));
  EXPECT_FALSE(client->outstandingSyncJobs().has_value());
}

TEST_F(ImportTest, WithoutAListEveryReportIsUnknown) {
  const FRAssetPtr r = FRAsset::downloadAssetWithIdentifier("A", "Photo", std::nullopt);
  client->assetTransfer(r, true, nullptr);
  client->assetTransfer(r, false, frError(5));
  EXPECT_EQ(platform.captured.firstWithPrefix("Got transfer notification").level,
            LogLevel::kWarning);
}

TEST_F(ImportTest, BatchesAreThreeSecondsApart) {
  ASSERT_TRUE(reconcile(SnapshotBuilder().asset("A").asset("B").asset("C").asset("D")));
  platform.fakeClock.advance(1);
  arrive(request("A"));
  platform.fakeClock.advance(1.5);
  arrive(request("B"));
  EXPECT_TRUE(platform.saver.batches().empty());
  platform.fakeClock.advance(0.5);
  arrive(request("C"));
  ASSERT_EQ(platform.saver.batches().size(), 1U);
  EXPECT_EQ(platform.saver.batches()[0].size(), 3U);
  EXPECT_EQ(client->_timeSinceLastSave(), 0.0);
  arrive(request("D"));
  EXPECT_EQ(platform.saver.batches().size(), 1U);
  client->assetTransferEndedWithSuccess(true);
  ASSERT_EQ(platform.saver.batches().size(), 2U);
  EXPECT_EQ(platform.saver.batches()[1][0].uuid, "D");
}

TEST_F(ImportTest, ImportedAssetsLowerTheirCounts) {
  SnapshotBuilder::Asset host;
  host.uuid = "A";
  host.eventUUID = "EV";
  ASSERT_TRUE(reconcile(
      SnapshotBuilder().asset(host).asset("B").album("AL", "Trip", {"A", "B"}).event("EV", "Day")));
  EXPECT_EQ(albums(), "Trip(t2 n2)[]");
  arrive(request("A"));
  client->_saveOutstandingSyncJobs();
  client->libraryGroup()->wait();
  EXPECT_EQ(albums(), "Trip(t2 n1)[A]");
  EXPECT_EQ(events(), "Day(t2 n0)[A]");
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t2 n1");
}

// What is found of an asset is what a walk over every container would find.
RC_GTEST_PROP(MembershipsTest, AgreeWithAWalk, ()) {
  const auto small = [] { return *rc::gen::inRange(0, 6); };
  const auto name = [](const char* kind, int number) { return kind + std::to_string(number); };
  KXSItemMap containers;
  const int count = *rc::gen::inRange(0, 8);
  for (int i = 0; i < count; ++i) {
    if (*rc::gen::arbitrary<bool>()) {
      const KXSEventPtr event = KXSEvent::eventWithUUID(name("E", small()));
      containers.set(*event->uuid(), event);
      continue;
    }
    // An album may have the identifier of an event that is not there.
    const std::string key = name(*rc::gen::arbitrary<bool>() ? "C" : "E", small());
    const KXSAlbumPtr album = KXSAlbum::albumWithUUID(key);
    Array assets;
    for (int n = small(); n > 0; --n) assets.push_back(Value::string(name("A", small())));
    if (*rc::gen::arbitrary<bool>()) album->setAssetUUIDs(Value::array(assets));
    containers.set(key, album);
  }
  KXSAssetMap assets;
  for (int i = 1; i < 6; ++i) {  // A0 is listed, and not there
    assets.set(name("A", i), KXSAsset::assetWithUUID(name("A", i)));
  }
  const std::string asset = name("A", *rc::gen::inRange(1, 6));
  const std::string event = name("E", small());
  std::vector<std::string_view> expected;
  for (const auto& entry : containers) {
    bool qualifies = false;
    if (const auto* album = dynamic_cast<const KXSAlbum*>(entry.value.get())) {
      const std::optional<ArrayView> uuids = album->assetUUIDs();
      if (!uuids) continue;
      for (const Value& uuid : *uuids) qualifies = qualifies || uuid.stringValue() == asset;
    } else {
      qualifies = entry.value->uuid() == event;
    }
    if (qualifies) expected.push_back(entry.key.stringValue());
  }
  KXSAssetMap::Cursor cursor;
  RC_ASSERT(assets.find(asset, cursor) != nullptr);
  const Memberships memberships(assets, containers);
  RC_ASSERT(memberships.containersOf(cursor.place(), std::string_view(event)) == expected);
}

}  // namespace
}  // namespace kx
