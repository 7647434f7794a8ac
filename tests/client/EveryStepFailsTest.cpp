#include <set>

#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

// One failure at the i-th step of a sync, for every i: the sync ends, and the next whole one brings
// the device into the same state as a sync without failures.
class EveryStepFailsTest : public ClientTest {
 protected:
  static SnapshotBuilder firstSnapshot() {
    return SnapshotBuilder()
        .asset("A")
        .asset("B")
        .asset("STALE")
        .album("AL", "Trip", {"A", "B"})
        .album("FA", "Ann", {"A"}, SnapshotBuilder::kFaceAlbum)
        .event("EV", "Day")
        .masterAlbum({"A", "B", "STALE"});
  }
  static SnapshotBuilder secondSnapshot() {
    SnapshotBuilder::Asset changed;
    changed.uuid = "STALE";
    changed.modificationDate = kHostTime + 5;
    changed.eventUUID = "EV";
    return SnapshotBuilder()
        .asset("B")
        .asset(changed)
        .asset("NEW")
        .album("AL", "Journey", {"NEW", "B"})
        .album("AL2", "Second", {"STALE"})
        .event("EV", "Day")
        .masterAlbum({"B", "STALE", "NEW"});
  }
  struct Device {
    Device() : client(std::make_unique<KXSyncClient>(platform)) {}
    TestPlatform platform;
    std::unique_ptr<KXSyncClient> client;

    // A daemon's sync: whatever goes wrong, the two end calls are made.
    bool sync(const SnapshotBuilder& snapshot) {
      bool ok = client->prepareForSyncWithHostAnchor("1", {}, nullptr);
      if (!ok) {
        client->syncEndedWithSuccess(false);
        client = std::make_unique<KXSyncClient>(platform);
        return false;
      }
      snapshot.write(platform.memoryFiles, kKXSnapshotPath);
      ok = client->reconcileSync(1, "1", {}, nullptr);
      if (ok) {
        for (const FRAssetPtr& request : client->outstandingAssetTransfers()) {
          request->setPath("In/" + request->identifier());
          client->assetTransfer(request, true, nullptr);
        }
      }
      client->assetTransferEndedWithSuccess(ok);
      client->syncEndedWithSuccess(ok);
      platform.saver.drain();
      return ok;
    }
    std::string state() {
      return textOfList(platform.library, SeedList::kAlbums) + "|" +
             textOfList(platform.library, SeedList::kEvents) + "|" +
             textOfList(platform.library, SeedList::kFaceAlbums) + "|" + sortedAssets();
    }
    std::string sortedAssets() {
      std::set<std::string> uuids;
      platform.library.perform([&](InMemoryLibraryState& state) {
        for (const auto& entry : state.store.assets) uuids.insert(entry.second.uuid.value_or("-"));
      });
      std::string text;
      for (const std::string& uuid : uuids) text += uuid + " ";
      return text;
    }
  };
};

TEST_F(EveryStepFailsTest, AFailedLibraryStepIsMadeUpForByTheNextSync) {
  Device reference;
  reference.sync(firstSnapshot());
  reference.sync(secondSnapshot());
  const std::string expected = reference.state();
  for (const char* operation : {"fetchAssets", "insertAlbum", "commit", "fetchEmptyAlbums"}) {
    for (std::size_t step = 0;; ++step) {
      SCOPED_TRACE(std::string(operation) + " " + std::to_string(step));
      Device device;
      device.sync(firstSnapshot());
      std::size_t seen = 0;
      bool failed = false;
      device.platform.library.setFault([&](std::string_view name) -> ErrorPtr {
        if (name != operation || seen++ != step) return nullptr;
        failed = true;
        return Error::make("Store", 1);
      });
      device.sync(secondSnapshot());
      device.platform.library.setFault(nullptr);
      // A failed fetch, transaction or batch withholds the seal on a real device.
      device.platform.memoryFiles.removeItem(KXPreviousMetadataSyncFilePath, nullptr);
      device.sync(secondSnapshot());
      EXPECT_EQ(device.state(), expected);
      if (!failed) break;
      ASSERT_LT(step, 50U);
    }
  }
}

TEST_F(EveryStepFailsTest, AFailedFileStepIsMadeUpForByTheNextSync) {
  Device reference;
  reference.sync(firstSnapshot());
  reference.sync(secondSnapshot());
  const std::string expected = reference.state();
  for (std::size_t step = 0;; ++step) {
    SCOPED_TRACE(step);
    Device device;
    device.sync(firstSnapshot());
    std::size_t seen = 0;
    bool failed = false;
    device.platform.faultyFiles.setFault([&](std::string_view, const std::string&) -> ErrorPtr {
      if (seen++ != step) return nullptr;
      failed = true;
      return posixError(5);
    });
    device.sync(secondSnapshot());
    device.platform.faultyFiles.setFault(nullptr);
    device.platform.memoryFiles.removeItem(KXPreviousMetadataSyncFilePath, nullptr);
    device.sync(secondSnapshot());
    EXPECT_EQ(device.state(), expected);
    if (!failed) break;
    ASSERT_LT(step, 100U);
  }
}

TEST_F(EveryStepFailsTest, AFailedBatchIsMadeUpForByTheNextSync) {
  Device reference;
  reference.sync(firstSnapshot());
  const std::string expected = reference.state();
  Device device;
  ASSERT_TRUE(device.client->prepareForSyncWithHostAnchor("1", {}, nullptr));
  device.platform.saver.failNextBatch(posixError(28));
  firstSnapshot().write(device.platform.memoryFiles, kKXSnapshotPath);
  ASSERT_TRUE(device.client->reconcileSync(1, "1", {}, nullptr));
  for (const FRAssetPtr& request : device.client->outstandingAssetTransfers()) {
    request->setPath("In/" + request->identifier());
    device.client->assetTransfer(request, true, nullptr);
  }
  device.client->assetTransferEndedWithSuccess(true);
  EXPECT_EQ(device.sortedAssets(), "");
  device.sync(firstSnapshot());
  EXPECT_EQ(device.state(), expected);
}

}  // namespace
}  // namespace kx
