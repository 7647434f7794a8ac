#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

const std::string kBase = "/var/mobile/Media/DCIM/100AB/";
const std::string kA = kBase + "A.JPG";
const std::string kMovie = kBase + "A.MOV";

class RestoreTransfersTest : public ClientTest {
 protected:
  void SetUp() override {
    AssetSeed seed;
    seed.uuid = "UA";
    seed.savedAssetType = 0;
    seed.files = {kA};
    seed.incomplete = true;
    platform.library.addAsset(seed);
    platform.backup.paths = {kMovie, kA};
    client->outstandingAssetTransfers();
    platform.captured.clear();
  }
  Texts restoredInMemory() { return texts(restoreContextValue()); }
  Texts restoredOnDisk() {
    return texts(readPlist(
        KXSyncClient::pathToRestoreContext(platform))[kKXSyncRestoreContextRestoredFilesKey]);
  }
  Value restoreContextValue() {
    return client->restoreContext()->find(kKXSyncRestoreContextRestoredFilesKey);
  }
  static Texts texts(const Value& array) {
    Texts all;
    if (!array.isArray()) return {"(null)"};
    for (const Value& text : array.arrayValue()) all.emplace_back(text.stringValue());
    return all;
  }
  std::int32_t status(const std::string& path) {
    for (const auto& pair :
         *(*client->restorePathToAssetGroup()->find(kBase + "A"))->assetPairs()) {
      if (pair->path() == path) return pair->status();
    }
    return -1;
  }
  using Updates = std::vector<RecordingPorter::Update>;
};

TEST_F(RestoreTransfersTest, AGroupIsReportedWhenAllItsFilesAreThere) {
  const FRAssetPtr movie = request(kMovie);
  const FRAssetPtr picture = request(kA);
  client->assetTransfer(movie, true, nullptr);
  EXPECT_EQ(
      loggedBy("_restoreAssetTransfer"),
      (Texts{"restored asset: " + movie->description() + "   isAvailableAtPath: " + kMovie +
                 " success: YES error: (null)",
             "Setting pair as complete", "Pair at path " + kMovie + " is complete",
             "Looking at group KXSyncAssetGroup", "Pair: " + kMovie + "  has status: complete",
             "Pair: " + kA + "  has status: pending", "Group is pending..."}));
  for (const std::string& text : loggedBy("_restoreAssetTransfer")) {
    EXPECT_TRUE(logged(LogLevel::kInfo, text)) << text;
  }
  EXPECT_TRUE(platform.porter.updates().empty());
  EXPECT_EQ(outstanding(), (Texts{kA}));
  EXPECT_EQ(restoredInMemory(), Texts{});
  EXPECT_EQ(restoredOnDisk(), (Texts{"(null)"}));

  client->assetTransfer(picture, true, nullptr);
  EXPECT_EQ(platform.porter.updates(), (Updates{{"UA", {kMovie, kA}}}));
  EXPECT_TRUE(outstanding().empty());
  EXPECT_EQ(restoredOnDisk(), (Texts{kMovie, kA}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Group with uuid UA is complete!"));
}

TEST_F(RestoreTransfersTest, AFailedFileIsLeftOutOfTheReport) {
  client->assetTransfer(request(kA), false, frError(5));
  EXPECT_EQ(status(kA), 1);
  EXPECT_EQ(restoredOnDisk(), (Texts{kA}));
  EXPECT_EQ(outstanding(), (Texts{kMovie}));
  EXPECT_EQ(
      platform.captured.firstWithPrefix("Encountered unrecoverable error for restore asset").level,
      LogLevel::kInfo);
  client->assetTransfer(request(kMovie), true, nullptr);
  EXPECT_EQ(platform.porter.updates(), (Updates{{"UA", {kMovie}}}));
  EXPECT_EQ(restoredOnDisk(), (Texts{kA, kMovie}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Pair: " + kA + "  has status: failed"));
}

TEST_F(RestoreTransfersTest, AGroupWhoseFilesAllFailedIsReportedEmpty) {
  client->assetTransfer(request(kA), false, frError(5));
  client->assetTransfer(request(kMovie), false, frError(5));
  EXPECT_EQ(platform.porter.updates(), (Updates{{"UA", {}}}));
  EXPECT_EQ(restoredOnDisk(), (Texts{kA, kMovie}));
}

TEST_F(RestoreTransfersTest, RecoverableFailuresChangeNothing) {
  std::vector<ErrorPtr> errors = {posixError(5), posixError(2), Error::make("", 5),
                                  Error::make("frerror", 5)};
  for (const int code : {4, 7, 8, 9, 14, 16, 18, 19, 20}) errors.push_back(frError(code));
  for (const ErrorPtr& error : errors) {
    SCOPED_TRACE(error->description());
    platform.captured.clear();
    client->assetTransfer(request(kA), false, error);
    EXPECT_EQ(status(kA), 0);
    EXPECT_EQ(outstanding(), (Texts{kA, kMovie}));
    EXPECT_EQ(restoredInMemory(), Texts{});
    EXPECT_EQ(restoredOnDisk(), (Texts{"(null)"}));
    EXPECT_TRUE(logged(LogLevel::kInfo, "Looking at group KXSyncAssetGroup"));
    EXPECT_TRUE(logged(LogLevel::kInfo, "Group is pending..."));
    EXPECT_TRUE(platform.porter.updates().empty());
  }
}

TEST_F(RestoreTransfersTest, EveryOtherCodeOfTheFrameworkIsForGood) {
  std::vector<std::int64_t> codes = {-1, 21, 100};
  for (std::int64_t code = 0; code <= 20; ++code) codes.push_back(code);
  for (const std::int64_t recoverable : {4, 7, 8, 9, 14, 16, 18, 19, 20}) {
    std::erase(codes, recoverable);
  }
  for (const std::int64_t code : codes) {
    SCOPED_TRACE(code);
    client->_clearSyncState();
    platform.memoryFiles.removeItem(KXSyncClient::pathToRestoreContext(platform), nullptr);
    client->outstandingAssetTransfers();
    client->assetTransfer(request(kA), false, frError(code));
    EXPECT_EQ(status(kA), 1);
    EXPECT_EQ(outstanding(), (Texts{kMovie}));
    EXPECT_EQ(restoredOnDisk(), (Texts{kA}));
  }
}

TEST_F(RestoreTransfersTest, APathThatIsThereTwiceIsSettledTwice) {
  // Two assets may name one file; nothing removes the second.
  client->_clearSyncState();
  platform.memoryFiles.removeItem(KXSyncClient::pathToRestoreContext(platform), nullptr);
  platform.backup.paths = {kA, kMovie, kA};
  client->outstandingAssetTransfers();
  client->assetTransfer(request(kA), false, frError(5));
  EXPECT_EQ(restoredOnDisk(), (Texts{kA, kA}));
  EXPECT_EQ(outstanding(), (Texts{kA, kMovie}));
  client->assetTransfer(request(kMovie), true, nullptr);
  EXPECT_EQ(platform.porter.updates(), (Updates{{"UA", {kMovie}}}));
}

TEST_F(RestoreTransfersTest, AFailureWithoutErrorEndsAtOnce) {
  const FRAssetPtr r = request(kA);
  client->assetTransfer(r, false, nullptr);
  EXPECT_EQ(loggedBy("_restoreAssetTransfer"),
            (Texts{"restored asset: " + r->description() + "   isAvailableAtPath: " + kA +
                       " success: NO error: (null)",
                   "We got a potentially recoverable error when trying to restore an asset " +
                       r->description(),
                   "Nothing to do for now."}));
  for (const std::string& text : loggedBy("_restoreAssetTransfer")) {
    EXPECT_TRUE(logged(LogLevel::kInfo, text)) << text;
  }
  EXPECT_NE(request(kA), nullptr);
  EXPECT_EQ(restoredInMemory(), Texts{});
}

TEST_F(RestoreTransfersTest, ASuccessWithAnErrorIsASuccess) {
  client->assetTransfer(request(kA), true, frError(5));
  EXPECT_EQ(status(kA), 2);
  EXPECT_EQ(request(kA), nullptr);
}

TEST_F(RestoreTransfersTest, AFileWithoutGroupIsReportedWithoutIdentifier) {
  struct Row {
    const char* description;
    std::optional<std::string> path;
    bool succeeded;
    ErrorPtr error;
    bool reported;
  };
  const std::vector<Row> rows = {{"success", kBase + "X.JPG", true, nullptr, true},
                                 {"recoverable", kBase + "X.JPG", false, frError(7), true},
                                 {"unrecoverable", kBase + "X.JPG", false, frError(5), true},
                                 {"no error", kBase + "X.JPG", false, nullptr, false},
                                 {"no path", std::nullopt, true, nullptr, true}};
  std::size_t reports = 0;
  for (const Row& row : rows) {
    SCOPED_TRACE(row.description);
    const FRAssetPtr r = FRAsset::downloadAssetWithIdentifier("X", "Photo", std::nullopt);
    r->setIsRestore(true);
    r->setPath(row.path);
    client->assetTransfer(r, row.succeeded, row.error);
    reports += row.reported ? 1 : 0;
    ASSERT_EQ(platform.porter.updates().size(), reports);
    EXPECT_EQ(platform.porter.updates().back(), (RecordingPorter::Update{std::nullopt, {}}));
  }
  EXPECT_TRUE(logged(LogLevel::kInfo, "Looking at group (null)"));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Group with uuid (null) is complete!"));
  EXPECT_EQ(status(kA), 0);
}

TEST_F(RestoreTransfersTest, ASettledGroupIsReportedAgain) {
  const FRAssetPtr r = request(kA);
  client->assetTransfer(r, true, nullptr);
  client->assetTransfer(request(kMovie), true, nullptr);
  client->assetTransfer(r, true, nullptr);
  EXPECT_EQ(platform.porter.updates().size(), 2U);
}

TEST_F(RestoreTransfersTest, AnUnnamedStatusCountsAsSettled) {
  (*(*client->restorePathToAssetGroup()->find(kBase + "A"))->assetPairs())[0]->setStatus(9);
  client->assetTransfer(request(kA), true, nullptr);
  EXPECT_TRUE(logged(LogLevel::kInfo, "Pair: " + kMovie + "  has status: (null)"));
  EXPECT_EQ(platform.porter.updates(), (Updates{{"UA", {kA}}}));
}

TEST_F(RestoreTransfersTest, WithoutContextNothingIsRemembered) {
  client->setRestoreContext(std::nullopt);
  client->assetTransfer(request(kA), false, frError(5));
  client->assetTransfer(request(kMovie), true, nullptr);
  EXPECT_EQ(platform.porter.updates(), (Updates{{"UA", {kMovie}}}));
  EXPECT_FALSE(client->restoreContext().has_value());
  EXPECT_EQ(restoredOnDisk(), (Texts{"(null)"}));
}

TEST_F(RestoreTransfersTest, ACancelledRestoreOnlyLogs) {
  client->restoreEndedWithError(frError(7));
  EXPECT_EQ(platform.captured.texts(),
            (Texts{"Photos restore was cancelled with error: Error Domain=FRError Code=7"}));
  EXPECT_TRUE(logged(LogLevel::kInfo,
                     "Photos restore was cancelled with error: Error Domain=FRError Code=7"));
  EXPECT_EQ(outstanding().size(), 2U);
  EXPECT_NE(client->library(), nullptr);
}

TEST_F(RestoreTransfersTest, AWholeRestoreEndsFinalizedAndResumesWithoutItsFiles) {
  client->assetTransfer(request(kMovie), true, nullptr);
  client->assetTransfer(request(kA), true, nullptr);
  client->assetTransferEndedWithSuccess(true);
  EXPECT_EQ(platform.porter.finalizations(), (std::vector<bool>{true}));
  EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t1 n0");
  EXPECT_EQ(pending(OwnAlbum::kShoebox), "t1 n0");
  EXPECT_TRUE(client->outstandingAssetTransfers().empty());
}

TEST(KXSyncAssetGroupTest, StartsEmptyAndKeepsWhatItIsGiven) {
  KXSyncAssetGroup group;
  EXPECT_EQ(group.uuid(), std::nullopt);
  EXPECT_EQ(group.assetPairs(), nullptr);
  group.setUuid("U");
  const auto pairs = std::make_shared<KXSyncAssetGroup::Pairs>();
  group.setAssetPairs(pairs);
  EXPECT_EQ(group.uuid(), "U");
  EXPECT_EQ(group.assetPairs(), pairs);
  KXSyncFileStatusPair pair("/a");
  EXPECT_EQ(pair.path(), "/a");
  EXPECT_EQ(pair.status(), 0);
  pair.setStatus(-3);
  EXPECT_EQ(pair.status(), -3);
}

}  // namespace
}  // namespace kx
