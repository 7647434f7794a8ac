#include "testing/InMemoryObjects.h"
#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class MemoryPressureTest : public ClientTest {
 protected:
  void raise() {
    platform.memoryPressure.raise();
    platform.library.queue()->drain();
  }
  std::size_t refaults() { return loggedBy("_startListeningToMemoryPressureEvents").size(); }
};

TEST_F(MemoryPressureTest, AnEventTurnsObjectsIntoFaults) {
  addAlbum("AL", "Trip");
  client->_initializeLibrary();
  KXGenericAlbumPtr album;
  inTransaction([&] {
    album = client->library()->albumWithUUID("AL");
    EXPECT_EQ(album->title(), "Trip");
  });
  client->_startListeningToMemoryPressureEvents();
  raise();
  EXPECT_TRUE(dynamic_cast<FaultingObject&>(*album).isFault());
  EXPECT_TRUE(logged(LogLevel::kDebug, "Re-faulted 1 objects."));
  EXPECT_EQ(platform.captured.firstWithPrefix("Re-faulted").source, "KXSyncClient+MemoryPressure");
}

TEST_F(MemoryPressureTest, UnsavedChangesOutliveAnEvent) {
  addAlbum("AL", "Trip");
  client->_initializeLibrary();
  client->_startListeningToMemoryPressureEvents();
  const auto group = client->libraryGroup();
  client->library()->withDispatchGroupPerformBlock(
      group, [this] { client->library()->albumWithUUID("AL")->setTitle("Unsaved"); });
  raise();
  client->library()->withDispatchGroupPerformBlock(group, [this] {
    EXPECT_EQ(client->library()->albumWithUUID("AL")->title(), "Unsaved");
    EXPECT_TRUE(client->library()->albumWithUUID("AL")->hasChanges());
  });
  group->wait();
}

TEST_F(MemoryPressureTest, WithoutObjectsTheCountIsZero) {
  client->_initializeLibrary();
  client->_startListeningToMemoryPressureEvents();
  raise();
  EXPECT_TRUE(logged(LogLevel::kDebug, "Re-faulted 0 objects."));
}

TEST_F(MemoryPressureTest, TwoStartsMakeOneSource) {
  client->outstandingAssetTransfers();
  client->outstandingAssetTransfers();
  EXPECT_EQ(platform.memoryPressure.made(), 1U);
  EXPECT_EQ(platform.memoryPressure.listening(), 1U);
}

TEST_F(MemoryPressureTest, AfterAStopNothingIsReFaultedUntilANewStart) {
  client->_initializeLibrary();
  client->_startListeningToMemoryPressureEvents();
  client->_stopListeningToMemoryPressureEvents();
  client->_stopListeningToMemoryPressureEvents();
  raise();
  EXPECT_EQ(refaults(), 0U);
  client->_startListeningToMemoryPressureEvents();
  EXPECT_EQ(platform.memoryPressure.made(), 2U);
  raise();
  EXPECT_EQ(refaults(), 1U);
}

TEST_F(MemoryPressureTest, ListeningThatBeganBeforeTheLibraryReFaultsNothing) {
  EXPECT_TRUE(prepare());
  ASSERT_NE(client->library(), nullptr);
  client->outstandingAssetTransfers();
  raise();
  EXPECT_EQ(refaults(), 0U);
}

TEST_F(MemoryPressureTest, ListeningDoesNotKeepTheLibraryAfterAStop) {
  client->_initializeLibrary();
  client->_startListeningToMemoryPressureEvents();
  client->_uninitializeLibrary();
  client->_stopListeningToMemoryPressureEvents();
  drain();
  EXPECT_EQ(platform.library.openLibraries(), 0U);
}

}  // namespace
}  // namespace kx
