#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class TransfersTest : public ClientTest {
 protected:
  static constexpr const char* kPhoto = "/var/mobile/Media/DCIM/100AB/1.JPG";
};

TEST_F(TransfersTest, WithoutReconciliationTheRestoreRequestsAreOutstanding) {
  platform.backup.paths = {kPhoto};
  const auto requests = client->outstandingAssetTransfers();
  ASSERT_EQ(requests.size(), 1U);
  EXPECT_EQ(requests[0]->identifier(), kPhoto);
  EXPECT_TRUE(requests[0]->isRestore());
  EXPECT_TRUE(client->isListeningToMemoryPressure());
  EXPECT_EQ(platform.memoryPressure.listening(), 1U);
  EXPECT_TRUE(logged(LogLevel::kInfo,
                     "outstandingAssetTransfers (\n    " + requests[0]->description() + "\n)"));
}

TEST_F(TransfersTest, AskingTwiceGivesTheSameList) {
  platform.backup.paths = {kPhoto};
  const auto first = client->outstandingAssetTransfers();
  platform.backup.paths = std::vector<std::string>();
  EXPECT_EQ(client->outstandingAssetTransfers(), first);
  EXPECT_EQ(platform.memoryPressure.made(), 1U);
}

TEST_F(TransfersTest, SyncRequestsFollowTheRestoreRequests) {
  knowLibrary();
  platform.backup.paths = {kPhoto};
  EXPECT_TRUE(reconcile(SnapshotBuilder().asset("A")));
  EXPECT_EQ(outstanding(), (Texts{kPhoto, "A"}));
}

TEST_F(TransfersTest, EachReportGoesToItsHandlerAlone) {
  struct Row {
    bool isRestore;
    const char* handler;
    const char* other;
  };
  for (const Row& row : {Row{true, "_restoreAssetTransfer", "_syncAssetTransfer"},
                         Row{false, "_syncAssetTransfer", "_restoreAssetTransfer"}}) {
    const FRAssetPtr request = FRAsset::downloadAssetWithIdentifier("A", "Photo", std::nullopt);
    request->setIsRestore(row.isRestore);
    platform.captured.clear();
    client->assetTransfer(request, true, nullptr);
    EXPECT_FALSE(loggedBy(row.handler).empty());
    EXPECT_TRUE(loggedBy(row.other).empty());
  }
}

TEST_F(TransfersTest, EachReportIsLogged) {
  const FRAssetPtr request = FRAsset::downloadAssetWithIdentifier("A", "Photo", "Sunset");
  request->setPath("In/A");
  client->assetTransfer(request, false, frError(7));
  EXPECT_TRUE(logged(LogLevel::kInfo,
                     "asset: " + request->description() +
                         "   isAvailableAtPath: In/A success: NO error: Error Domain=FRError "
                         "Code=7 isRestore: NO"));
  EXPECT_EQ(loggedBy("assetTransfer").size(), 1U);
  request->setIsRestore(true);
  request->setPath(std::nullopt);
  client->assetTransfer(request, true, nullptr);
  EXPECT_TRUE(logged(LogLevel::kInfo, "asset: " + request->description() +
                                          "   isAvailableAtPath: (null) success: YES error: "
                                          "(null) isRestore: YES"));
}

TEST_F(TransfersTest, TheRecoverableErrorsAreAFixedSet) {
  for (std::int64_t code = -1; code <= 25; ++code) {
    const bool expected = code == 4 || code == 7 || code == 8 || code == 9 || code == 14 ||
                          code == 16 || code == 18 || code == 19 || code == 20;
    EXPECT_EQ(isRecoverableTransferError(*frError(code)), expected) << code;
    EXPECT_TRUE(isRecoverableTransferError(*posixError(code)));
  }
}

TEST(TransferListTest, KeepsOrderAndIdentity) {
  std::vector<FRAssetPtr> requests;
  for (int i = 0; i < 8; ++i) {
    requests.push_back(FRAsset::downloadAssetWithIdentifier("same", "Photo", std::nullopt));
  }
  TransferList list(requests);
  list.append(requests[0]);
  EXPECT_EQ(list.size(), 8U);
  for (const std::size_t gone : {3U, 0U, 7U, 1U, 4U, 2U}) list.remove(requests[gone]);
  list.remove(requests[3]);
  EXPECT_EQ(list.copy(), (std::vector<FRAssetPtr>{requests[5], requests[6]}));
  EXPECT_TRUE(list.contains(requests[6]));
  EXPECT_FALSE(list.contains(requests[7]));
  list.append(requests[7]);
  std::vector<FRAssetPtr> walked;
  for (const FRAssetPtr& request : list) walked.push_back(request);
  EXPECT_EQ(walked, (std::vector<FRAssetPtr>{requests[5], requests[6], requests[7]}));
  list.remove(requests[5]);
  list.remove(requests[6]);
  list.remove(requests[7]);
  EXPECT_TRUE(list.empty());
}

}  // namespace
}  // namespace kx
