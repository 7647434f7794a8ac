#include "client/DeviceAssets.h"

#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class DeviceAssetsTest : public ClientTest {
 protected:
  KXManagedAssetPtr asset(const std::string& uuid) {
    addSynced(uuid);
    KXManagedAssetPtr found;
    if (!library_) library_ = platform.photoLibrary().newPhotoLibrary();
    const auto group = std::make_shared<DispatchGroup>();
    library_->withDispatchGroupPerformBlock(group, [&] {
      const auto assets = library_->managedObjectContext().fetchAssets({}, nullptr);
      for (const KXManagedAssetPtr& each : *assets) {
        if (each->uuid() == OptionalString(uuid)) found = each;
      }
    });
    group->wait();
    return found;
  }
  static Texts texts(DeviceAssets& assets) {
    Texts all;
    for (const DeviceAssets::Entry& entry : assets.entries()) all.emplace_back(entry.uuid());
    return all;
  }

 private:
  std::shared_ptr<KXPhotoLibrary> library_;
};

TEST_F(DeviceAssetsTest, EachHasTheHostsOfItsUUID) {
  KXSAssetMap host;
  for (const char* uuid : {"A", "B", "C"}) host.set(uuid, KXSAsset::asset());
  DeviceAssets assets(host);
  for (const char* uuid : {"B", "X", "A"}) assets.set(uuid, asset(uuid));
  EXPECT_EQ(texts(assets), (Texts{"B", "X", "A"}));
  EXPECT_EQ(assets.entries()[0].place, 1U);
  EXPECT_EQ(assets.entries()[1].host, nullptr);
  EXPECT_EQ(assets.entries()[2].host->key.stringValue(), "A");
  EXPECT_TRUE(assets.hasHostAsset(0));
  EXPECT_TRUE(assets.hasHostAsset(1));
  EXPECT_FALSE(assets.hasHostAsset(2));
  assets.entries()[0].asset = nullptr;
  EXPECT_FALSE(assets.hasHostAsset(1));
}

TEST_F(DeviceAssetsTest, ALaterOneOfTheSameUUIDTakesThePlace) {
  KXSAssetMap host;
  host.set("A", KXSAsset::asset());
  DeviceAssets assets(host);
  const KXManagedAssetPtr first = asset("A");
  const KXManagedAssetPtr second = asset("X");
  assets.set("A", first);
  assets.set("X", first);
  assets.set("Y", first);
  assets.set("X", second);
  assets.set("A", second);
  EXPECT_EQ(texts(assets), (Texts{"A", "X", "Y"}));
  EXPECT_EQ(assets.entries()[0].asset, second);
  EXPECT_EQ(assets.entries()[1].asset, second);
  EXPECT_EQ(assets.entries()[2].asset, first);
}

}  // namespace
}  // namespace kx
