#include "records/KXSFolder.h"
#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class AlbumReconciliationTest : public ClientTest {
 protected:
  std::string thumbnail(const std::string& uuid) {
    return platform.library.tesselSyncedFaceAlbumThumbnailsDirectory() + "/" + uuid + ".JPG";
  }
  std::int32_t kindOf(const std::string& uuid) {
    std::int32_t kind = 0;
    platform.library.perform([&](InMemoryLibraryState& state) {
      kind = state.store.albums.at(state.store.albumWithUUID(uuid)).kind;
    });
    return kind;
  }
  void SetUp() override { knowLibrary(); }
};

TEST_F(AlbumReconciliationTest, RecordsBecomeContainersOfTheirKind) {
  EXPECT_TRUE(reconcile(SnapshotBuilder()
                            .album("PLAIN", "Trip", {})
                            .album("OTHER", "Odd", {}, 9)
                            .album("FACES", "Ann", {}, SnapshotBuilder::kFaceAlbum)
                            .album("DAY", "Sunday", {}, SnapshotBuilder::kEventAlbum)
                            .event("EVENT", "Monday")
                            .event("NAMELESS", std::nullopt)));
  EXPECT_EQ(albums(), "Trip(t2 n0)[] Odd(t2 n0)[]");
  EXPECT_EQ(faceAlbums(), "Ann(t2 n0)[]");
  EXPECT_EQ(events(), "Sunday(t2 n0)[] Monday(t2 n0)[] <NAMELESS>(t2 n0)[]");
  EXPECT_EQ(kindOf("PLAIN"), 1550);
  EXPECT_EQ(kindOf("DAY"), 1551);
  EXPECT_EQ(kindOf("EVENT"), 1551);
  EXPECT_EQ(kindOf("FACES"), 15);
  for (const char* text :
       {"Transaction for album reconciliation",
        "Creating managed album with name Trip, uuid: PLAIN, kind: 1550!",
        "Creating managed album with name Sunday, uuid: DAY, kind: 1551!",
        "Creating managed album with name Ann, uuid: FACES, kind: 15!",
        "Creating managed album with name (null), uuid: NAMELESS, kind: 1551!"}) {
    EXPECT_TRUE(logged(LogLevel::kInfo, text)) << text;
  }
  EXPECT_EQ(loggedBy("_reconcileAlbums").front(), "Transaction for album reconciliation");
}

TEST_F(AlbumReconciliationTest, AFolderBecomesAnEventWithoutTitle) {
  const auto items = std::make_shared<KXSItemMap>();
  const KXSFolderPtr folder = KXSFolder::folderWithUUID("FOLDER");
  folder->setName("Years");
  items->set("FOLDER", folder);
  client->_initializeLibrary();
  client->setAlbumsAndEvents(items);
  const auto group = std::make_shared<DispatchGroup>();
  client->_reconcileAlbums(group);
  group->wait();
  EXPECT_EQ(events(), "<FOLDER>(t2 n0)[]");
  EXPECT_TRUE(logged(LogLevel::kInfo,
                     "Creating managed album with name (null), uuid: FOLDER, kind: 1551!"));
  // A folder answers to a name, so the next reconciliation gives it one.
  client->_reconcileAlbums(group);
  group->wait();
  EXPECT_EQ(events(), "Years(t2 n0)[]");
}

TEST_F(AlbumReconciliationTest, ContainersThatTheHostLacksAreDeleted) {
  addAlbum("GONE", "Gone");
  addAlbum("GONE EVENT", "Gone", {}, kKXAlbumKindSyncedEvent);
  addAlbum("GONE FACES", "Gone", {}, kKXAlbumKindSyncedFaceAlbum);
  addAlbum("OWN", "My own", {}, 2);
  addAlbum("KEPT", "Kept");
  platform.memoryFiles.putText(thumbnail("GONE FACES"), "jpeg");
  platform.memoryFiles.putText(thumbnail("GONE"), "of no face album");
  EXPECT_TRUE(reconcile(SnapshotBuilder().album("KEPT", "Kept", {})));
  EXPECT_EQ(albums(), "My own[] Kept[]");
  EXPECT_EQ(events(), "");
  EXPECT_EQ(faceAlbums(), "");
  EXPECT_FALSE(platform.memoryFiles.fileExists(thumbnail("GONE FACES")));
  EXPECT_TRUE(platform.memoryFiles.fileExists(thumbnail("GONE")));
  EXPECT_EQ(platform.captured.firstWithPrefix("Could not remove").text, "");
}

TEST_F(AlbumReconciliationTest, AThumbnailThatStaysIsLoggedAndTheAlbumGoes) {
  addAlbum("FACES", "Ann", {}, kKXAlbumKindSyncedFaceAlbum);
  EXPECT_TRUE(reconcile(SnapshotBuilder()));
  EXPECT_EQ(faceAlbums(), "");
  EXPECT_TRUE(logged(LogLevel::kWarning, "Could not remove face thumbnail at path " +
                                             thumbnail("FACES") +
                                             " Error: Error Domain=POSIX Code=2"));
}

TEST_F(AlbumReconciliationTest, AThumbnailFailureWithoutErrorIsNotLogged) {
  addAlbum("FACES", "Ann", {}, kKXAlbumKindSyncedFaceAlbum);
  platform.memoryFiles.putText(thumbnail("FACES"), "jpeg");
  platform.faultyFiles.setFault([this](std::string_view operation, const std::string& path) {
    return operation == "removeItem" && path == thumbnail("FACES") ? Error::make("", 1) : nullptr;
  });
  EXPECT_TRUE(reconcile(SnapshotBuilder()));
  EXPECT_EQ(faceAlbums(), "");
  EXPECT_EQ(platform.captured.firstWithPrefix("Could not remove").text, "");
}

TEST_F(AlbumReconciliationTest, AThumbnailNameLeadsOutOfNoDirectory) {
  const std::string hostile = "../../DCIM/100CAMRA/IMG_1";
  addAlbum(hostile, "Ann", {}, kKXAlbumKindSyncedFaceAlbum);
  platform.memoryFiles.putText(thumbnail(hostile), "the user's own");
  EXPECT_TRUE(reconcile(SnapshotBuilder()));
  EXPECT_TRUE(platform.memoryFiles.fileExists(thumbnail(hostile)));
  EXPECT_EQ(platform.captured.firstWithPrefix("Could not remove face thumbnail").level,
            LogLevel::kWarning);
  EXPECT_EQ(faceAlbums(), "");
}

TEST_F(AlbumReconciliationTest, AContainerThatIsNoManagedAlbumStays) {
  AlbumSeed seed;
  seed.uuid = "GENERIC";
  seed.title = "Generic";
  seed.managed = false;
  platform.library.addAlbum(seed);
  EXPECT_TRUE(reconcile(SnapshotBuilder()));
  EXPECT_EQ(albums(), "Generic[]");
  EXPECT_TRUE(
      logged(LogLevel::kError, "can't delete album because it's not of type KXManagedAlbum"));
}

TEST_F(AlbumReconciliationTest, WhatAResyncCannotDeleteIsNotRenamed) {
  AlbumSeed seed;
  seed.uuid = "GENERIC";
  seed.title = "Generic";
  seed.managed = false;
  platform.library.addAlbum(seed);
  EXPECT_TRUE(reconcile(SnapshotBuilder().library("OTHER").album("GENERIC", "New name", {})));
  EXPECT_EQ(albums(), "Generic[] New name(t2 n0)[]");
  EXPECT_EQ(platform.captured.firstWithPrefix("Updating album").text, "");
}

TEST_F(AlbumReconciliationTest, AResyncMakesEveryContainerAnew) {
  addSynced("A");
  addAlbum("AL", "Old name", {"A"});
  addAlbum("EV", "Day", {}, kKXAlbumKindSyncedEvent);
  addAlbum("FA", "Ann", {}, kKXAlbumKindSyncedFaceAlbum);
  EXPECT_TRUE(reconcile(SnapshotBuilder()
                            .library("OTHER")
                            .album("AL", "New name", {})
                            .event("EV", "Day")
                            .album("FA", "Ann", {}, SnapshotBuilder::kFaceAlbum)));
  EXPECT_EQ(albums(), "New name(t2 n0)[]");
  EXPECT_EQ(events(), "Day(t2 n0)[]");
  EXPECT_EQ(faceAlbums(), "Ann(t2 n0)[]");
  EXPECT_EQ(platform.captured.firstWithPrefix("Updating album").text, "");
}

TEST_F(AlbumReconciliationTest, ARenamedAlbumGetsItsTitleAndEveryKeptOneIsSorted) {
  for (const char* uuid : {"A", "B"}) addSynced(uuid);
  addAlbum("RENAMED", "Before", {"B", "A"});
  addAlbum("SAME", "Same", {"B", "A"});
  EXPECT_TRUE(reconcile(SnapshotBuilder()
                            .asset("A")
                            .asset("B")
                            .album("RENAMED", "After", {"A", "B"})
                            .album("SAME", "Same", {"A", "B"})));
  EXPECT_EQ(albums(), "After[A B] Same[A B]");
  EXPECT_TRUE(logged(LogLevel::kInfo,
                     "Updating album <KXManagedAlbum: RENAMED \"Before\"> to have title After"));
  EXPECT_EQ(platform.captured.firstWithPrefix("Updating album <KXManagedAlbum: SAME").text, "");
}

TEST_F(AlbumReconciliationTest, NullNameAndNullTitleAreEqualNullAndEmptyAreNot) {
  AlbumSeed seed;
  seed.uuid = "NULL";
  platform.library.addAlbum(seed);
  addAlbum("EMPTY", "");
  EXPECT_TRUE(reconcile(
      SnapshotBuilder().album("NULL", std::nullopt, {}).album("EMPTY", std::nullopt, {})));
  EXPECT_EQ(albums(), "<NULL>[] <EMPTY>[]");
  EXPECT_EQ(platform.captured.firstWithPrefix("Updating album <KXManagedAlbum: NULL").text, "");
  EXPECT_TRUE(
      logged(LogLevel::kInfo, "Updating album <KXManagedAlbum: EMPTY \"\"> to have title (null)"));
}

TEST_F(AlbumReconciliationTest, TheKindIsNeverUpdated) {
  addAlbum("AL", "Trip");
  EXPECT_TRUE(reconcile(SnapshotBuilder().album("AL", "Trip", {}, SnapshotBuilder::kEventAlbum)));
  EXPECT_EQ(kindOf("AL"), 1550);
  EXPECT_EQ(albums(), "Trip[]");
}

TEST_F(AlbumReconciliationTest, AFactoryThatGivesNothingLeavesTheAlbumOut) {
  platform.library.setFault([](std::string_view operation) {
    return operation == "insertAlbum" ? Error::make("Store", 1) : nullptr;
  });
  EXPECT_TRUE(reconcile(SnapshotBuilder().album("AL", "Trip", {}).event("EV", "Day")));
  EXPECT_EQ(albums() + events(), "");
  EXPECT_TRUE(
      logged(LogLevel::kInfo, "Creating managed album with name Trip, uuid: AL, kind: 1550!"));
  EXPECT_FALSE(client->albumUUIDToObjectIDMap()->contains("AL"));
}

TEST_F(AlbumReconciliationTest, TheMapOfTheDeviceHoldsSyncedContainersAlone) {
  addAlbum("AL", "Trip");
  addAlbum("OWN", "Own", {}, 2);
  AlbumSeed nameless;
  platform.library.addAlbum(nameless);
  client->_initializeLibrary();
  inTransaction([&] {
    const auto map = client->_onDeviceAlbumsByUUID();
    EXPECT_EQ(map.size(), 1U);
    EXPECT_TRUE(map.contains("AL"));
  });
}

TEST_F(AlbumReconciliationTest, AnAddedAlbumOfAnyOtherKindIsAPlainOne) {
  client->_initializeLibrary();
  inTransaction([&] {
    const KXGenericAlbumPtr album = client->_addAlbumNamed("Odd", "UUID", 77);
    EXPECT_EQ(album->kindValue(), 77);
    EXPECT_EQ(client->library()->albumList()->albums().back(), album);
  });
}

}  // namespace
}  // namespace kx
