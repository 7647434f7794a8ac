#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

constexpr const char* kDcim = "/var/mobile/Media/DCIM";
const std::string kA = std::string(kDcim) + "/100AB/A.JPG";
const std::string kAMovie = std::string(kDcim) + "/100AB/A.MOV";
const std::string kB = std::string(kDcim) + "/100AB/B.JPG";
const std::string kC = std::string(kDcim) + "/100AB/C.JPG";

class RestorePlanningTest : public ClientTest {
 protected:
  void addIncomplete(const std::optional<std::string>& uuid, std::vector<std::string> files) {
    AssetSeed seed;
    seed.uuid = uuid;
    seed.savedAssetType = 0;
    seed.files = std::move(files);
    seed.incomplete = true;
    platform.library.addAsset(seed);
  }
  Texts plan() {
    client->_initializeLibrary();
    Texts paths;
    for (const FRAssetPtr& request : client->_neededRestoreAssets()) {
      EXPECT_TRUE(request->isRestore());
      EXPECT_TRUE(request->isDownload());
      EXPECT_EQ(request->dataclass(), "Photo");
      EXPECT_EQ(request->identifier(), request->path());
      EXPECT_EQ(request->prettyName(), request->path());
      paths.push_back(*request->path());
    }
    return paths;
  }
  std::string contextPath() { return KXSyncClient::pathToRestoreContext(platform); }
  void writeContext(Dictionary context) {
    platform.memoryFiles.writeFileAtomically(
        contextPath(),
        writePropertyList(Value::dictionary(std::move(context)), PropertyListFormat::kBinary,
                          nullptr),
        nullptr);
  }
  std::string backupPlan(const std::string& path) {
    platform.backup.paths = Texts{path};
    client->_clearSyncState();
    platform.memoryFiles.removeItem(contextPath(), nullptr);
    const Texts paths = plan();
    return paths.empty() ? "" : paths.front();
  }
};

TEST_F(RestorePlanningTest, AFirstAttemptTrustsADatabaseThatListsEverything) {
  addIncomplete("UA", {kA});
  addIncomplete("UB", {kB});
  platform.backup.paths = {kB, kA};
  setPending(OwnAlbum::kShoebox, 7, 9);
  EXPECT_EQ(plan(), (Texts{kA, kB}));
  EXPECT_EQ(readPlist(contextPath()),
            Value::dictionary({{kKXSyncRestoreContextUseDatabaseKey, Value::boolean(true)}}));
  EXPECT_EQ(pending(OwnAlbum::kShoebox), "t7 n9");
  EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t4 n2");
  EXPECT_TRUE(logged(LogLevel::kInfo, "First time attempting this restore"));
  EXPECT_EQ(platform.captured.firstWithPrefix("The database can't").text, "");
}

TEST_F(RestorePlanningTest, ThePlanIsLogged) {
  platform.backup.paths = {kB, kA};
  client->_initializeLibrary();
  const auto requests = client->_neededRestoreAssets();
  const Texts texts = loggedBy("_neededRestoreAssets");
  EXPECT_EQ(texts, (Texts{"<===----- The list of backedup files is", "   " + kB, "   " + kA,
                          "First time attempting this restore",
                          "Found assets in the filesystem which are missing from the database",
                          "The database can't help us here, consulting the backup list",
                          "Paths to restore = (\n    " + requests[0]->description() + ",\n    " +
                              requests[1]->description() + "\n)"}));
  for (const std::string& text : texts) EXPECT_TRUE(logged(LogLevel::kInfo, text)) << text;
}

TEST_F(RestorePlanningTest, AFileThatTheDatabaseLacksMeansTheBackupList) {
  addIncomplete("UA", {kA});
  platform.backup.paths = {kC, kA};
  EXPECT_EQ(plan(), (Texts{kA, kC}));
  EXPECT_EQ(readPlist(contextPath()), Value::dictionary({}));
  EXPECT_EQ(pending(OwnAlbum::kShoebox), "t4 n2");
  EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t4 n2");
}

TEST_F(RestorePlanningTest, AnEmptyDatabaseMeansTheBackupListEvenWhenThatIsEmpty) {
  struct Row {
    Texts backup;
    bool hasExtra;
    const char* pending;
  };
  for (const Row& row : {Row{{}, false, "t1 n0"}, Row{{kA}, true, "t4 n1"}}) {
    client->_clearSyncState();
    platform.memoryFiles.removeItem(contextPath(), nullptr);
    platform.captured.clear();
    platform.backup.paths = row.backup;
    EXPECT_EQ(plan(), row.backup);
    EXPECT_EQ(logged(LogLevel::kInfo,
                     "Found assets in the filesystem which are missing from the database"),
              row.hasExtra);
    EXPECT_TRUE(
        logged(LogLevel::kInfo, "The database can't help us here, consulting the backup list"));
    EXPECT_EQ(pending(OwnAlbum::kShoebox), row.pending);
    EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), row.pending);
  }
}

TEST_F(RestorePlanningTest, AnUnavailableBackupListIsAnEmptyOne) {
  struct Row {
    const char* description;
    TestPlatform::BackupAnswer answer;
    const char* error;
  };
  const std::vector<Row> rows = {
      {"an error", {std::nullopt, posixError(5)}, "Error Domain=POSIX Code=5"},
      {"no list", {std::nullopt, nullptr}, "(null)"},
      {"a list and an error", {Texts{kA}, posixError(5)}, "Error Domain=POSIX Code=5"}};
  for (const Row& row : rows) {
    SCOPED_TRACE(row.description);
    client->_clearSyncState();
    platform.memoryFiles.removeItem(contextPath(), nullptr);
    platform.captured.clear();
    platform.backup = row.answer;
    EXPECT_EQ(plan(), Texts{});
    EXPECT_TRUE(logged(
        LogLevel::kWarning,
        std::string("Could not retrieve the list of files backed up. Error = ") + row.error));
    EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t1 n0");
  }
}

TEST_F(RestorePlanningTest, AResumedRestoreFromTheBackupListSkipsSettledFiles) {
  writeContext(Dictionary({{kKXSyncRestoreContextRestoredFilesKey,
                            Value::array({Value::string(kA), Value::integer(4)})}}));
  platform.backup.paths = {kA, kB};
  const Value before = readPlist(contextPath());
  EXPECT_EQ(plan(), (Texts{kB}));
  EXPECT_TRUE(
      logged(LogLevel::kInfo, "Resuming restore without using the database for the asset list"));
  EXPECT_EQ(readPlist(contextPath()), before);
  EXPECT_EQ(pending(OwnAlbum::kShoebox), "t4 n1");
}

TEST_F(RestorePlanningTest, AResumedRestoreFromTheDatabaseComparesNothing) {
  writeContext(Dictionary({{kKXSyncRestoreContextUseDatabaseKey, Value::boolean(true)}}));
  addIncomplete("UA", {kA});
  platform.backup.paths = {kA, kC};
  EXPECT_EQ(plan(), (Texts{kA}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Resuming restore with incomplete files from the database"));
  EXPECT_EQ(pending(OwnAlbum::kShoebox), "t1 n0");
  EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t4 n1");
}

TEST_F(RestorePlanningTest, ABadContextFileIsNone) {
  for (const std::string content : {"", "garbage"}) {
    platform.memoryFiles.putText(contextPath(), content);
    client->_clearSyncState();
    platform.captured.clear();
    plan();
    EXPECT_TRUE(logged(LogLevel::kInfo, "First time attempting this restore"));
  }
}

TEST_F(RestorePlanningTest, AContextInMemoryIsNotReadAgain) {
  plan();
  writeContext(Dictionary({{kKXSyncRestoreContextUseDatabaseKey, Value::boolean(true)}}));
  client->_loadRestoreContext();
  EXPECT_TRUE(client->restoreContext()->empty());
  client->_clearSyncState();
  client->_loadRestoreContext();
  EXPECT_EQ(client->restoreContext()->size(), 1U);
}

TEST_F(RestorePlanningTest, AContextThatCannotBeWrittenIsIgnored) {
  platform.backup.paths = {kA};
  platform.faultyFiles.setFault([](std::string_view operation, const std::string&) {
    return operation == "writeFileAtomically" ? posixError(28) : nullptr;
  });
  EXPECT_EQ(plan(), (Texts{kA}));
}

TEST_F(RestorePlanningTest, BackupEntriesArePickedByTheirPath) {
  const std::string dcim = kDcim;
  struct Row {
    std::string path;
    bool kept;
  };
  const std::vector<Row> rows = {{dcim + "/100AB/1.JPG", true},
                                 {dcim + "/100AB/1.J", true},
                                 {dcim + "/100AB/1.JPEG", true},
                                 {dcim + "/100AB/1.JPEG2", false},
                                 {dcim + "/100AB/IMG_0001", false},
                                 {dcim + "/100AB/1.", false},
                                 {dcim + "/.MISC/1.JPG", false},
                                 {dcim + "/100AB.MISC/1.JPG", false},
                                 {dcim, false},
                                 {"/private" + dcim + "/1.JPG", false},
                                 {"/var/mobile/Media/Other/1.JPG", false},
                                 {dcim + "2/1.JPG", true},  // a plain prefix
                                 {dcim + "/a.b/x", true},   // the dot is near enough
                                 {dcim + "/1.\xC3\xA4\xC3\xA4\xC3\xA4\xC3\xA4", true},
                                 {dcim + "/1.\xF0\x9F\x98\x80zzz", false}};
  for (const Row& row : rows) {
    EXPECT_EQ(backupPlan(row.path), row.kept ? row.path : "") << row.path;
  }
}

TEST_F(RestorePlanningTest, CascadeFilesAreNeverAskedFor) {
  const std::string cascade = std::string(kDcim) + "/CascadesData/1.JPG";
  platform.backup.paths = {cascade, kA};
  EXPECT_EQ(plan(), (Texts{kA}));
  client->_clearSyncState();
  platform.memoryFiles.removeItem(contextPath(), nullptr);
  addIncomplete("UC", {kA, "/var/mobile/Media/xCascadesDatax/1.JPG"});
  platform.backup.paths = Texts{};
  EXPECT_EQ(plan(), (Texts{kA}));
}

TEST_F(RestorePlanningTest, FilesOfOneNameFormOneGroup) {
  addIncomplete("UA", {kAMovie, kA});
  addIncomplete("UX", {"/var/mobile/Media/DCIM/100AB/X.JPG"});
  addIncomplete(std::nullopt, {kC});
  platform.backup.paths = {kB, kAMovie, kA};
  EXPECT_EQ(plan(), (Texts{kA, kAMovie, kB}));
  const auto groups = client->restorePathToAssetGroup();
  ASSERT_EQ(groups->size(), 2U);
  const auto group = *groups->find(std::string(kDcim) + "/100AB/A");
  EXPECT_EQ(group->uuid(), "UA");
  ASSERT_EQ(group->assetPairs()->size(), 2U);
  EXPECT_EQ((*group->assetPairs())[0]->path(), kAMovie);  // in the list's order
  EXPECT_EQ((*group->assetPairs())[1]->path(), kA);
  EXPECT_EQ((*group->assetPairs())[0]->status(), 0);
  EXPECT_EQ((*groups->find(std::string(kDcim) + "/100AB/B"))->uuid(), std::nullopt);
  EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t4 n2");
}

TEST_F(RestorePlanningTest, DatabasePathsComeFromTheAssetsThemselves) {
  addIncomplete("UA", {kA, kAMovie});
  client->_initializeLibrary();
  inTransaction([&] {
    const KXSyncClient::IncompletePaths incomplete = {
        {"UA", "/anything"}, {"", kB}, {"GONE", kC}, {"UA", kA}};
    EXPECT_EQ(client->_restorePathsFromIncompletePaths(incomplete),
              (Texts{kA, kAMovie, kA, kAMovie}));
  });
}

TEST_F(RestorePlanningTest, ANewPlanDropsTheGroupsOfTheOneBefore) {
  platform.backup.paths = {kA};
  plan();
  platform.backup.paths = {kB};
  plan();
  EXPECT_EQ(client->restorePathToAssetGroup()->size(), 1U);
}

TEST_F(RestorePlanningTest, TheOrderIsThatOfTheBytesAndTheGroupsThatOfTheList) {
  const std::string lower = std::string(kDcim) + "/100AB/a.JPG";
  platform.backup.paths = {lower, kB, kA};
  EXPECT_EQ(plan(), (Texts{kA, kB, lower}));
  Texts groups;
  for (const auto& entry : *client->restorePathToAssetGroup())
    groups.emplace_back(entry.key.stringValue());
  const std::string folder = std::string(kDcim) + "/100AB/";
  EXPECT_EQ(groups, (Texts{folder + "a", folder + "B", folder + "A"}));
}

TEST_F(RestorePlanningTest, TheContextIsWrittenByAFirstAttemptAlone) {
  for (const bool useDatabase : {true, false}) {
    writeContext(
        Dictionary({{kKXSyncRestoreContextUseDatabaseKey, Value::boolean(useDatabase)},
                    {kKXSyncRestoreContextRestoredFilesKey, Value::array({Value::string(kC)})}}));
    client->_clearSyncState();
    int writes = 0;
    platform.faultyFiles.setFault([&](std::string_view operation, const std::string&) -> ErrorPtr {
      writes += operation == "writeFileAtomically" ? 1 : 0;
      return nullptr;
    });
    plan();
    EXPECT_EQ(writes, 0);
  }
}

TEST_F(RestorePlanningTest, OneCountOfTheTwoAlbumsAloneIsEnoughToWriteIt) {
  platform.backup.paths = {kA};
  setPending(OwnAlbum::kShoebox, 4, 0);          // the type is right already
  setPending(OwnAlbum::kRestoreProgress, 1, 1);  // the count is
  plan();
  EXPECT_EQ(pending(OwnAlbum::kShoebox), "t4 n1");
  EXPECT_EQ(pending(OwnAlbum::kRestoreProgress), "t4 n1");
}

TEST_F(RestorePlanningTest, CountsThatAreRightAlreadyAreNotWritten) {
  setPending(OwnAlbum::kShoebox, 1, 0);
  setPending(OwnAlbum::kRestoreProgress, 1, 0);
  plan();
  EXPECT_EQ(platform.library.rowsWritten(), 0U);
}

}  // namespace
}  // namespace kx
