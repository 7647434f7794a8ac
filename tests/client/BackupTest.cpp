#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class BackupTest : public ClientTest {};

TEST_F(BackupTest, TheCameraFilesAreBackedUpAndNothingIsLeftOut) {
  StringList backup = {"before"};
  StringList notBackup = {"untouched"};
  client->pathsToBackup(&backup, &notBackup);
  EXPECT_EQ(backup, (StringList{"DCIM"}));
  EXPECT_EQ(notBackup, (StringList{"untouched"}));
  EXPECT_TRUE(platform.captured.texts().empty());
  EXPECT_TRUE(platform.memoryFiles.files().empty());
}

TEST_F(BackupTest, TheAnswerIsTheSameDuringASyncAndARestore) {
  StringList backup;
  ASSERT_TRUE(prepare());
  client->pathsToBackup(&backup, nullptr);
  EXPECT_EQ(backup, (StringList{"DCIM"}));
  ASSERT_TRUE(reconcile(SnapshotBuilder().asset("A")));
  client->outstandingAssetTransfers();
  client->pathsToBackup(&backup, nullptr);
  EXPECT_EQ(backup, (StringList{"DCIM"}));
  client->pathsToBackup(nullptr, nullptr);
}

}  // namespace
}  // namespace kx
