#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "backup/BackupErrors.h"
#include "backup/BackupReader.h"
#include "backup/BackupTaker.h"
#include "backup/BackupVerifier.h"
#include "device/LibraryBackup.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

namespace fs = std::filesystem;

const std::string kDcim = "/var/mobile/Media/DCIM/";

// A device with camera files, and a directory for its backup.
class BackupTest : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    putFile(kDcim + "100AB/IMG_0001.JPG", "one");
    putFile(kDcim + "100AB/IMG_0001.MOV", "one moves");
    putFile(kDcim + "100AB/IMG_0002.JPG", "two");
    fs::create_directory(backup_);
  }

  BackupResult take(const BackupProgressCallback& progress = {}) {
    return takeBackup(device(), request_, progress);
  }
  BackupResult taken() {
    BackupResult result = take();
    EXPECT_EQ(result.error, nullptr) << result.error->description();
    return result;
  }
  BackupError failure(const BackupResult& result) {
    if (!result.error) return static_cast<BackupError>(0);
    EXPECT_EQ(result.error->domain(), kBackupErrorDomain) << result.error->description();
    return static_cast<BackupError>(result.error->code());
  }
  std::string inBackup(const std::string& path) const {
    std::ifstream file(backup_ + path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
  }
  void write(const std::string& path, const std::string& content) {
    fs::create_directories(fs::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << content;
  }
  std::vector<std::string> listing() const {
    std::vector<std::string> found;
    for (const auto& entry : fs::recursive_directory_iterator(backup_)) {
      if (!entry.is_directory()) found.push_back(entry.path().string().substr(backup_.size()));
    }
    std::sort(found.begin(), found.end());
    return found;
  }
  std::vector<std::string> damaged() {
    const BackupCheck check = verifyBackup(backup_, {});
    EXPECT_EQ(check.error, nullptr) << check.error->description();
    std::vector<std::string> texts;
    for (const auto& problem : check.damaged) texts.push_back(problem.path + ": " + problem.reason);
    return texts;
  }

  TemporaryDirectory top_;
  const std::string backup_ = top_.path() + "/backup";
  BackupRequest request_{backup_, {"DCIM"}, false, false};
};

TEST_F(BackupTest, HoldsTheFilesAsTheyAre) {
  fs::permissions(at(kDcim + "100AB/IMG_0002.JPG"), fs::perms::owner_read);
  const BackupResult result = taken();
  EXPECT_EQ(result.copiedFiles, 3U);
  EXPECT_EQ(result.copiedBytes, 15U);
  EXPECT_TRUE(result.failures.empty());
  EXPECT_EQ(inBackup("/DCIM/100AB/IMG_0001.MOV"), "one moves");
  EXPECT_EQ(listing(), (std::vector<std::string>{
                           "/DCIM/100AB/IMG_0001.JPG", "/DCIM/100AB/IMG_0001.MOV",
                           "/DCIM/100AB/IMG_0002.JPG", "/albums.json", "/manifest.json"}));
  EXPECT_EQ(fs::last_write_time(backup_ + "/DCIM/100AB/IMG_0001.JPG"),
            fs::last_write_time(at(kDcim + "100AB/IMG_0001.JPG")));
  EXPECT_TRUE(damaged().empty());

  ErrorPtr error;
  const auto reader = BackupReader::open(backup_, &error);
  ASSERT_NE(reader, nullptr) << error->description();
  EXPECT_EQ(reader->manifest(), result.manifest);
  EXPECT_EQ(reader->manifest().device, libraryIdentity(device().root(), nullptr));
  EXPECT_EQ(reader->manifest().files.at(0).sha256,
            "7692c3ad3540bb803c020b3aee66cd8887123234ea0c6e7143c0add73ff431ed");
  UniqueFd file;
  EXPECT_EQ(reader->openFile(kDcim + "100AB/IMG_0002.JPG", &file), 0);
  EXPECT_EQ(reader->openFile(kDcim + "100AB/IMG_0003.JPG", &file), ENOENT);
  EXPECT_EQ(reader->openLibrary(&file), ENOENT);
}

TEST_F(BackupTest, CopiesWhatHasChangedAlone) {
  const std::string first = taken().manifest.identity;
  const auto inode = [this](const std::string& name) {
    struct stat status {};
    EXPECT_EQ(::stat((backup_ + "/DCIM/100AB/" + name).c_str(), &status), 0);
    return status.st_ino;
  };
  const auto kept = inode("IMG_0001.MOV");
  putFile(kDcim + "100AB/IMG_0001.JPG", "ONE");  // the same size, another time
  putFile(kDcim + "101AB/IMG_0003.JPG", "three");
  fs::remove(at(kDcim + "100AB/IMG_0002.JPG"));
  const BackupResult result = taken();
  EXPECT_EQ(result.copiedFiles, 2U);
  EXPECT_EQ(result.removedFiles, 1U);
  EXPECT_EQ(inode("IMG_0001.MOV"), kept);
  EXPECT_EQ(inBackup("/DCIM/100AB/IMG_0001.JPG"), "ONE");
  EXPECT_FALSE(fs::exists(backup_ + "/DCIM/100AB/IMG_0002.JPG"));
  EXPECT_NE(result.manifest.identity, first);
  EXPECT_EQ(result.manifest.files.size(), 3U);
  EXPECT_TRUE(damaged().empty());
  EXPECT_EQ(taken().copiedFiles, 0U);
}

TEST_F(BackupTest, AFileOfTheBackupThatIsGoneIsCopiedAnew) {
  taken();
  fs::remove(backup_ + "/DCIM/100AB/IMG_0002.JPG");
  write(backup_ + "/DCIM/100AB/IMG_0001.JPG", "cut");
  EXPECT_EQ(taken().copiedFiles, 2U);
  EXPECT_TRUE(damaged().empty());
}

TEST_F(BackupTest, ADirectoryTakesThePlaceOfAFileAndTheReverse) {
  putFile(kDcim + "x", "file");
  putFile(kDcim + "y/z", "file");
  taken();
  fs::remove_all(at(kDcim + "x"));
  fs::remove_all(at(kDcim + "y"));
  putFile(kDcim + "x/z", "inside");
  putFile(kDcim + "y", "now a file");
  taken();
  EXPECT_EQ(inBackup("/DCIM/x/z"), "inside");
  EXPECT_EQ(inBackup("/DCIM/y"), "now a file");
  EXPECT_TRUE(damaged().empty());
}

TEST_F(BackupTest, KeepsTheDevicesOwnAlbumsByPath) {
  NewDeviceAsset own;
  own.uuid = kUUID1;
  own.path = kDcim + "100AB/IMG_0001.JPG";
  NewDeviceAsset synced = own;
  synced.uuid = kUUID2;
  synced.path = "/var/mobile/Media/PhotoData/SyncedAssets/1/x.JPG";
  synced.savedAssetType = 256;
  ASSERT_TRUE(device().admin().addAsset(own, nullptr));
  ASSERT_TRUE(device().admin().addAsset(synced, nullptr));
  makeContainer(kUUID3);
  NewDeviceAlbum album;
  album.uuid = kUUID4;
  album.title = "Mine";
  album.assets = {kUUID2, kUUID1};
  ASSERT_TRUE(device().admin().addAlbum(album, nullptr));
  album.title = std::nullopt;
  album.uuid = kUUID1;
  album.assets = {};
  album.index = 0;
  ASSERT_TRUE(device().admin().addAlbum(album, nullptr));
  EXPECT_EQ(taken().albums, 2U);
  const auto reader = BackupReader::open(backup_, nullptr);
  const auto albums = reader->albums(nullptr);
  ASSERT_TRUE(albums);
  const std::vector<BackupAlbum> expected = {
      {kUUID1, std::nullopt, 2, BackupAlbumList::kAlbums, 0, {}},
      {kUUID4, "Mine", 2, BackupAlbumList::kAlbums, 2, {own.path}}};
  EXPECT_EQ(*albums, expected);
}

TEST_F(BackupTest, TakesTheLibraryWhenAskedTo) {
  NewDeviceAsset own;
  own.uuid = kUUID1;
  own.path = kDcim + "100AB/IMG_0001.JPG";
  ASSERT_TRUE(device().admin().addAsset(own, nullptr));
  request_.withLibrary = true;
  const BackupResult result = taken();
  ASSERT_TRUE(result.manifest.library);
  EXPECT_EQ(fs::status(backup_ + "/library.sqlite").permissions(),
            fs::perms::owner_read | fs::perms::owner_write);
  EXPECT_EQ(static_cast<std::uintmax_t>(result.manifest.library->size),
            fs::file_size(backup_ + "/library.sqlite"));
  EXPECT_TRUE(damaged().empty());
  // The copy is a library of its own.
  TemporaryDirectory other;
  write(other.path() + "/var/mobile/Media/PhotoData/Photos.sqlite", inBackup("/library.sqlite"));
  DeviceOptions reading;
  reading.root = other.path();
  reading.readOnly = true;
  ErrorPtr error;
  const auto copy = ReferenceDevice::open(reading, &error);
  ASSERT_NE(copy, nullptr) << error->description();
  EXPECT_EQ(copy->dump(false, nullptr).assets.at(0).uuid, kUUID1);
  // The next one without it does not keep the old one.
  request_.withLibrary = false;
  EXPECT_FALSE(taken().manifest.library);
  EXPECT_FALSE(fs::exists(backup_ + "/library.sqlite"));
}

TEST_F(BackupTest, LinksAndSpecialFilesAreLeftOutAndNamed) {
  write(top_.path() + "/secret", "secret");
  fs::create_symlink(top_.path() + "/secret", at(kDcim + "link.JPG"));
  fs::create_directory_symlink(top_.path(), at(kDcim + "links"));
  ASSERT_EQ(::mkfifo(at(kDcim + "fifo").c_str(), 0600), 0);
  const BackupResult result = taken();
  ASSERT_EQ(result.leftOut.size(), 3U);
  EXPECT_EQ(result.leftOut[0].path, kDcim + "fifo");
  EXPECT_EQ(result.leftOut[0].reason, "no regular file");
  EXPECT_EQ(result.leftOut[1].reason, "a link, not followed");
  EXPECT_EQ(result.manifest.files.size(), 3U);
}

TEST_F(BackupTest, ANameThatIsNoTextFailsByItself) {
  putFile(kDcim + "bad\xff.JPG", "x");
  const BackupResult result = taken();
  ASSERT_EQ(result.failures.size(), 1U);
  EXPECT_EQ(result.failures[0].reason, "its name is no UTF-8");
  EXPECT_EQ(result.manifest.files.size(), 3U);
}

TEST_F(BackupTest, AFileThatChangesWhileItIsReadIsReadAgain) {
  const std::string path = kDcim + "100AB/IMG_0002.JPG";
  int times = 0;
  const auto touch = [&](int most) {
    return [&, most](const BackupProgress& state) {
      // Between the reading of a file and the look at it afterwards.
      if (state.phase == BackupPhase::kCopying && state.filesDone == 2 && times < most) {
        std::ofstream(at(path), std::ios::app) << "+";
        ++times;
      }
      return true;
    };
  };
  const BackupResult once = take(touch(2));
  EXPECT_EQ(once.error, nullptr);
  EXPECT_TRUE(once.failures.empty());
  EXPECT_EQ(inBackup("/DCIM/100AB/IMG_0002.JPG"), "two++");
  EXPECT_TRUE(damaged().empty());

  fs::remove_all(backup_);
  times = 0;
  const BackupResult always = take(touch(100));
  EXPECT_EQ(always.error, nullptr);
  ASSERT_EQ(always.failures.size(), 1U);
  EXPECT_EQ(always.failures[0].path, path);
  EXPECT_EQ(always.failures[0].reason, "it changes while it is read");
  EXPECT_EQ(always.manifest.files.size(), 2U);
  EXPECT_TRUE(damaged().empty());
}

TEST_F(BackupTest, AFileThatCannotBeReadKeepsItsOldCopy) {
  taken();
  const std::string path = kDcim + "100AB/IMG_0002.JPG";
  bool replaced = false;
  // Between the listing and the copying it becomes something that is no file.
  putFile(path, "newer");
  const BackupResult result = take([&](const BackupProgress& state) {
    if (state.phase == BackupPhase::kCopying && !replaced) {
      replaced = true;
      fs::remove(at(path));
      fs::create_directory(at(path));
    }
    return true;
  });
  EXPECT_EQ(result.error, nullptr);
  ASSERT_EQ(result.failures.size(), 1U);
  EXPECT_EQ(result.failures[0].path, path);
  EXPECT_EQ(inBackup("/DCIM/100AB/IMG_0002.JPG"), "two");
  EXPECT_TRUE(damaged().empty());
}

TEST_F(BackupTest, AFileThatGoesAwayIsNotMissed) {
  bool removed = false;
  const BackupResult result = take([&](const BackupProgress& state) {
    if (state.phase == BackupPhase::kCopying && !removed) {
      removed = true;
      fs::remove(at(kDcim + "100AB/IMG_0002.JPG"));
    }
    return true;
  });
  EXPECT_EQ(result.error, nullptr);
  EXPECT_TRUE(result.failures.empty());
  EXPECT_EQ(result.manifest.files.size(), 2U);
  EXPECT_TRUE(damaged().empty());
}

TEST_F(BackupTest, EndedEarlyItGoesOnWithWhatWasCopied) {
  taken();
  const std::vector<std::string> before = listing();
  for (int i = 0; i < 30; ++i) putFile(kDcim + "101AB/" + std::to_string(i), "new");
  const BackupResult ended = take([](const BackupProgress& state) { return state.filesDone < 20; });
  EXPECT_EQ(failure(ended), BackupError::kCancelled);
  EXPECT_TRUE(damaged().empty());
  EXPECT_EQ(BackupReader::open(backup_, nullptr)->manifest().files.size(), 3U);
  putFile(kDcim + "101AB/0", "newer");  // copied before, changed since
  const BackupResult result = taken();
  EXPECT_EQ(result.copiedFiles, 11U);
  EXPECT_EQ(result.manifest.files.size(), 33U);
  EXPECT_EQ(inBackup("/DCIM/101AB/0"), "newer");
  EXPECT_FALSE(fs::exists(backup_ + "/.incoming"));
  EXPECT_TRUE(damaged().empty());
}

TEST_F(BackupTest, ADirectoryOfSomethingElseIsLeftAlone) {
  write(backup_ + "/notes.txt", "mine");
  EXPECT_EQ(failure(take()), BackupError::kNotOurs);
  EXPECT_EQ(listing(), (std::vector<std::string>{"/notes.txt"}));
  fs::remove(backup_ + "/notes.txt");
  write(backup_ + "/.incoming/x", "mine");
  EXPECT_EQ(failure(take()), BackupError::kNotOurs);
  EXPECT_EQ(inBackup("/.incoming/x"), "mine");
  fs::remove_all(backup_ + "/.incoming");
  write(backup_ + "/manifest.json", "{}");
  EXPECT_EQ(failure(take()), BackupError::kUnusable);
  EXPECT_EQ(inBackup("/manifest.json"), "{}");
}

TEST_F(BackupTest, AFileInTheWayIsNotOverwritten) {
  taken();
  write(backup_ + "/DCIM/100AB/IMG_0009.JPG", "not the backup's");
  write(backup_ + "/DCIM/notes", "not the backup's");
  putFile(kDcim + "100AB/IMG_0009.JPG", "nine");
  const BackupResult result = take();
  EXPECT_EQ(failure(result), BackupError::kNotOurs);
  EXPECT_NE(result.error->message().find("IMG_0009.JPG"), std::string::npos);
  EXPECT_EQ(inBackup("/DCIM/100AB/IMG_0009.JPG"), "not the backup's");
  fs::remove(backup_ + "/DCIM/100AB/IMG_0009.JPG");
  taken();
  EXPECT_EQ(inBackup("/DCIM/notes"), "not the backup's");
  fs::remove(at(kDcim + "100AB/IMG_0009.JPG"));
  putFile(kDcim + "notes/x", "a directory by that name");
  EXPECT_EQ(failure(take()), BackupError::kNotOurs);
  EXPECT_EQ(inBackup("/DCIM/notes"), "not the backup's");
}

TEST_F(BackupTest, LinksInTheBackupAreNotFollowed) {
  taken();
  fs::create_directory(top_.path() + "/elsewhere");
  fs::remove_all(backup_ + "/DCIM/100AB");
  fs::create_directory_symlink(top_.path() + "/elsewhere", backup_ + "/DCIM/100AB");
  EXPECT_NE(take().error, nullptr);
  EXPECT_TRUE(fs::is_empty(top_.path() + "/elsewhere"));
  EXPECT_EQ(damaged().size(), 3U);
}

TEST_F(BackupTest, TheGuardStopsWhatWouldLoseTheBackup) {
  taken();
  fs::remove_all(at(kDcim + "100AB"));
  const BackupResult stopped = take();
  EXPECT_EQ(failure(stopped), BackupError::kGuard);
  EXPECT_EQ(stopped.error->message(),
            "3 of the 3 files of the backup are not on the device any more and would be lost; "
            "--allow-deletes lets it pass");
  EXPECT_TRUE(damaged().empty());
  request_.allowLosses = true;
  EXPECT_EQ(taken().removedFiles, 3U);
}

TEST_F(BackupTest, TheGuardStopsAtMoreThanFiftyFilesAndMoreThanHalf) {
  fs::remove_all(at(kDcim + "100AB"));
  const auto put = [this](int count) {
    fs::remove_all(at(kDcim + "101AB"));
    for (int i = 0; i < count; ++i) putFile(kDcim + "101AB/" + std::to_string(100 + i), "x");
  };
  put(52);
  taken();
  put(2);  // fifty are lost
  EXPECT_EQ(taken().removedFiles, 50U);
  put(102);
  taken();
  put(51);  // fifty-one are lost: half
  EXPECT_EQ(taken().removedFiles, 51U);
  put(101);
  taken();
  put(50);  // fifty-one are lost: more than half
  EXPECT_EQ(failure(take()), BackupError::kGuard);
}

TEST_F(BackupTest, AnotherDeviceLosesNothingOfABackup) {
  taken();
  TemporaryDirectory other;
  DeviceOptions second = options();
  second.root = other.path();
  close();
  open(second);
  write(other.path() + kDcim + "100AB/IMG_0001.JPG", "one");
  write(other.path() + kDcim + "100AB/IMG_0001.MOV", "moves");
  const BackupResult stopped = take();
  EXPECT_EQ(failure(stopped), BackupError::kGuard);
  EXPECT_NE(stopped.error->message().find("whose library is another"), std::string::npos);
  write(other.path() + kDcim + "100AB/IMG_0002.JPG", "two");
  taken();
}

TEST_F(BackupTest, DuringARestoreNoneIsTaken) {
  putFile(device_paths::kRestoreMarker, "x");
  const BackupResult result = take();
  EXPECT_EQ(failure(result), BackupError::kGuard);
  EXPECT_NE(result.error->message().find("a restore of this device has not ended"),
            std::string::npos);
  EXPECT_TRUE(listing().empty());
}

TEST_F(BackupTest, WhatThePlugInNamesHasToBeBelowMedia) {
  for (const char* entry : {"../x", "/etc", ""}) {
    request_.paths = {entry};
    EXPECT_EQ(failure(take()), BackupError::kUnusable) << entry;
  }
  request_.paths = {"DCIM", "DCIM/100AB", "Missing"};
  EXPECT_EQ(taken().manifest.files.size(), 3U);
  EXPECT_TRUE(damaged().empty());
}

TEST_F(BackupTest, TheLockIsHeldWhileItRuns) {
  bool looked = false;
  taken();
  const BackupResult result = take([&](const BackupProgress&) {
    if (looked) return true;
    looked = true;
    EXPECT_EQ(platform().files().tryLock("/tmp/BackupRunning").outcome,
              FileSystem::LockOutcome::kHeldElsewhere);
    EXPECT_EQ(content("/tmp/BackupRunning"), std::to_string(::getpid()) + "\n");
    ErrorPtr error;
    EXPECT_EQ(BackupReader::open(backup_, &error), nullptr);
    EXPECT_EQ(error->code(), static_cast<std::int64_t>(BackupError::kInUse));
    return true;
  });
  EXPECT_EQ(result.error, nullptr);
  EXPECT_TRUE(looked);
  EXPECT_EQ(platform().files().tryLock("/tmp/BackupRunning").outcome,
            FileSystem::LockOutcome::kTaken);
}

TEST_F(BackupTest, ASecondOneEndsWithTheProcessThatRunsTheFirst) {
  putFile("/tmp/BackupRunning", "4711\n");
  const int fd = ::open(at("/tmp/BackupRunning").c_str(), O_RDWR | O_CLOEXEC);
  ASSERT_EQ(::flock(fd, LOCK_EX), 0);
  BackupResult result = take();
  EXPECT_EQ(failure(result), BackupError::kInUse);
  EXPECT_EQ(result.error->message(), "another backup of the device is running (pid 4711)");
  EXPECT_EQ(result.error->userInfo()["pid"], Value::integer(4711));
  ::close(fd);
  taken();
  const auto reader = BackupReader::open(backup_, nullptr);
  result = take();
  EXPECT_EQ(failure(result), BackupError::kInUse);
  EXPECT_NE(result.error->message().find("another process uses the backup"), std::string::npos);
}

TEST_F(BackupTest, VerifyingNamesWhatIsDamaged) {
  request_.withLibrary = true;
  taken();
  const auto time = fs::last_write_time(backup_ + "/DCIM/100AB/IMG_0001.JPG");
  write(backup_ + "/DCIM/100AB/IMG_0001.JPG", "0ne");
  fs::last_write_time(backup_ + "/DCIM/100AB/IMG_0001.JPG", time);
  write(backup_ + "/DCIM/100AB/IMG_0001.MOV", "longer than it was");
  fs::remove(backup_ + "/DCIM/100AB/IMG_0002.JPG");
  write(backup_ + "/albums.json", "{}");
  fs::remove(backup_ + "/library.sqlite");
  EXPECT_EQ(damaged(), (std::vector<std::string>{
                           kDcim + "100AB/IMG_0001.JPG: its content is damaged",
                           kDcim + "100AB/IMG_0001.MOV: has 18 bytes instead of 9",
                           kDcim + "100AB/IMG_0002.JPG: is missing",
                           "albums.json: albums.json is not what the manifest says: it is damaged",
                           "library.sqlite: is missing"}));
}

TEST_F(BackupTest, VerifyingNeedsAManifest) {
  const auto code = [this] {
    return static_cast<BackupError>(verifyBackup(backup_, {}).error->code());
  };
  EXPECT_EQ(code(), BackupError::kMissing);
  write(backup_ + "/manifest.json", "{\"format\":\"kxsync-backup\"");
  EXPECT_EQ(code(), BackupError::kUnusable);
  fs::remove_all(backup_);
  EXPECT_EQ(code(), BackupError::kMissing);
  write(backup_, "a file");
  EXPECT_EQ(code(), BackupError::kNotOurs);
}

TEST_F(BackupTest, VerifyingEndsEarlyWhenAskedTo) {
  taken();
  int calls = 0;
  const BackupCheck check = verifyBackup(backup_, [&](const BackupProgress& state) {
    EXPECT_EQ(state.phase, BackupPhase::kVerifying);
    EXPECT_EQ(state.filesTotal, 3U);
    return ++calls < 2;
  });
  ASSERT_NE(check.error, nullptr);
  EXPECT_EQ(check.error->code(), static_cast<std::int64_t>(BackupError::kCancelled));
}

}  // namespace
}  // namespace kx
