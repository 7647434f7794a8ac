#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class AlbumOrderingTest : public ClientTest {
 protected:
  std::string orderPath() { return platform.library.pathToAssetAlbumOrderStructure(); }
  static KXSItemList hostOrder(const Texts& uuids) {
    KXSItemList order;
    for (const std::string& uuid : uuids) order.push_back(KXSAlbum::albumWithUUID(uuid));
    return order;
  }
  // Orders the device's lists by the host's order and gives the album list.
  std::string ordered(const Texts& uuids) {
    client->_initializeLibrary();
    inTransaction([&] {
      client->_reconcileDeviceAlbumListSortingWithAlbums(client->_onDeviceAlbumsByUUID(),
                                                         hostOrder(uuids));
    });
    return albums();
  }
  void SetUp() override { knowLibrary(); }
};

TEST_F(AlbumOrderingTest, AnUnchangedOrderSortsNoList) {
  for (const char* uuid : {"A", "B", "C"}) addAlbum(uuid, uuid);
  EXPECT_EQ(ordered({"A", "B", "C"}), "A[] B[] C[]");
  EXPECT_EQ(platform.library.listSorts(), 0U);
  EXPECT_EQ(platform.library.rowsWritten(), 0U);
}

TEST_F(AlbumOrderingTest, DeviceAlbumsKeepTheirPositions) {
  addAlbum("C", "C");
  addAlbum("OWN 1", "own1", {}, 2);
  addAlbum("A", "A");
  addAlbum("OWN 2", "own2", {}, 2);
  addAlbum("B", "B");
  EXPECT_EQ(ordered({"A", "B", "C"}), "A[] own1[] B[] own2[] C[]");
  EXPECT_EQ(platform.library.listSorts(), 1U);
}

TEST_F(AlbumOrderingTest, EveryListFollowsTheHost) {
  addAlbum("E1", "E1", {}, kKXAlbumKindSyncedEvent);
  addAlbum("E2", "E2", {}, kKXAlbumKindSyncedEvent);
  addAlbum("F1", "F1", {}, kKXAlbumKindSyncedFaceAlbum);
  addAlbum("F2", "F2", {}, kKXAlbumKindSyncedFaceAlbum);
  ordered({"F2", "E2", "E1", "F1"});
  EXPECT_EQ(events(), "E2[] E1[]");
  EXPECT_EQ(faceAlbums(), "F2[] F1[]");
}

TEST_F(AlbumOrderingTest, ContainersWithoutHostIndexComeLastInTheirPresentOrder) {
  for (const char* uuid : {"X", "B", "Y", "A"}) addAlbum(uuid, uuid);
  EXPECT_EQ(ordered({"A", "B"}), "A[] B[] X[] Y[]");
}

TEST_F(AlbumOrderingTest, ARepeatedIdentifierCountsWithItsLastPosition) {
  for (const char* uuid : {"A", "B"}) addAlbum(uuid, uuid);
  EXPECT_EQ(ordered({"A", "B", "A"}), "B[] A[]");
}

TEST_F(AlbumOrderingTest, MembersWithoutOrWithASharedIdentifierKeepTheirSlots) {
  AlbumSeed nameless;
  nameless.title = "nameless";
  addAlbum("B", "B");
  platform.library.addAlbum(nameless);
  addAlbum("SHARED", "synced");
  addAlbum("A", "A");
  addAlbum("SHARED", "own", {}, 2);
  EXPECT_EQ(ordered({"SHARED", "A", "B"}), "A[] nameless[] synced[] B[] own[]");
}

TEST_F(AlbumOrderingTest, AnEmptyListIsLeftAlone) {
  EXPECT_EQ(ordered({"A"}), "");
  EXPECT_EQ(platform.captured.texts(), (Texts{"Initializing library"}));
}

TEST_F(AlbumOrderingTest, AContainerMissingFromItsListIsLoggedAndLeftOut) {
  struct Row {
    std::int32_t kind;
    const char* message;
  };
  const std::vector<Row> rows = {
      {kKXAlbumKindSyncedAlbum,
       "===== ERROR ===== Didn't find Album <KXManagedAlbum: LOST \"Lost\"> in album list"},
      {kKXAlbumKindSyncedEvent,
       "===== ERROR ===== Didn't find Event <KXManagedAlbum: LOST \"Lost\"> in event list"},
      {kKXAlbumKindSyncedFaceAlbum,
       "===== ERROR ===== Didn't find Face album <KXManagedAlbum: LOST \"Lost\"> in face album "
       "list"}};
  addAlbum("B", "B");
  addAlbum("A", "A");
  for (const Row& row : rows) {
    AlbumSeed seed;
    seed.uuid = "LOST";
    seed.title = "Lost";
    seed.kind = row.kind;
    seed.inList = false;
    const std::int64_t lost = platform.library.addAlbum(seed);
    EXPECT_EQ(ordered({"LOST", "A", "B"}), "A[] B[]");
    EXPECT_TRUE(logged(LogLevel::kError, row.message)) << row.message;
    platform.library.perform([&](InMemoryLibraryState& s) { s.store.removeAlbum(lost); });
  }
}

TEST_F(AlbumOrderingTest, AnUnexpectedKindIsLoggedAndLeftOut) {
  addAlbum("OWN", "Own", {}, 2);
  client->_initializeLibrary();
  inTransaction([&] {
    KXSyncClient::DeviceAlbumMap map;
    map.set("OWN", client->library()->albumWithUUID("OWN"));
    client->_reconcileDeviceAlbumListSortingWithAlbums(map, {});
  });
  EXPECT_TRUE(logged(LogLevel::kInfo,
                     "_reconcileDeviceAlbumListSortingWithAlbums found an album of an unexpected "
                     "kind <KXManagedAlbum: OWN \"Own\">"));
}

TEST_F(AlbumOrderingTest, DifferentCountsLeaveTheListAsItIs) {
  for (const char* uuid : {"A", "B"}) addAlbum(uuid, uuid);
  client->_initializeLibrary();
  inTransaction([&] {
    const auto list = client->library()->albumList();
    const KXGenericAlbumPtr b = list->albums()[1];
    client->_reorderAlbumListProxy(*list, {0, 1}, {b});
  });
  EXPECT_EQ(albums(), "A[] B[]");
  EXPECT_TRUE(logged(LogLevel::kError,
                     "ERROR in _reorderAlbumListProxy, different count for existingAlbumIndexes "
                     "and newAlbumOrderArray"));
}

TEST_F(AlbumOrderingTest, DifferentCountsForAnEmptyListAreNoError) {
  client->_initializeLibrary();
  inTransaction([&] { client->_reorderAlbumListProxy(*client->library()->albumList(), {0}, {}); });
  EXPECT_EQ(platform.captured.firstWithPrefix("ERROR in").text, "");
}

TEST_F(AlbumOrderingTest, TheAssetOrderFileListsAlbumsAlone) {
  EXPECT_TRUE(reconcile(SnapshotBuilder()
                            .asset("A")
                            .asset("B")
                            .album("AL", "Trip", {"B", "A", "B"})
                            .album("EMPTY", "Empty", {})
                            .event("EV", "Day")
                            .masterAlbum({"A", "B"})));
  const Value expected = Value::dictionary(
      {{"AL", Value::dictionary({{"B", Value::integer(2)}, {"A", Value::integer(1)}})},
       {"EMPTY", Value::dictionary({})}});
  EXPECT_EQ(readPlist(orderPath()), expected) << readPlist(orderPath()).description();
}

TEST_F(AlbumOrderingTest, AnOrderFileThatCannotBeWrittenIsLoggedAndTheCacheDropped) {
  for (const char* uuid : {"A", "B"}) addSynced(uuid);
  addAlbum("AL", "Trip", {"A", "B"});
  const SnapshotBuilder reversed =
      SnapshotBuilder().asset("A").asset("B").album("AL", "Trip", {"B", "A"});
  EXPECT_TRUE(reconcile(reversed));
  EXPECT_EQ(albums(), "Trip[B A]");
  platform.faultyFiles.setFault([this](std::string_view operation, const std::string& path) {
    return operation == "writeFileAtomically" && path == orderPath() ? posixError(28) : nullptr;
  });
  EXPECT_TRUE(reconcile(reversed));
  EXPECT_TRUE(
      logged(LogLevel::kError, "Failed to write assetOrdersByAlbumUUID to path " + orderPath()));
  EXPECT_FALSE(platform.memoryFiles.fileExists(orderPath()));
  EXPECT_EQ(albums(), "Trip[A B]");  // by token and identifier, as without the file
}

TEST_F(AlbumOrderingTest, URIsAreFoundByIdentifier) {
  addAlbum("EXTRA", "Extra");
  EXPECT_TRUE(reconcile(SnapshotBuilder().album("AL", "Trip", {}).event("EV", "Day")));
  std::string expected;
  platform.library.perform([&](InMemoryLibraryState& state) {
    expected = "kxlibrary://memory/Album/p" + std::to_string(state.store.albumWithUUID("AL"));
  });
  ASSERT_NE(client->_albumURIForAlbumUUID("AL"), nullptr);
  EXPECT_EQ(*client->_albumURIForAlbumUUID("AL"), expected);
  EXPECT_NE(client->_albumURIForAlbumUUID("EV"), nullptr);
  EXPECT_EQ(client->_albumURIForAlbumUUID("EXTRA"), nullptr);
  EXPECT_EQ(client->_albumURIForAlbumUUID("UNKNOWN"), nullptr);
  EXPECT_EQ(client->_albumURIForAlbumUUID(std::nullopt), nullptr);
  client->_clearSyncState();
  EXPECT_EQ(client->_albumURIForAlbumUUID("AL"), nullptr);
}

}  // namespace
}  // namespace kx
