#include "testing/RecordingSaver.h"

#include <gtest/gtest.h>

#include "testing/LibraryText.h"
#include "testing/SnapshotBuilder.h"
#include "testing/TestPlatform.h"

namespace kx {
namespace {

class RecordingSaverTest : public ::testing::Test {
 protected:
  // Saves one job and gives what the completion said.
  std::pair<std::size_t, ErrorPtr> save(const KXSyncSaveJobPtr& job) {
    std::pair<std::size_t, ErrorPtr> result;
    platform.saver.saveSyncedAssets({job->serializedData()},
                                    [&](std::size_t imported, const ErrorPtr& outcome) {
                                      result = {imported, outcome};
                                    });
    platform.saver.drain();
    return result;
  }
  KXSyncSaveJobPtr assetJob(const std::string& uuid) {
    const KXSyncSaveJobPtr job = platform.saver.newSyncSaveJob();
    job->setUuid(uuid);
    job->setModificationDate(Date{3200000000.0 - 3061152000.0});
    return job;
  }
  TestPlatform platform;
};

TEST_F(RecordingSaverTest, AnImportedAssetReplacesItsOldSelf) {
  EXPECT_EQ(save(assetJob("A")).first, 1U);
  EXPECT_EQ(save(assetJob("A")).first, 1U);
  EXPECT_EQ(textOfSyncedAssets(platform.library), "A");
  EXPECT_EQ(platform.saver.batches().size(), 2U);
}

TEST_F(RecordingSaverTest, AnAssetOfTheDeviceIsNotReplaced) {
  AssetSeed own;
  own.uuid = "A";
  own.savedAssetType = 0;
  platform.library.addAsset(own);
  EXPECT_EQ(save(assetJob("A")).first, 0U);
  EXPECT_EQ(textOfSyncedAssets(platform.library), "");
}

TEST_F(RecordingSaverTest, AFailedBatchImportsNothing) {
  platform.saver.failNextBatch(Error::make("quarryd", 4));
  EXPECT_EQ(save(assetJob("A")).second->code(), 4);
  EXPECT_EQ(save(assetJob("B")).second, nullptr);
  EXPECT_EQ(textOfSyncedAssets(platform.library), "B");
}

TEST_F(RecordingSaverTest, ASyncIsSealedWhenEveryAssetIsThere) {
  const std::string path = "/snapshot.plist";
  SnapshotBuilder().asset("A").write(platform.memoryFiles, path);
  const KXSyncSaveJobPtr seal = platform.saver.newSyncSaveJob();
  seal->setIsSyncComplete(true);
  seal->setOriginalAssetURL(path);
  save(seal);
  EXPECT_FALSE(platform.memoryFiles.fileExists(path + ".lastsynced"));
  save(assetJob("A"));
  save(seal);
  EXPECT_EQ(platform.memoryFiles.text(path + ".lastsynced"), platform.memoryFiles.text(path));
}

TEST_F(RecordingSaverTest, AJobMayHaveNoForm) {
  platform.saver.failSerialization(1);
  EXPECT_EQ(platform.saver.newSyncSaveJob()->serializedData(), nullptr);
  EXPECT_NE(platform.saver.newSyncSaveJob()->serializedData(), nullptr);
}

}  // namespace
}  // namespace kx
