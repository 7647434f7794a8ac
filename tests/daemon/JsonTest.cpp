#include <gtest/gtest.h>

#include <limits>

#include "daemon/DumpJson.h"
#include "daemon/SyncJson.h"

namespace kx::test {
namespace {

TEST(SyncJsonTest, HasEveryFieldInTheDocumentedOrder) {
  SyncResult result;
  result.outcome = SyncOutcome::kPartial;
  result.resync = true;
  result.requested = 3;
  result.imported = 2;
  result.failed = {{"UUID", "FRError", 2, "the host does not have the file"}};
  result.deletedAssets = 4;
  result.updatedAssets = 5;
  result.albumsCreated = 6;
  result.albumsDeleted = 7;
  result.albumsRenamed = 8;
  result.seconds = 0.25;
  result.error = Error::make("d", -2, "m");
  EXPECT_EQ(dumpJson(syncResultJson(result)),
            "{\"outcome\":\"partial\",\"resync\":true,\"requested\":3,\"imported\":2,"
            "\"failed\":[{\"uuid\":\"UUID\",\"domain\":\"FRError\",\"code\":2,"
            "\"reason\":\"the host does not have the file\"}],\"deletedAssets\":4,"
            "\"updatedAssets\":5,\"albumsCreated\":6,\"albumsDeleted\":7,\"albumsRenamed\":8,"
            "\"seconds\":0.25,\"error\":{\"domain\":\"d\",\"code\":-2,\"message\":\"m\"}}");
}

TEST(SyncJsonTest, NamesEveryOutcome) {
  const std::pair<SyncOutcome, const char*> names[] = {{SyncOutcome::kSynced, "synced"},
                                                       {SyncOutcome::kNull, "null"},
                                                       {SyncOutcome::kPartial, "partial"},
                                                       {SyncOutcome::kStopped, "stopped"},
                                                       {SyncOutcome::kFailed, "failed"}};
  for (const auto& [outcome, name] : names) EXPECT_STREQ(syncOutcomeName(outcome), name);
}

TEST(SyncJsonTest, AResultWithoutErrorSaysNull) {
  EXPECT_TRUE(syncResultJson({}).at("error").is_null());
  EXPECT_TRUE(syncResultJson({}).at("failed").is_array());
}

TEST(SyncJsonTest, TextThatIsNotUtf8DoesNotRaise) {
  SyncResult result;
  result.failed = {{"\xff\xfe", "FRError", 2, "x"}};
  EXPECT_NE(dumpJson(syncResultJson(result)).find("FRError"), std::string::npos);
}

DeviceDump sampleDump() {
  DeviceDump dump;
  dump.albums = {{"B1", "Title", 1550, {2, 3}, {"A2", "A1"}}, {"B2", std::nullopt, 2, {}, {}}};
  dump.events = {{"E1", "", 1551, {1, 0}, {}}};
  DeviceDump::Asset asset;
  asset.uuid = "A1";
  asset.savedAssetType = 256;
  asset.isVideo = true;
  asset.creationDate = Date{0.1};
  asset.modificationDate = Date{-std::numeric_limits<double>::denorm_min()};
  asset.sortToken = 123456789.00001;
  asset.location = Coordinate{-33.856789012345678, 151.21530000000001};
  asset.originalFileName = "IMG_0001.JPG";
  asset.faces = {{65535, {0.1, 0.2, 0.3, 1.0 / 3}, "F1"}, {7, {}, std::nullopt}};
  asset.path = "/var/mobile/Media/x";
  asset.size = std::int64_t{1} << 40;
  dump.assets = {asset};
  dump.syncAgent = DeviceDump::SyncAgent{"kxsync/1", std::nullopt};
  dump.syncProgress = {2, 9};
  dump.lastSynced = true;
  return dump;
}

TEST(DumpJsonTest, HasTheDocumentedShape) {
  const auto json = deviceDumpJson(sampleDump());
  EXPECT_EQ(dumpJson(json.at("albums")),
            "[{\"uuid\":\"B1\",\"title\":\"Title\",\"kind\":1550,\"pendingItemsType\":2,"
            "\"pendingItemsCount\":3,\"assets\":[\"A2\",\"A1\"]},{\"uuid\":\"B2\",\"title\":null,"
            "\"kind\":2,\"pendingItemsType\":1,\"pendingItemsCount\":0,\"assets\":[]}]");
  EXPECT_EQ(json.at("events").at(0).at("title"), "");
  EXPECT_TRUE(json.at("faceAlbums").is_array());
  EXPECT_EQ(dumpJson(json.at("syncProgress")), "{\"pendingItemsType\":2,\"pendingItemsCount\":9}");
  EXPECT_TRUE(json.at("currentLibraryUUID").is_null());
  EXPECT_EQ(dumpJson(json.at("syncAgent")), "{\"userAgent\":\"kxsync/1\",\"libraryKind\":null}");
  EXPECT_EQ(json.at("lastSynced"), true);
  const auto& asset = json.at("assets").at("A1");
  EXPECT_EQ(asset.at("faces").at(0).at("identifier"), 65535);
  EXPECT_TRUE(asset.at("faces").at(1).at("albumUUID").is_null());
  EXPECT_FALSE(asset.contains("sha256"));
}

TEST(DumpJsonTest, RealsRoundTripBitForBit) {
  const DeviceDump dump = sampleDump();
  const auto json = nlohmann::json::parse(dumpJson(deviceDumpJson(dump)));
  const auto& asset = json.at("assets").at("A1");
  const auto& expected = dump.assets[0];
  EXPECT_EQ(asset.at("creationDate").get<double>(), expected.creationDate->secondsSinceReference);
  EXPECT_EQ(asset.at("modificationDate").get<double>(),
            expected.modificationDate->secondsSinceReference);
  EXPECT_EQ(asset.at("sortToken").get<double>(), *expected.sortToken);
  EXPECT_EQ(asset.at("location").at(0).get<double>(), expected.location->latitude);
  EXPECT_EQ(asset.at("location").at(1).get<double>(), expected.location->longitude);
  EXPECT_EQ(asset.at("faces").at(0).at("relativeRect").at(3).get<double>(), 1.0 / 3);
  EXPECT_EQ(asset.at("size").get<std::int64_t>(), std::int64_t{1} << 40);
}

TEST(DumpJsonTest, MissingValuesAreNullAndHashesAreShown) {
  DeviceDump dump;
  DeviceDump::Asset asset;
  asset.uuid = "A";
  asset.sha256 = "ab";
  dump.assets = {asset};
  const auto json = deviceDumpJson(dump);
  const auto& shown = json.at("assets").at("A");
  for (const char* key :
       {"creationDate", "modificationDate", "sortToken", "location", "originalFileName"}) {
    EXPECT_TRUE(shown.at(key).is_null()) << key;
  }
  EXPECT_EQ(shown.at("sha256"), "ab");
  EXPECT_TRUE(json.at("syncAgent").is_null());
}

}  // namespace
}  // namespace kx::test
