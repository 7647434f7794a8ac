#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

// What a reconcile reads and makes beside its own queue: the snapshot before, the album orders, the
// host's memberships. All of them look at the same documents as the rest at the same time.
class ReconcileConcurrencyTest : public ClientTest {
 protected:
  static constexpr int kAssets = 400, kAlbums = 20, kEvents = 10;

  // The day's snapshot: every day the assets are one further on, and so are the albums' members.
  static SnapshotBuilder snapshotOf(int day) {
    SnapshotBuilder snapshot;
    std::vector<std::string> all;
    for (int i = day; i < day + kAssets; ++i) {
      SnapshotBuilder::Asset asset;
      asset.uuid = "ASSET-" + std::to_string(i);
      asset.eventUUID = "EVENT-" + std::to_string(i % kEvents);
      if (i % 3 == 0) asset.faces = {{i % 7, 0.1, 0.2, 0.3, 0.4, "PERSON"}};
      snapshot.asset(asset);
      all.push_back(asset.uuid);
    }
    for (int i = 0; i < kEvents; ++i) snapshot.event("EVENT-" + std::to_string(i), "Event");
    snapshot.album("PERSON", "Person", {}, SnapshotBuilder::kFaceAlbum);
    for (int i = 0; i < kAlbums; ++i) {
      const auto first = all.begin() + (i + day) % kAlbums * (kAssets / kAlbums);
      snapshot.album("ALBUM-" + std::to_string(i), "Album", {first, first + kAssets / kAlbums});
    }
    return snapshot.masterAlbum(all);
  }
  void seal() {
    const DataPtr bytes = platform.files().readFile(kKXSnapshotPath, nullptr);
    ASSERT_NE(bytes, nullptr);
    platform.files().writeFileAtomically(KXPreviousMetadataSyncFilePath, bytes->span(), nullptr);
  }
};

TEST_F(ReconcileConcurrencyTest, SyncsOfEveryKindFollowOneAnother) {
  wholeSync(snapshotOf(0));
  seal();
  const std::string first = albums();
  prepare();
  ASSERT_TRUE(reconcile(snapshotOf(0)));
  EXPECT_TRUE(outstanding().empty());
  EXPECT_EQ(albums(), first);
  for (int day = 1; day <= 3; ++day) {
    wholeSync(snapshotOf(day));
    seal();
    EXPECT_NE(albums(), first);
    EXPECT_NE(assets().find("ASSET-" + std::to_string(day + kAssets - 1)), std::string::npos);
    EXPECT_EQ(assets().find("ASSET-" + std::to_string(day - 1) + " "), std::string::npos);
  }
}

// A snapshot that cannot be decoded leaves the reading of the one before to itself.
TEST_F(ReconcileConcurrencyTest, ABadSnapshotEndsWhileTheOneBeforeIsRead) {
  wholeSync(snapshotOf(0));
  seal();
  const std::string before = assets();
  prepare();
  EXPECT_ANY_THROW(
      reconcile(snapshotOf(1).item(Value::dictionary({{"itemType", Value::string("Other")}}))));
  EXPECT_EQ(assets(), before);
}

}  // namespace
}  // namespace kx
