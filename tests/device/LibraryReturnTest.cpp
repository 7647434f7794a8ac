#include "device/LibraryReturn.h"

#include <fcntl.h>
#include <unistd.h>

#include "device/LibrarySchema.h"
#include "device/RestoreMarker.h"
#include "device/Sha256.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

constexpr const char* kPhoto = "/var/mobile/Media/DCIM/100CAMRA/IMG_0001.JPG";

// A library goes from one device to another.
class LibraryReturnTest : public DeviceTest {
 protected:
  void SetUp() override {
    open();
    fill();
    close();
    std::filesystem::copy_file(at(device_paths::kDatabase), copyPath());
    std::filesystem::remove_all(directory_.path());
    std::filesystem::create_directory(directory_.path());
  }
  // An own photo in an own album that also holds a synced one.
  void fill() {
    NewDeviceAsset own;
    own.uuid = "OWN";
    own.path = kPhoto;
    putFile(kPhoto, kJpeg);
    ASSERT_TRUE(device().admin().addAsset(own, nullptr));
    const std::string uri = makeContainer("SYNCED", kKXAlbumKindSyncedAlbum, 3);
    ASSERT_EQ(save({importJob(kUUID1, kJpeg, {uri})}).first, 1U);
    NewDeviceAlbum album;
    album.uuid = "ALBUM";
    album.title = "Mine";
    album.assets = {kUUID1, "OWN"};
    ASSERT_TRUE(device().admin().addAlbum(album, nullptr));
  }
  std::string copyPath() const { return copies_.path() + "/library.sqlite"; }
  LibraryCopy copy(const std::string& backup = "BACKUP") {
    std::ifstream file(copyPath(), std::ios::binary);
    const std::string bytes{std::istreambuf_iterator<char>(file), {}};
    Sha256 hash;
    hash.update({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
    opened_ = UniqueFd(::open(copyPath().c_str(), O_RDONLY | O_CLOEXEC));
    return {opened_.get(), static_cast<std::int64_t>(bytes.size()), hash.hexDigest(), backup};
  }
  LibraryReturnResult bringBack(const LibraryCopy& copy) {
    LibraryReturnResult result;
    DeviceOptions wanted = options();
    wanted.beforeLibrary = [&](const std::shared_ptr<DeviceRoot>& root) {
      return bringLibraryBack(root, copy, &result);
    };
    open(wanted);
    return result;
  }
  void execute(const char* sql) {
    SqliteDatabase(copyPath(), SqliteDatabase::Access::kReadWrite).execute(sql);
  }
  void expectBroughtBack() {
    const DeviceDump all = dump();
    ASSERT_EQ(all.assets.size(), 1U);
    EXPECT_EQ(all.assets[0].uuid, "OWN");
    EXPECT_TRUE(all.assets[0].incomplete);
    ASSERT_EQ(all.albums.size(), 1U);
    EXPECT_EQ(all.albums[0].uuid, "ALBUM");
    EXPECT_EQ(all.albums[0].assets, (std::vector<std::string>{"OWN"}));
    EXPECT_FALSE(all.lastSynced);
    EXPECT_FALSE(exists(std::string(device_paths::kStaging) + "/library.sqlite"));
  }

  TemporaryDirectory copies_;
  UniqueFd opened_;
};

TEST_F(LibraryReturnTest, AFreshDeviceGetsItWithoutWhatWasSynced) {
  putFile(device_paths::kLastSynced, "old");
  const LibraryReturnResult result = bringBack(copy());
  EXPECT_EQ(result.outcome, LibraryReturn::kBroughtBack);
  EXPECT_TRUE(result.changed);
  expectBroughtBack();
}

TEST_F(LibraryReturnTest, ADeviceThatWasSyncedAloneCountsAsFresh) {
  open();
  putSnapshot({kUUID2});
  ASSERT_EQ(save({importJob(kUUID2, kJpeg), sealJob()}).first, 1U);
  ASSERT_TRUE(exists(device_paths::kLastSynced));
  close();
  EXPECT_EQ(bringBack(copy()).outcome, LibraryReturn::kBroughtBack);
  expectBroughtBack();
  EXPECT_TRUE(mediaFiles().empty());  // no row names them
}

TEST_F(LibraryReturnTest, ADeviceWithPhotosOrAlbumsOfItsOwnKeepsItsLibrary) {
  for (const bool photo : {true, false}) {
    open();
    if (photo) {
      NewDeviceAsset own;
      own.uuid = "NEWER";
      own.path = "/var/mobile/Media/DCIM/100CAMRA/IMG_0002.JPG";
      putFile(own.path, kJpeg);
      ASSERT_TRUE(device().admin().addAsset(own, nullptr));
    } else {
      NewDeviceAlbum album;
      album.uuid = "NEWER";
      ASSERT_TRUE(device().admin().addAlbum(album, nullptr));
    }
    close();
    const LibraryReturnResult result = bringBack(copy());
    EXPECT_EQ(result.outcome, LibraryReturn::kKept);
    EXPECT_FALSE(result.changed);
    const DeviceDump all = dump();
    EXPECT_EQ(all.assets.size(), photo ? 1U : 0U);
    EXPECT_EQ(all.albums.size(), photo ? 0U : 1U);
    close();
    std::filesystem::remove_all(directory_.path());
    std::filesystem::create_directory(directory_.path());
  }
}

TEST_F(LibraryReturnTest, TheSameRestoreFindsItThereAnotherKeepsIt) {
  bringBack(copy());
  close();
  const LibraryReturnResult again = bringBack(copy());
  EXPECT_EQ(again.outcome, LibraryReturn::kBroughtBack);
  EXPECT_FALSE(again.changed);
  close();
  EXPECT_EQ(bringBack(copy("ANOTHER")).outcome, LibraryReturn::kKept);
  // Once the restore has ended it is the device's own.
  ASSERT_EQ(writeRestoreMarker(device().root(), {"BACKUP", {}}), 0);
  platform().porterClient().finalizeOTARestoreRecreatingAlbums(false);
  device().drain();
  close();
  EXPECT_EQ(bringBack(copy()).outcome, LibraryReturn::kKept);
}

TEST_F(LibraryReturnTest, WhatIsNotTheLibraryOfTheManifestIsRefused) {
  const LibraryCopy right = copy();
  for (const int what : {0, 1, 2}) {
    LibraryCopy wrong = right;
    if (what == 0) wrong.sha256[0] = wrong.sha256[0] == '0' ? '1' : '0';
    if (what == 1) ++wrong.size;
    if (what == 2) --wrong.size;
    const LibraryReturnResult result = bringBack(wrong);
    EXPECT_EQ(result.outcome, LibraryReturn::kUnusable);
    ASSERT_NE(result.why, nullptr);
    EXPECT_NE(result.why->message().find("not what the manifest says"), std::string::npos);
    EXPECT_TRUE(dump().assets.empty());
    close();
  }
}

TEST_F(LibraryReturnTest, WhatIsNoLibraryOfOursIsRefused) {
  for (const char* change :
       {"CREATE TRIGGER t AFTER DELETE ON assets BEGIN DELETE FROM albums; END",
        "CREATE VIEW v AS SELECT 1", "DROP INDEX faces_by_asset", "PRAGMA user_version=9",
        "PRAGMA application_id=1",
        "PRAGMA foreign_keys=OFF; INSERT INTO memberships VALUES(77, 78, 1)"}) {
    SCOPED_TRACE(change);
    const std::string kept = copyPath() + ".kept";
    std::filesystem::copy_file(copyPath(), kept, std::filesystem::copy_options::overwrite_existing);
    execute(change);
    const LibraryReturnResult result = bringBack(copy());
    EXPECT_EQ(result.outcome, LibraryReturn::kUnusable);
    EXPECT_TRUE(dump().assets.empty());
    EXPECT_TRUE(dump().albums.empty());
    close();
    std::filesystem::rename(kept, copyPath());
  }
  for (const std::string& content : {std::string(), std::string(5000, 'x')}) {
    std::ofstream(copyPath(), std::ios::binary) << content;
    EXPECT_EQ(bringBack(copy()).outcome, LibraryReturn::kUnusable);
    EXPECT_FALSE(exists(std::string(device_paths::kStaging) + "/library.sqlite"));
    close();
  }
}

}  // namespace
}  // namespace kx
