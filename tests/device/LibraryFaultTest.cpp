#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cmath>

#include "device/Sqlite.h"
#include "tests/device/DeviceFixture.h"
#include "tests/device/FaultVfs.h"

namespace kx {
namespace {

namespace fs = std::filesystem;
using Texts = std::vector<std::string>;

class LibraryFaultTest : public DeviceTest {
 protected:
  void SetUp() override {
    FaultVfs::shared().reset();
    DeviceTest::SetUp();
  }
  void TearDown() override {
    FaultVfs::shared().reset();
    DeviceTest::TearDown();
  }
  // A synced library of two albums and two assets.
  void fill() {
    const std::string uri = makeContainer("ALBUM", kKXAlbumKindSyncedAlbum, 2);
    makeContainer("OTHER");
    ASSERT_EQ(save({importJob(kUUID1, kJpeg, {uri}), importJob(kUUID2, kJpeg, {uri})}).first, 2U);
  }
  // Touches every table that a reconciliation does.
  void change() {
    transaction([&] {
      const KXGenericAlbumPtr made = library().insertNewAlbum();
      made->setUuid("MADE");
      made->setKindValue(kKXAlbumKindSyncedAlbum);
      library().albumWithUUID("OTHER")->deleteObject();
      library().albumWithUUID("ALBUM")->setTitle("renamed");
      library().assetWithUUID(kUUID1)->deleteObject();
      const KXManagedAssetPtr kept = library().assetWithUUID(kUUID2);
      kept->setSortToken(3.0);
      kept->addFace(Rect{0.1, 0.2, 0.3, 0.4}, 1, "PERSON");
      made->asManagedAlbum()->addAssetUsingTesselAlbumOrder(kept);
    });
    device().drain();
  }
  // The library in a few words.
  std::string described() {
    const DeviceDump all = dump();
    std::string text;
    for (const auto& album : all.albums) {
      text += album.uuid + "=" + album.title.value_or("-") + "(";
      for (const std::string& asset : album.assets) text += asset.substr(0, 1);
      text += ") ";
    }
    for (const auto& asset : all.assets) {
      text += asset.uuid.substr(0, 1) + ":" + std::to_string(asset.faces.size()) +
              (exists(asset.path) ? " " : "! ");
    }
    return text;
  }
  static constexpr const char* kBefore = "ALBUM=ALBUM(12) OTHER=OTHER() 1:0 2:0 ";
  static constexpr const char* kAfter = "ALBUM=renamed(2) MADE=-(2) 2:1 ";
};

TEST_F(LibraryFaultTest, AFailureAtEveryWriteRollsBackWhole) {
  fill();
  ASSERT_EQ(described(), kBefore);
  for (const int code : {SQLITE_FULL, SQLITE_IOERR_WRITE}) {
    bool reached = true;
    for (long operation = 0; reached; ++operation) {
      ASSERT_LT(operation, 200);
      FaultVfs::shared().failAt(operation, code);
      device().health().reset();
      change();
      reached = FaultVfs::shared().failures() > 0;
      FaultVfs::shared().reset();
      const std::string now = described();
      const bool failed = device().health().anyFailure();
      EXPECT_EQ(now, failed ? kBefore : kAfter) << "operation " << operation;
      if (failed) {
        const auto expected = code == SQLITE_FULL ? DeviceError::kNoSpace : DeviceError::kIo;
        EXPECT_EQ(device().health().firstFailure()->code(), static_cast<std::int64_t>(expected));
      }
      if (!failed) {
        // Back to where we were, for the next round.
        close();
        fs::remove_all(directory_.path());
        open();
        fill();
      } else {
        reopen();
        EXPECT_EQ(described(), kBefore);
      }
    }
  }
}

TEST_F(LibraryFaultTest, AfterAnInputOutputErrorNothingMoreIsWritten) {
  fill();
  FaultVfs::shared().failAt(0, SQLITE_IOERR_WRITE);
  change();
  FaultVfs::shared().reset();
  change();
  EXPECT_EQ(described(), kBefore);
  reopen();
  change();
  EXPECT_EQ(described(), kAfter);
}

TEST_F(LibraryFaultTest, AFailedImportLeavesNoFileBehind) {
  fill();
  const Texts files = mediaFiles();
  FaultVfs::shared().failAt(0, SQLITE_FULL, 1000);
  const Result result = save({importJob(kUUID3, kJpeg), importJob(kUUID4, kJpeg)});
  FaultVfs::shared().reset();
  EXPECT_EQ(result.first, 0U);
  ASSERT_NE(result.second, nullptr);
  EXPECT_EQ(result.second->code(), static_cast<std::int64_t>(DeviceError::kNoSpace));
  EXPECT_EQ(device().health().importFailures().size(), 2U);
  device().drain();
  EXPECT_EQ(mediaFiles(), files);
  EXPECT_EQ(save({importJob(kUUID3, kJpeg)}).first, 1U);
}

// Fails the n-th placing of a file.
class FailingStore : public MediaStore {
 public:
  FailingStore(std::unique_ptr<MediaStore> inner, int failAt, DeviceError code)
      : inner_(std::move(inner)), failAt_(failAt), code_(code) {}
  std::optional<Arrived> inspect(const std::string& path, ErrorPtr* error) override {
    return inner_->inspect(path, error);
  }
  bool place(const std::string& from, const std::string& to, ErrorPtr* error) override {
    if (count_++ != failAt_) return inner_->place(from, to, error);
    setError(error,
             Error::make(kDeviceErrorDomain, static_cast<std::int64_t>(code_), "made to fail"));
    return false;
  }
  bool makeDurable(const std::vector<std::string>& paths, ErrorPtr* error) override {
    return inner_->makeDurable(paths, error);
  }
  bool remove(const std::string& path, ErrorPtr* error) override {
    return inner_->remove(path, error);
  }

 private:
  std::unique_ptr<MediaStore> inner_;
  int count_ = 0;
  const int failAt_;
  const DeviceError code_;
};

TEST_F(LibraryFaultTest, AFullDiskEndsTheHandOverAndKeepsWhatWasPlaced) {
  close();
  DeviceOptions wanted = options();
  wanted.decorateMedia = [](std::unique_ptr<MediaStore> inner) -> std::unique_ptr<MediaStore> {
    return std::make_unique<FailingStore>(std::move(inner), 1, DeviceError::kNoSpace);
  };
  open(wanted);
  const Result result =
      save({importJob(kUUID1, kJpeg), importJob(kUUID2, kJpeg), importJob(kUUID3, kJpeg)});
  EXPECT_EQ(result.first, 1U);
  ASSERT_NE(result.second, nullptr);
  EXPECT_EQ(result.second->code(), static_cast<std::int64_t>(DeviceError::kNoSpace));
  EXPECT_EQ(failureOf(kUUID2), DeviceError::kNoSpace);
  EXPECT_EQ(failureOf(kUUID3), DeviceError::kNoSpace);
  EXPECT_EQ(dump().assets.size(), 1U);
}

TEST_F(LibraryFaultTest, AKillAtEveryWriteLosesNothingThatWasSaved) {
  fill();
  close();
  const std::string pristine = directory_.path() + ".pristine";
  fs::copy(directory_.path(), pristine, fs::copy_options::recursive);
  int killed = 0;
  for (long operation = 0;; operation += 3) {
    ASSERT_LT(operation, 400);
    const pid_t child = ::fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
      FaultVfs::shared().reset();
      FaultVfs::shared().onOperation([operation](long number) {
        if (number == operation) ::kill(::getpid(), SIGKILL);
      });
      open();
      const std::string uri = makeContainer("THIRD");
      save({importJob(kUUID3, kJpeg, {uri}), importJob(kUUID4, kJpeg, {uri})});
      change();
      ::_exit(0);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    open();
    // What is there is whole, and the same work can be done on it.
    for (const DeviceDump::Asset& asset : dump().assets) {
      EXPECT_EQ(content(asset.path), kJpeg) << operation;
    }
    EXPECT_EQ(mediaFiles().size(), dump().assets.size()) << operation;
    EXPECT_FALSE(device().health().anyFailure());
    if (dump().assets.size() == 2 && dump().albums.size() == 2) {
      EXPECT_EQ(described(), kBefore) << operation;
    }
    close();
    {
      SqliteDatabase database(at(device_paths::kDatabase), SqliteDatabase::Access::kReadOnly);
      SqliteStatement check(database, "PRAGMA integrity_check");
      ASSERT_TRUE(check.step());
      EXPECT_EQ(check.textAt(0), "ok") << operation;
      SqliteStatement keys(database, "PRAGMA foreign_key_check");
      EXPECT_FALSE(keys.step()) << operation;
    }
    fs::remove_all(directory_.path());
    fs::copy(pristine, directory_.path(), fs::copy_options::recursive);
    if (WIFEXITED(status)) break;
    ++killed;
  }
  fs::remove_all(pristine);
  EXPECT_GT(killed, 10);
  open();
}

TEST_F(LibraryFaultTest, NothingToSaveWritesNothing) {
  fill();
  device().takeCounters();
  FaultVfs::shared().reset();
  transaction([&] {
    const KXGenericAlbumPtr album = library().albumWithUUID("ALBUM");
    album->setTitle("ALBUM");
    album->asManagedAlbum()->sortAssetsUsingTesselAlbumOrder();
    library().syncProgressAlbum()->setPendingItemsCount(
        library().syncProgressAlbum()->pendingItemsCount());
  });
  EXPECT_EQ(device().takeCounters().rowsWritten, 0U);
  EXPECT_EQ(FaultVfs::shared().count(), 0);
}

TEST_F(LibraryFaultTest, AFetchTakesAFixedNumberOfStatements) {
  const auto statementsFor = [&](int assets) {
    for (int i = 0; i < assets; ++i) {
      NewDeviceAsset asset;
      asset.uuid = "A" + std::to_string(assets) + "-" + std::to_string(i);
      asset.path = "/var/mobile/Media/x/" + asset.uuid;
      asset.savedAssetType = kKXSavedAssetTypeSynced;
      asset.faces = {{1, Rect{}, "PERSON"}};
      EXPECT_TRUE(device().admin().addAsset(asset, nullptr));
    }
    library_.reset();
    device().takeCounters();
    std::size_t faces = 0;
    read([&] {
      AssetFetchRequest request;
      request.prefetchFaces = true;
      request.prefetchAlbums = true;
      const auto fetched = library().managedObjectContext().fetchAssets(request, nullptr);
      for (const KXManagedAssetPtr& asset : *fetched) {
        faces += asset->faces().size();
        for (const KXGenericAlbumPtr& album : asset->albums()) EXPECT_TRUE(album->uuid());
      }
    });
    EXPECT_GE(faces, static_cast<std::size_t>(assets));
    return device().takeCounters().statements;
  };
  const std::uint64_t few = statementsFor(2);
  EXPECT_EQ(statementsFor(40), few);
  EXPECT_LE(few, 5U);
}

}  // namespace
}  // namespace kx
