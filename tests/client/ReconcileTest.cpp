#include "platform/foundation/Exceptions.h"
#include "tests/client/ClientFixture.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {
namespace {

class ReconcileTest : public ClientTest {
 protected:
  static SnapshotBuilder plainSnapshot() {
    return SnapshotBuilder().asset("A").album("AL", "Trip", {"A"}).masterAlbum({"A"});
  }
  std::string agentPath() { return platform.library.syncInfoPath(); }
};

// A decoder that ends with an error, with nothing, or with both.
class DecoderDouble final : public KXSTransportDecoder {
 public:
  KXSLibraryChangeSnapshotPtr decodeSnapshotFromPropertyList(const Value&,
                                                             ErrorPtr* error) override {
    setError(error, failure);
    return snapshot;
  }
  ErrorPtr failure;
  KXSLibraryChangeSnapshotPtr snapshot;
};

TEST_F(ReconcileTest, OnTheMainThreadRaises) {
  platform.onMainThread = true;
  try {
    client->reconcileSync(1, "1", {}, nullptr);
    FAIL() << "no exception";
  } catch (const InternalInconsistency& exception) {
    EXPECT_STREQ(exception.what(),
                 "Ferrule plugins should only be run on a non-main-thread queue!");
  }
  EXPECT_TRUE(client->syncRequested());
}

TEST_F(ReconcileTest, LogsItsStepsInOrder) {
  knowLibrary();
  EXPECT_TRUE(reconcile(SnapshotBuilder()));
  const Texts texts = loggedBy("reconcileSync");
  ASSERT_EQ(texts.size(), 6U);
  EXPECT_EQ(texts[0], "Reconcile Sync: (type=1) anchor: 1");
  EXPECT_EQ(texts[1], "Library before: (null)");
  EXPECT_EQ(texts[2], "Loading up change snapshot");
  EXPECT_EQ(texts[3], "Sync url file:///var/mobile/Media/Photos/Sync/PhotoLibrary.plist");
  EXPECT_TRUE(texts[4].starts_with("snapshot "));
  EXPECT_TRUE(texts[4].ends_with(" err: (null)"));
  EXPECT_EQ(texts[5], "Done reconciling! isResync 0, Outstanding assets: ()");
  EXPECT_EQ(platform.captured.firstWithPrefix("snapshot ").level, LogLevel::kError);
  for (const char* text : {"Reconcile Sync: (type=1) anchor: 1", "Library before: (null)",
                           "Loading up change snapshot",
                           "Sync url file:///var/mobile/Media/Photos/Sync/PhotoLibrary.plist",
                           "Done reconciling! isResync 0, Outstanding assets: ()"}) {
    EXPECT_TRUE(logged(LogLevel::kInfo, text)) << text;
  }
}

TEST_F(ReconcileTest, ReconcileMetadataLogsBeforeAndAfterItsBlocks) {
  knowLibrary();
  EXPECT_TRUE(reconcile(SnapshotBuilder()));
  EXPECT_EQ(loggedBy("_reconcileMetadata"),
            (Texts{"Entering reconcileMetadata", "Waiting for reconcile to finish",
                   "Leaving reconcileMetadata!"}));
  for (const std::string& text : loggedBy("_reconcileMetadata")) {
    EXPECT_TRUE(logged(LogLevel::kInfo, text));
  }
}

TEST_F(ReconcileTest, AFirstSyncIsAResync) {
  EXPECT_TRUE(reconcile(plainSnapshot()));
  EXPECT_TRUE(client->isResync());
  EXPECT_TRUE(logged(LogLevel::kInfo,
                     "Forcing resync based on CurrentLibraryUUID.plist: previous (null), snapshot "
                     "LIBRARY"));
  EXPECT_EQ(readPlist(kKXCurrentLibraryUUIDPath),
            Value::dictionary({{"libraryUUID", Value::string("LIBRARY")}}));
}

TEST_F(ReconcileTest, TheStoredLibraryDecidesWithoutAPreviousSnapshot) {
  struct Row {
    const char* description;
    Value stored;
    bool resync;
  };
  const std::vector<Row> rows = {
      {"the same", Value::dictionary({{"libraryUUID", Value::string("LIBRARY")}}), false},
      {"another", Value::dictionary({{"libraryUUID", Value::string("OTHER")}}), true},
      {"no text", Value::dictionary({{"libraryUUID", Value::integer(4)}}), true},
      {"no key", Value::dictionary({}), true},
      {"no dictionary", Value::array({}), true}};
  for (const Row& row : rows) {
    SCOPED_TRACE(row.description);
    platform.memoryFiles.writeFileAtomically(
        kKXCurrentLibraryUUIDPath,
        writePropertyList(row.stored, PropertyListFormat::kBinary, nullptr), nullptr);
    EXPECT_TRUE(reconcile(plainSnapshot()));
    EXPECT_EQ(client->isResync(), row.resync);
  }
  EXPECT_TRUE(logged(LogLevel::kInfo,
                     "Forcing resync based on CurrentLibraryUUID.plist: previous OTHER, snapshot "
                     "LIBRARY"));
}

TEST_F(ReconcileTest, TheSameSnapshotAgainIsANullSync) {
  const SnapshotBuilder snapshot = plainSnapshot();
  wholeSync(snapshot);
  ASSERT_TRUE(platform.memoryFiles.fileExists(KXPreviousMetadataSyncFilePath));
  ASSERT_TRUE(prepare());
  const std::size_t rows = platform.library.rowsWritten();
  const std::size_t writes = platform.memoryFiles.writes();
  platform.fakeClock.advance(60);
  EXPECT_TRUE(reconcile(snapshot));
  EXPECT_TRUE(logged(LogLevel::kDebug, "NULL PHOTO SYNC DETECTED - NO RECONCILING NEEDED"));
  EXPECT_EQ(platform.library.rowsWritten(), rows);
  EXPECT_EQ(platform.memoryFiles.writes(), writes + 2U);  // the agent info, removed and made
  EXPECT_TRUE(platform.memoryFiles.fileExists(KXPreviousMetadataSyncFilePath));
  EXPECT_EQ(client->libraryChangeSnapshot(), nullptr);
  EXPECT_EQ(client->albumsAndEvents(), nullptr);
  EXPECT_TRUE(client->isResync());  // as the sync before left it
  EXPECT_TRUE(client->syncRequested());
  EXPECT_EQ(client->lastSyncJobsSaveTime(), platform.fakeClock.now().secondsSinceReference);
  EXPECT_TRUE(outstanding().empty());
}

TEST_F(ReconcileTest, AnotherLibraryIsAResyncAlthoughThereIsAPreviousSnapshot) {
  wholeSync(plainSnapshot());
  platform.captured.clear();
  EXPECT_TRUE(reconcile(plainSnapshot().library("OTHER")));
  EXPECT_TRUE(client->isResync());
  EXPECT_EQ(platform.captured.firstWithPrefix("Forcing resync").text, "");
}

TEST_F(ReconcileTest, AChangedSnapshotOfTheSameLibraryIsNoResync) {
  wholeSync(plainSnapshot());
  EXPECT_TRUE(reconcile(plainSnapshot().asset("B")));
  EXPECT_FALSE(client->isResync());
  EXPECT_EQ(outstanding(), (Texts{"B"}));
  EXPECT_FALSE(platform.memoryFiles.fileExists(KXPreviousMetadataSyncFilePath));
}

TEST_F(ReconcileTest, ABadPreviousSnapshotIsNone) {
  knowLibrary();
  const auto noDictionary =
      writePropertyList(Value::array({}), PropertyListFormat::kBinary, nullptr);
  const auto unknownItem = SnapshotBuilder()
                               .item(Value::dictionary({{"uuid", Value::string("F")},
                                                        {"itemType", Value::string("Folder")}}))
                               .bytes();
  const auto noTextUUID = writePropertyList(Value::dictionary({{"libraryUUID", Value::integer(1)}}),
                                            PropertyListFormat::kBinary, nullptr);
  const std::vector<std::vector<std::uint8_t>> contents = {
      {}, {'x'}, noDictionary, unknownItem, noTextUUID};
  for (const auto& content : contents) {
    platform.memoryFiles.writeFileAtomically(KXPreviousMetadataSyncFilePath, content, nullptr);
    EXPECT_TRUE(reconcile(SnapshotBuilder()));
    EXPECT_FALSE(client->isResync());
    EXPECT_FALSE(platform.memoryFiles.fileExists(KXPreviousMetadataSyncFilePath));
  }
}

TEST_F(ReconcileTest, AnEmptySnapshotIsNoNullSyncWithoutAPreviousOne) {
  EXPECT_TRUE(reconcile(SnapshotBuilder().library(std::nullopt, std::nullopt)));
  EXPECT_FALSE(logged(LogLevel::kDebug, "NULL PHOTO SYNC DETECTED - NO RECONCILING NEEDED"));
}

TEST_F(ReconcileTest, AMissingSnapshotGivesTheReadersError) {
  knowLibrary();
  platform.memoryFiles.putText(agentPath(), "old");
  platform.memoryFiles.putText(KXPreviousMetadataSyncFilePath, "previous");
  const std::string before = *platform.memoryFiles.text(kKXCurrentLibraryUUIDPath);
  ErrorPtr error;
  EXPECT_FALSE(client->reconcileSync(1, "1", {}, &error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), kPropertyListErrorDomain);
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(PropertyListError::kIo));
  EXPECT_TRUE(client->syncRequested());
  EXPECT_FALSE(platform.memoryFiles.fileExists(agentPath()));
  EXPECT_EQ(platform.memoryFiles.text(kKXCurrentLibraryUUIDPath), before);
  EXPECT_EQ(platform.memoryFiles.text(KXPreviousMetadataSyncFilePath), "previous");
  EXPECT_EQ(client->outstandingAssets(), nullptr);
  EXPECT_EQ(client->libraryChangeSnapshot(), nullptr);
  EXPECT_TRUE(logged(LogLevel::kError, "snapshot (null) err: (null)"));
  EXPECT_EQ(platform.library.rowsWritten(), 0U);
}

TEST_F(ReconcileTest, AFileThatIsNoPropertyListGivesTheReadersError) {
  platform.memoryFiles.putText(kKXSnapshotPath, "not a property list");
  ErrorPtr error;
  EXPECT_FALSE(client->reconcileSync(1, "1", {}, &error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), kPropertyListErrorDomain);
}

TEST_F(ReconcileTest, ARootThatIsNoDictionaryGivesTheBundlesError) {
  platform.memoryFiles.writeFileAtomically(
      kKXSnapshotPath, writePropertyList(Value::array({}), PropertyListFormat::kBinary, nullptr),
      nullptr);
  ErrorPtr error;
  EXPECT_FALSE(client->reconcileSync(1, "1", {}, &error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), "com.veltro.kxsyncbundle");
  EXPECT_EQ(error->code(), -2);
  EXPECT_TRUE(error->userInfo().isNull());
  EXPECT_FALSE(client->reconcileSync(1, "1", {}, nullptr));
  EXPECT_FALSE(platform.memoryFiles.fileExists(kKXCurrentLibraryUUIDPath));
}

TEST_F(ReconcileTest, ADecodersErrorIsForwarded) {
  const auto decoder = std::make_shared<DecoderDouble>();
  decoder->failure = Error::make("KXS", 9, "bad");
  platform.decoder = decoder;
  ErrorPtr error;
  EXPECT_FALSE(reconcile(plainSnapshot(), &error));
  EXPECT_EQ(error, decoder->failure);
  EXPECT_TRUE(logged(LogLevel::kInfo, "Forwarding error from KXS"));
  EXPECT_TRUE(logged(LogLevel::kError, "snapshot (null) err: Error Domain=KXS Code=9 \"bad\""));
  EXPECT_FALSE(reconcile(plainSnapshot(), nullptr));
  EXPECT_FALSE(platform.memoryFiles.fileExists(kKXCurrentLibraryUUIDPath));
  EXPECT_EQ(client->libraryChangeSnapshot(), nullptr);
}

TEST_F(ReconcileTest, ADecoderThatGivesNothingEndsWithTheBundlesError) {
  platform.decoder = std::make_shared<DecoderDouble>();
  ErrorPtr error;
  EXPECT_FALSE(reconcile(plainSnapshot(), &error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), "com.veltro.kxsyncbundle");
  EXPECT_EQ(error->code(), -2);
}

TEST_F(ReconcileTest, AnExceptionWhileDecodingLeavesTheCall) {
  platform.memoryFiles.putText(agentPath(), "old");
  const SnapshotBuilder bad = SnapshotBuilder().item(
      Value::dictionary({{"uuid", Value::string("F")}, {"itemType", Value::string("Folder")}}));
  try {
    reconcile(bad);
    FAIL() << "no exception";
  } catch (const InternalInconsistency& exception) {
    EXPECT_STREQ(exception.what(), "Unknown object type");
  }
  EXPECT_TRUE(client->syncRequested());
  EXPECT_FALSE(platform.memoryFiles.fileExists(agentPath()));
  EXPECT_FALSE(platform.memoryFiles.fileExists(kKXCurrentLibraryUUIDPath));
}

TEST_F(ReconcileTest, WhatTheHostSaysAboutItselfIsKept) {
  platform.memoryFiles.putText(agentPath(), "old");
  EXPECT_TRUE(reconcile(plainSnapshot().userAgent("host/1.0")));
  EXPECT_EQ(readPlist(agentPath()), Value::dictionary({{"userAgent", Value::string("host/1.0")},
                                                       {"libraryKind", Value::string("Cassock")}}));
  EXPECT_TRUE(reconcile(plainSnapshot()));
  EXPECT_EQ(readPlist(agentPath()), Value::dictionary({{"libraryKind", Value::string("Cassock")}}));
}

TEST_F(ReconcileTest, AHostThatSaysNothingLeavesNoAgentInfo) {
  platform.memoryFiles.putText(agentPath(), "old");
  EXPECT_TRUE(reconcile(SnapshotBuilder().library("LIBRARY", std::nullopt)));
  EXPECT_FALSE(platform.memoryFiles.fileExists(agentPath()));
}

TEST_F(ReconcileTest, AnAgentInfoFileThatStaysIsLogged) {
  platform.memoryFiles.putText(agentPath(), "old");
  platform.faultyFiles.setFault([this](std::string_view operation, const std::string& path) {
    return operation == "removeItem" && path == agentPath() ? posixError(13) : nullptr;
  });
  EXPECT_TRUE(reconcile(plainSnapshot()));
  EXPECT_TRUE(logged(LogLevel::kError, "Failed to remove syncUserAgentInfoFile at path " +
                                           agentPath() + " err: Error Domain=POSIX Code=13"));
}

TEST_F(ReconcileTest, TheMasterAlbumIsTakenOut) {
  knowLibrary();
  EXPECT_TRUE(reconcile(plainSnapshot()));
  ASSERT_NE(client->masterAlbum(), nullptr);
  EXPECT_EQ(client->masterAlbum()->uuid(), "MASTER");
  EXPECT_FALSE(client->albumsAndEvents()->contains("MASTER"));
  EXPECT_TRUE(client->albumsAndEvents()->contains("AL"));
  EXPECT_TRUE(client->libraryChangeSnapshot()->albumsAndEventsByUUID()->contains("MASTER"));
}

TEST_F(ReconcileTest, WithoutAMasterAlbumThereIsNone) {
  EXPECT_TRUE(reconcile(SnapshotBuilder().album("AL", "Trip", {})));
  EXPECT_EQ(client->masterAlbum(), nullptr);
}

TEST_F(ReconcileTest, AMasterAlbumLeftFromBeforeStaysAndTakesNothingOut) {
  const KXSAlbumPtr before = KXSAlbum::albumWithUUID("AL");
  client->setMasterAlbum(before);
  EXPECT_TRUE(reconcile(SnapshotBuilder().album("AL", "Trip", {})));
  EXPECT_EQ(client->masterAlbum(), before);
  EXPECT_TRUE(client->albumsAndEvents()->contains("AL"));
}

TEST_F(ReconcileTest, TheFirstOfSeveralMasterAlbumsIsTaken) {
  EXPECT_TRUE(reconcile(SnapshotBuilder().masterAlbum({}, "M1").masterAlbum({}, "M2")));
  EXPECT_EQ(client->masterAlbum()->uuid(), "M1");
  EXPECT_TRUE(client->albumsAndEvents()->contains("M2"));
}

TEST_F(ReconcileTest, AnExceptionInABlockIsThrownAgainAfterTheOthersAreDone) {
  knowLibrary();
  addSynced("A");
  const SnapshotBuilder bad =
      SnapshotBuilder().asset("A").item(Value::dictionary({{"uuid", Value::string("AL")},
                                                           {"itemType", Value::string("Album")},
                                                           {"albumName", Value::integer(3)}}));
  EXPECT_THROW(reconcile(bad), TypeError);
  EXPECT_EQ(albums(), "");
  EXPECT_EQ(assets(), "A");
  EXPECT_EQ(platform.library.blockExceptions().size(), 1U);
  EXPECT_EQ(pending(OwnAlbum::kSyncProgress), "t1 n0");
  EXPECT_TRUE(logged(LogLevel::kInfo, "Waiting for reconcile to finish"));
  EXPECT_FALSE(logged(LogLevel::kInfo, "Leaving reconcileMetadata!"));
  client->assetTransferEndedWithSuccess(false);
}

TEST_F(ReconcileTest, AnExceptionBeforeTheAssetBlockWaitsForTheAlbumBlock) {
  knowLibrary();
  const SnapshotBuilder bad =
      SnapshotBuilder()
          .item(Value::dictionary({{"uuid", Value::string("A")},
                                   {"itemType", Value::string("Asset")},
                                   {"exposureDate", Value::string("today")}}))
          .album("AL", "Trip", {})
          .masterAlbum({"A"});
  EXPECT_THROW(reconcile(bad), TypeError);
  EXPECT_EQ(albums(), "Trip(t2 n0)[]");
}

TEST_F(ReconcileTest, ASyncWhoseTransactionsFailStillReturns) {
  knowLibrary();
  platform.library.failCommits(3, 1);
  EXPECT_TRUE(reconcile(plainSnapshot()));
  EXPECT_EQ(albums(), "");
  EXPECT_EQ(platform.library.failedCommits(), 3U);
}

}  // namespace
}  // namespace kx
