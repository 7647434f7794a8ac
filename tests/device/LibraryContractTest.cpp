#include "tests/contract/PhotoLibraryContract.h"
#include "tests/device/DeviceFixture.h"
#include "tests/device/FaultVfs.h"

namespace kx {
namespace {

// The reference device under the suite that every library has to pass.
class SqliteContractDevice : public ContractDevice {
 public:
  explicit SqliteContractDevice(bool readsAhead = false) : readsAhead_(readsAhead) {
    FaultVfs::shared().reset();
    DeviceOptions options;
    options.root = directory_.path();
    options.create = true;
    device_ = ReferenceDevice::open(options, nullptr);
  }
  ~SqliteContractDevice() override { FaultVfs::shared().reset(); }

  Platform& platform() override {
    if (readsAhead_) device_->readAhead();
    return device_->platform();
  }

  void addAsset(const AssetSeed& seed) override {
    NewDeviceAsset asset;
    asset.uuid = seed.uuid.value_or("");
    asset.path = seed.files.empty() ? std::string(device_paths::kDcim) + "/100CAMRA/" + asset.uuid
                                    : seed.files.front();
    asset.savedAssetType = seed.savedAssetType;
    asset.isVideo = seed.isVideo;
    asset.creationDate = seed.creationDate;
    asset.modificationDate = seed.modificationDate;
    asset.sortToken = seed.sortToken;
    asset.location = seed.location;
    for (const FaceSeed& face : seed.faces) {
      asset.faces.push_back({face.identifier, face.relativeRect, face.albumUUID});
    }
    asset.originalFileName = seed.originalFileName;
    asset.originalFileSize = seed.originalFilesize;
    asset.sidecarSizes = seed.sidecarSizes;
    asset.files = seed.files;
    asset.incomplete = seed.incomplete;
    ErrorPtr error;
    ASSERT_TRUE(device_->admin().addAsset(asset, &error)) << error->description();
  }

  void addAlbum(const AlbumSeed& seed) override {
    NewDeviceAlbum album;
    album.uuid = seed.uuid.value_or("");
    album.title = seed.title;
    album.kind = seed.kind;
    album.assets = seed.assets;
    album.inList = seed.inList;
    album.managed = seed.managed;
    album.pendingItemsType = seed.pendingItemsType;
    album.pendingItemsCount = seed.pendingItemsCount;
    ErrorPtr error;
    ASSERT_TRUE(device_->admin().addAlbum(album, &error)) << error->description();
  }

  std::vector<std::string> assetsOfAlbum(const std::string& uuid) override {
    const DeviceDump all = device_->dump(false, nullptr);
    for (const auto* list : {&all.albums, &all.events, &all.faceAlbums}) {
      for (const DeviceDump::Container& container : *list) {
        if (container.uuid == uuid) return container.assets;
      }
    }
    return {"no such album"};
  }

  bool readsAhead() const override { return readsAhead_; }
  void failNextCommit() override { FaultVfs::shared().failAt(0, SQLITE_FULL); }

 private:
  const bool readsAhead_;
  TemporaryDirectory directory_;
  std::unique_ptr<ReferenceDevice> device_;
};

std::unique_ptr<ContractDevice> makeSqliteDevice() {
  return std::make_unique<SqliteContractDevice>();
}

std::unique_ptr<ContractDevice> makeSqliteDeviceThatReadsAhead() {
  return std::make_unique<SqliteContractDevice>(true);
}

INSTANTIATE_TEST_SUITE_P(Sqlite, PhotoLibraryContract, ::testing::Values(&makeSqliteDevice));
INSTANTIATE_TEST_SUITE_P(SqliteReadAhead, PhotoLibraryContract,
                         ::testing::Values(&makeSqliteDeviceThatReadsAhead));

}  // namespace
}  // namespace kx
