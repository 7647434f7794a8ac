#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <csignal>
#include <filesystem>

#include "client/KXSyncClient.h"
#include "daemon/RestoreJson.h"
#include "daemon/RestoreLoop.h"
#include "daemon/RestoreRunner.h"
#include "device/DeviceLayout.h"
#include "device/RestoreMarker.h"
#include "tests/daemon/BackupBuilder.h"
#include "tests/daemon/Support.h"

namespace kx::test {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::UnorderedElementsAre;

FRClient* makeClient(Platform* platform, std::uint32_t) { return new KXSyncClient(*platform); }

const std::string kJpeg = "\xFF\xD8\xFF\xE0 picture ";

// Whole restores with the plug-in itself onto reference devices.
class RestoreTest : public testing::Test {
 protected:
  void SetUp() override {
    options.plugin = PluginModule::linkedIn(&makeClient);
    options.deviceRoot = work.at("device");
    options.reserveBytes = 0;
  }
  void fill(BackupBuilder& builder) const {
    builder.add("100CAMRA/IMG_0001.JPG", kJpeg + "1");
    builder.add("100CAMRA/IMG_0001.MOV", "film 1");
    builder.add("100CAMRA/IMG_0002.JPG", kJpeg + "2");
    builder.add("101CAMRA/IMG_0003.JPG", kJpeg + "3");
    builder.album("ALBUM", {"101CAMRA/IMG_0003.JPG", "100CAMRA/IMG_0001.JPG"});
    builder.write();
  }
  RestoreResult restore(const BackupBuilder& builder) {
    ErrorPtr error;
    const auto reader = BackupReader::open(builder.path(), &error);
    if (!reader) {
      ADD_FAILURE() << error->description();
      return {};
    }
    return restoreDevice(*reader, options, {}, progress, cancel);
  }
  std::string onDevice(const std::string& name) const {
    return "device" + std::string(device_paths::kDcim) + "/" + name;
  }
  std::string read(const std::string& name) const { return work.read(onDevice(name)); }
  // A device that was opened and closed before.
  std::unique_ptr<ReferenceDevice> open() const {
    DeviceOptions deviceOptions;
    deviceOptions.root = options.deviceRoot;
    deviceOptions.create = true;
    ErrorPtr error;
    auto device = ReferenceDevice::open(deviceOptions, &error);
    EXPECT_NE(device, nullptr) << (error ? error->description() : "");
    return device;
  }
  DeviceDump dump() const {
    ErrorPtr error;
    return open()->dump(false, &error);
  }
  // Nothing of a restore is left to see.
  void expectAtRest() const {
    EXPECT_FALSE(work.exists("device" + std::string(device_paths::kRestoreMarker)));
    EXPECT_FALSE(work.exists("device" + std::string(device_paths::kRestoreContext)));
    EXPECT_TRUE(fs::is_empty(work.at("device" + std::string(device_paths::kStaging))));
    const DeviceDump all = dump();
    EXPECT_EQ(all.otaRestoreProgress.count, 0U);
    EXPECT_EQ(all.otaRestoreProgress.type, 1);
    EXPECT_EQ(all.camera.type, 1);
    for (const DeviceDump::Asset& asset : all.assets) EXPECT_FALSE(asset.incomplete);
  }
  static std::vector<std::string> failedPaths(const RestoreResult& result) {
    std::vector<std::string> names;
    for (const RestoreFailure& failure : result.failed) {
      names.push_back(failure.path.substr(failure.path.rfind('/') + 1));
    }
    return names;
  }

  TempDirectory work;
  RestoreOptions options;
  SyncProgressCallback progress;
  CancelToken cancel;
};

TEST_F(RestoreTest, ANewDeviceGetsFilesPhotosAndAlbums) {
  BackupBuilder backup(work);
  fill(backup);
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.outcome, RestoreOutcome::kRestored)
      << (result.error ? result.error->message() : "");
  EXPECT_EQ(result.exitCode, kExitDone);
  EXPECT_EQ(result.requested, 4U);
  EXPECT_EQ(result.restored, 4U);
  EXPECT_EQ(result.registered, 3U);
  EXPECT_EQ(result.albumsCreated, 1U);
  EXPECT_EQ(result.library, RestoreLibrary::kNone);
  EXPECT_EQ(read("100CAMRA/IMG_0001.MOV"), "film 1");
  struct stat status;
  ASSERT_EQ(::stat(work.at(onDevice("101CAMRA/IMG_0003.JPG")).c_str(), &status), 0);
  EXPECT_EQ(status.st_mtim.tv_sec, 978307200 + 600000000);
  EXPECT_EQ(status.st_mtim.tv_nsec, 250000000);
  const DeviceDump all = dump();
  ASSERT_EQ(all.albums.size(), 1U);
  EXPECT_EQ(all.albums[0].title, "Title of ALBUM");
  EXPECT_EQ(all.albums[0].assets.size(), 2U);
  expectAtRest();
}

TEST_F(RestoreTest, ASecondRestoreHasNothingToDo) {
  BackupBuilder backup(work);
  fill(backup);
  restore(backup);
  const std::string before = work.fingerprint("device/var/mobile/Media/DCIM");
  const RestoreResult again = restore(backup);
  EXPECT_EQ(again.outcome, RestoreOutcome::kNothing);
  EXPECT_EQ(again.exitCode, kExitDone);
  EXPECT_EQ(again.present, 4U);
  EXPECT_EQ(again.restored, 0U);
  EXPECT_EQ(work.fingerprint("device/var/mobile/Media/DCIM"), before);
  expectAtRest();
}

TEST_F(RestoreTest, ALostFileComesBackAlone) {
  BackupBuilder backup(work);
  fill(backup);
  restore(backup);
  fs::remove(work.at(onDevice("100CAMRA/IMG_0002.JPG")));
  const RestoreResult again = restore(backup);
  EXPECT_EQ(again.outcome, RestoreOutcome::kRestored);
  EXPECT_EQ(again.restored, 1U);
  EXPECT_EQ(again.registered, 0U);
  EXPECT_EQ(read("100CAMRA/IMG_0002.JPG"), kJpeg + "2");
  expectAtRest();
}

TEST_F(RestoreTest, AnEmptyBackupIsNothingToDo) {
  BackupBuilder backup(work);
  backup.write();
  EXPECT_EQ(restore(backup).outcome, RestoreOutcome::kNothing);
  expectAtRest();
}

TEST_F(RestoreTest, DamagedAndMissingFilesFailAloneAndByName) {
  BackupBuilder backup(work);
  fill(backup);
  backup.putContent("100CAMRA/IMG_0001.JPG", kJpeg + "X");   // same size
  backup.putContent("100CAMRA/IMG_0001.MOV", "film 1 and");  // longer
  fs::remove(backup.path() + "/DCIM/101CAMRA/IMG_0003.JPG");
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.outcome, RestoreOutcome::kPartial);
  EXPECT_EQ(result.exitCode, kExitPartial);
  EXPECT_THAT(failedPaths(result),
              UnorderedElementsAre("IMG_0001.JPG", "IMG_0001.MOV", "IMG_0003.JPG"));
  for (const RestoreFailure& failure : result.failed) {
    EXPECT_EQ(failure.domain, kFRErrorDomain);
    EXPECT_THAT(failure.reason, HasSubstr("in the backup"));
  }
  EXPECT_FALSE(work.exists(onDevice("100CAMRA/IMG_0001.JPG")));
  EXPECT_FALSE(work.exists(onDevice("100CAMRA/IMG_0001.MOV")));
  EXPECT_EQ(read("100CAMRA/IMG_0002.JPG"), kJpeg + "2");
  expectAtRest();
  // Once the backup is whole again the rest comes.
  backup.putContent("100CAMRA/IMG_0001.JPG", kJpeg + "1");
  backup.putContent("100CAMRA/IMG_0001.MOV", "film 1");
  backup.putContent("101CAMRA/IMG_0003.JPG", kJpeg + "3");
  const RestoreResult again = restore(backup);
  EXPECT_EQ(again.outcome, RestoreOutcome::kRestored);
  EXPECT_EQ(again.restored, 3U);
  EXPECT_EQ(again.registered, 2U);
  EXPECT_EQ(dump().assets.size(), 3U);
}

TEST_F(RestoreTest, AFileOfOtherContentStaysAndIsNamed) {
  work.write(onDevice("100CAMRA/IMG_0001.JPG"), kJpeg + "of the device");
  work.write(onDevice("100CAMRA/IMG_0002.JPG"), kJpeg + "2");
  fs::create_directories(work.at(onDevice("101CAMRA/IMG_0003.JPG")));
  BackupBuilder backup(work);
  fill(backup);
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.exitCode, kExitPartial);
  EXPECT_THAT(failedPaths(result), UnorderedElementsAre("IMG_0001.JPG", "IMG_0003.JPG"));
  for (const RestoreFailure& failure : result.failed) {
    EXPECT_EQ(failure.code, kFRErrorOtherFileThere);
  }
  EXPECT_EQ(result.present, 1U);
  EXPECT_EQ(result.restored, 1U);
  EXPECT_EQ(read("100CAMRA/IMG_0001.JPG"), kJpeg + "of the device");
  EXPECT_EQ(read("100CAMRA/IMG_0001.MOV"), "film 1");
  expectAtRest();
}

TEST_F(RestoreTest, FilesThatThePlugInDoesNotAskForComeToo) {
  BackupBuilder backup(work);
  backup.add("100CAMRA/IMG_0001.JPG", kJpeg);
  backup.add("100CAMRA/.MISC/Info.plist", "hidden");
  backup.add("100CAMRA/README", "no extension");
  backup.write();
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.outcome, RestoreOutcome::kRestored);
  EXPECT_EQ(result.requested, 1U);
  EXPECT_EQ(result.restored, 3U);
  EXPECT_EQ(result.registered, 1U);
  EXPECT_EQ(read("100CAMRA/.MISC/Info.plist"), "hidden");
  EXPECT_EQ(restore(backup).outcome, RestoreOutcome::kNothing);
}

TEST_F(RestoreTest, LinksOnTheDeviceLeadNowhere) {
  fs::create_directories(work.at("outside"));
  fs::create_directories(work.at(onDevice("")));
  fs::create_directory_symlink(work.at("outside"), work.at(onDevice("100CAMRA")));
  work.write("outside/target", "target");
  fs::create_directories(work.at(onDevice("101CAMRA")));
  fs::create_symlink(work.at("outside/target"), work.at(onDevice("101CAMRA/IMG_0003.JPG")));
  BackupBuilder backup(work);
  fill(backup);
  const std::string outside = work.fingerprint("outside");
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.exitCode, kExitPartial);
  EXPECT_EQ(result.failed.size(), 4U);
  EXPECT_EQ(work.fingerprint("outside"), outside);
}

TEST_F(RestoreTest, WhatIsNoFileInTheBackupFailsAloneAndByName) {
  BackupBuilder backup(work);
  fill(backup);
  const std::string photo = backup.path() + "/DCIM/100CAMRA/IMG_0001.JPG";
  fs::rename(photo, work.at("elsewhere"));
  fs::create_symlink(work.at("elsewhere"), photo);
  fs::remove(backup.path() + "/DCIM/100CAMRA/IMG_0002.JPG");
  ASSERT_EQ(::mkfifo((backup.path() + "/DCIM/100CAMRA/IMG_0002.JPG").c_str(), 0600), 0);
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.exitCode, kExitPartial);
  EXPECT_THAT(failedPaths(result), UnorderedElementsAre("IMG_0001.JPG", "IMG_0002.JPG"));
  for (const RestoreFailure& failure : result.failed) {
    EXPECT_EQ(failure.code, kFRErrorDamagedInBackup);
  }
  EXPECT_EQ(result.restored, 2U);
  expectAtRest();
}

TEST_F(RestoreTest, ALostFileOfAPhotoThatIsKnownCompletesIt) {
  BackupBuilder backup(work);
  fill(backup);
  restore(backup);
  const std::string before = dump().assets.at(1).uuid;
  fs::remove_all(work.at(onDevice("")));
  const RestoreResult again = restore(backup);
  EXPECT_EQ(again.outcome, RestoreOutcome::kRestored);
  EXPECT_EQ(again.restored, 4U);
  EXPECT_EQ(again.registered, 0U);
  EXPECT_EQ(again.albumsCreated, 0U);
  EXPECT_EQ(dump().assets.at(1).uuid, before);
  expectAtRest();
}

TEST_F(RestoreTest, FilesBeyondTheCameraAreRefused) {
  BackupBuilder backup(work);
  backup.add("100CAMRA/IMG_0001.JPG", kJpeg);
  const std::string elsewhere = "/var/mobile/Media/PhotoData/Photos.sqlite";
  BackupFile file = backup.manifest().files[0];
  file.path = elsewhere;
  backup.manifest().files.push_back(file);
  backup.manifest().paths.emplace_back("PhotoData");
  backup.write();
  work.write("backup/PhotoData/Photos.sqlite", kJpeg);
  const RestoreResult result = restore(backup);
  EXPECT_THAT(failedPaths(result), ElementsAre("Photos.sqlite"));
  EXPECT_EQ(result.registered, 1U);
}

TEST_F(RestoreTest, DamagedAlbumsAreNamedAndTheFilesComeBack) {
  BackupBuilder backup(work);
  fill(backup);
  work.write("backup/albums.json", "{}");
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.exitCode, kExitPartial);
  EXPECT_THAT(failedPaths(result), ElementsAre("albums.json"));
  EXPECT_EQ(result.restored, 4U);
  EXPECT_TRUE(dump().albums.empty());
}

TEST_F(RestoreTest, ADamagedLibraryIsNamedAndTheFilesComeBack) {
  BackupBuilder backup(work);
  backup.manifest().library = BackupPart{4, sha256Of("junk")};
  fill(backup);
  for (const bool present : {false, true}) {
    fs::remove_all(work.at("device"));
    if (present) work.write("backup/library.sqlite", "junk");
    const RestoreResult result = restore(backup);
    EXPECT_EQ(result.exitCode, kExitPartial);
    EXPECT_EQ(result.library, RestoreLibrary::kDamaged);
    EXPECT_THAT(failedPaths(result), ElementsAre("library.sqlite"));
    EXPECT_EQ(result.registered, 3U);
    EXPECT_EQ(dump().albums.size(), 1U);
  }
}

TEST_F(RestoreTest, ASignalStopsItAndTheNextRunGoesOn) {
  BackupBuilder backup(work);
  fill(backup);
  for (int i = 0; i < 400; ++i) {
    backup.add("102CAMRA/IMG_" + std::to_string(5000 + i) + ".JPG", kJpeg + std::to_string(i));
  }
  backup.write();
  progress = [this](const SyncProgress& state) {
    if (state.filesDone >= 200) cancel.cancel(SIGINT);
  };
  const RestoreResult stopped = restore(backup);
  EXPECT_EQ(stopped.outcome, RestoreOutcome::kStopped);
  EXPECT_EQ(stopped.exitCode, 130);
  EXPECT_EQ(stopped.error->message(), "interrupted; the same command goes on from here");
  EXPECT_TRUE(work.exists("device" + std::string(device_paths::kRestoreMarker)));
  EXPECT_GE(stopped.restored, 200U);
  EXPECT_LT(stopped.restored, 404U);
  progress = {};
  cancel.cancel(0);
  const RestoreResult rest = restore(backup);
  EXPECT_EQ(rest.outcome, RestoreOutcome::kRestored);
  EXPECT_EQ(rest.requested, 404U - stopped.restored);
  EXPECT_EQ(rest.restored, 404U - stopped.restored);
  EXPECT_EQ(dump().assets.size(), 403U);
  expectAtRest();
}

TEST_F(RestoreTest, ASignalBeforeTheFirstFileStopsItToo) {
  BackupBuilder backup(work);
  fill(backup);
  cancel.cancel(SIGTERM);
  const RestoreResult stopped = restore(backup);
  EXPECT_EQ(stopped.exitCode, 143);
  EXPECT_EQ(stopped.restored, 0U);
}

TEST_F(RestoreTest, AnotherBackupBeginsAnew) {
  BackupBuilder first(work, "first");
  fill(first);
  progress = [this](const SyncProgress& state) {
    if (state.phase == SyncPhase::kTransferring) cancel.cancel(SIGINT);
  };
  restore(first);
  progress = {};
  cancel.cancel(0);
  BackupBuilder second(work, "second one");
  second.add("100CAMRA/IMG_0001.JPG", kJpeg + "1");
  second.add("100CAMRA/IMG_0009.JPG", kJpeg + "9");
  second.album("OTHER", {"100CAMRA/IMG_0009.JPG"});
  second.write();
  const RestoreResult result = restore(second);
  EXPECT_EQ(result.outcome, RestoreOutcome::kRestored);
  EXPECT_EQ(result.requested, 2U);
  const DeviceDump all = dump();
  ASSERT_EQ(all.albums.size(), 1U);
  EXPECT_EQ(all.albums[0].uuid, "OTHER");
  expectAtRest();
}

TEST_F(RestoreTest, NotesOfAnEarlierRestoreWithoutAMarkerAreForgotten) {
  BackupBuilder backup(work);
  fill(backup);
  const Value context =
      Value::dictionary({{"kKXSyncRestoreContextRestoredFilesKey",
                          Value::array({Value::string(std::string(device_paths::kDcim) +
                                                      "/100CAMRA/IMG_0002.JPG")})}});
  const DataPtr bytes = plistBytes(context);
  work.write("device" + std::string(device_paths::kRestoreContext),
             std::string(bytes->span().begin(), bytes->span().end()));
  EXPECT_EQ(restore(backup).requested, 4U);
}

TEST_F(RestoreTest, AFileThatFailedBeforeAnInterruptionIsStillNamed) {
  BackupBuilder backup(work);
  fill(backup);
  backup.putContent("100CAMRA/IMG_0001.JPG", kJpeg + "X");
  // The run before ended after it had noted every file.
  Array settled;
  for (const BackupFile& file : backup.manifest().files)
    settled.push_back(Value::string(file.path));
  const Value context = Value::dictionary(
      {{"kKXSyncRestoreContextRestoredFilesKey", Value::array(std::move(settled))}});
  const DataPtr bytes = plistBytes(context);
  {
    const auto opened = open();
    ASSERT_EQ(writeRestoreMarker(opened->root(), {backup.manifest().identity, {}}), 0);
    ASSERT_EQ(opened->root().writeAtomically(device_paths::kRestoreContext, bytes->span()), 0);
  }
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.requested, 0U);
  EXPECT_EQ(result.exitCode, kExitPartial);
  EXPECT_THAT(failedPaths(result), ElementsAre("IMG_0001.JPG"));
  EXPECT_EQ(result.restored, 3U);
}

TEST_F(RestoreTest, ALockedDeviceIsLeftAlone) {
  BackupBuilder backup(work);
  fill(backup);
  const auto holder = open();
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.exitCode, kExitLocked);
  EXPECT_THAT(result.error->message(), HasSubstr("pid"));
  EXPECT_FALSE(work.exists(onDevice("100CAMRA")));
}

TEST_F(RestoreTest, WithoutRoomNothingIsBegun) {
  BackupBuilder backup(work);
  fill(backup);
  options.reserveBytes = std::uint64_t{1} << 62;
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.exitCode, kExitNoSpace);
  EXPECT_THAT(result.error->message(), HasSubstr("bytes needed"));
  EXPECT_FALSE(work.exists(onDevice("100CAMRA")));
  options.reserveBytes = 0;
  EXPECT_EQ(restore(backup).outcome, RestoreOutcome::kRestored);
}

TEST_F(RestoreTest, ADatabaseThatKnowsEverythingIsTrusted) {
  BackupBuilder backup(work);
  fill(backup);
  {
    const auto device = open();
    for (const char* name :
         {"100CAMRA/IMG_0001.JPG", "100CAMRA/IMG_0002.JPG", "101CAMRA/IMG_0003.JPG"}) {
      NewDeviceAsset asset;
      asset.uuid = name;
      asset.path = std::string(device_paths::kDcim) + "/" + name;
      asset.incomplete = true;
      if (asset.uuid == "100CAMRA/IMG_0001.JPG") {
        asset.files = {asset.path, std::string(device_paths::kDcim) + "/100CAMRA/IMG_0001.MOV"};
      }
      ASSERT_TRUE(device->admin().addAsset(asset, nullptr));
    }
  }
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.outcome, RestoreOutcome::kRestored);
  EXPECT_EQ(result.registered, 0U);
  EXPECT_EQ(result.albumsCreated, 0U);  // they are the library's
  EXPECT_EQ(dump().assets.size(), 3U);
  expectAtRest();
}

TEST_F(RestoreTest, AnAssetThatTheBackupDoesNotHoldFailsByName) {
  BackupBuilder backup(work);
  backup.write();
  {
    const auto device = open();
    NewDeviceAsset asset;
    asset.uuid = "LOST";
    asset.path = std::string(device_paths::kDcim) + "/100CAMRA/IMG_0099.JPG";
    asset.incomplete = true;
    ASSERT_TRUE(device->admin().addAsset(asset, nullptr));
  }
  const RestoreResult result = restore(backup);
  EXPECT_EQ(result.exitCode, kExitPartial);
  ASSERT_EQ(result.failed.size(), 1U);
  EXPECT_EQ(result.failed[0].code, kFRErrorFileMissingAtHost);
}

TEST_F(RestoreTest, TheResultHasADocumentedForm) {
  RestoreResult result;
  result.outcome = RestoreOutcome::kPartial;
  result.library = RestoreLibrary::kKept;
  result.requested = 3;
  result.restored = 1;
  result.present = 1;
  result.failed.push_back({"/a", "FRError", 5, "damaged"});
  result.registered = 1;
  result.albumsCreated = 2;
  result.seconds = 0.5;
  result.error = Error::make("D", 1, "text");
  EXPECT_EQ(restoreResultJson(result).dump(),
            R"({"outcome":"partial","library":"kept","requested":3,"restored":1,"present":1,)"
            R"("failed":[{"path":"/a","domain":"FRError","code":5,"reason":"damaged"}],)"
            R"("registered":1,"albumsCreated":2,"seconds":0.5,)"
            R"("error":{"domain":"D","code":1,"message":"text"}})");
}

}  // namespace
}  // namespace kx::test
