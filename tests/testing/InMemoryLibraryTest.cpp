#include "testing/InMemoryLibrary.h"

#include <gtest/gtest.h>

#include "platform/foundation/Exceptions.h"
#include "testing/TestPlatform.h"
#include "tests/contract/PhotoLibraryContract.h"

namespace kx {
namespace {

class InMemoryContractDevice final : public ContractDevice {
 public:
  Platform& platform() override { return platform_; }
  void addAsset(const AssetSeed& seed) override { platform_.library.addAsset(seed); }
  void addAlbum(const AlbumSeed& seed) override { platform_.library.addAlbum(seed); }
  std::vector<std::string> assetsOfAlbum(const std::string& uuid) override {
    std::vector<std::string> uuids;
    platform_.library.perform([&](InMemoryLibraryState& state) {
      for (const std::int64_t row : state.store.albums.at(state.store.albumWithUUID(uuid)).assets) {
        uuids.push_back(state.store.assets.at(row).uuid.value_or("-"));
      }
    });
    return uuids;
  }
  void failNextCommit() override { platform_.library.failCommits(1); }

 private:
  TestPlatform platform_;
};

std::unique_ptr<ContractDevice> makeInMemoryDevice() {
  return std::make_unique<InMemoryContractDevice>();
}

}  // namespace

INSTANTIATE_TEST_SUITE_P(InMemory, PhotoLibraryContract, ::testing::Values(&makeInMemoryDevice));

TEST(InMemoryLibraryTest, ObjectsAreRefusedOutsideTheQueue) {
  TestPlatform platform;
  const KXPhotoLibraryPtr library = platform.library.newPhotoLibrary();
  EXPECT_THROW(library->albumWithUUID("A"), InternalInconsistency);
  EXPECT_THROW(library->managedObjectContext(), InternalInconsistency);
}

TEST(InMemoryLibraryTest, AnAlbumIsNotInsertedOutsideATransaction) {
  TestPlatform platform;
  const KXPhotoLibraryPtr library = platform.library.newPhotoLibrary();
  library->performBlock([&] { library->insertNewAlbum(); });
  platform.library.queue()->drain();
  EXPECT_EQ(platform.library.blockExceptions().size(), 1U);
}

TEST(InMemoryLibraryTest, AListIsNotReorderedIntoAnotherSet) {
  TestPlatform platform;
  AlbumSeed seed;
  seed.uuid = "A";
  platform.library.addAlbum(seed);
  const KXPhotoLibraryPtr library = platform.library.newPhotoLibrary();
  library->performBlock([&] { library->albumList()->reorder({}); });
  platform.library.queue()->drain();
  EXPECT_EQ(platform.library.blockExceptions(),
            (std::vector<std::string>{"an album list is reordered into another set of albums"}));
}

TEST(InMemoryLibraryTest, AChangelessTransactionWritesNoRow) {
  TestPlatform platform;
  const KXPhotoLibraryPtr library = platform.library.newPhotoLibrary();
  library->withDispatchGroupPerformTransaction(
      nullptr, [&] { library->syncProgressAlbum()->setPendingItemsCount(0); });
  EXPECT_EQ(platform.library.rowsWritten(), 0U);
  EXPECT_EQ(platform.library.openLibraries(), 1U);
}

}  // namespace kx
