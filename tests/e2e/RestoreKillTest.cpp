#include <gtest/gtest.h>
#include <stdlib.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>
#include <nlohmann/json.hpp>
#include <random>
#include <set>
#include <string>

#include "device/DeviceLayout.h"
#include "device/ReferenceDevice.h"
#include "testing/SnapshotBuilder.h"
#include "tests/e2e/TracedRun.h"

namespace kx::test {
namespace {

namespace fs = std::filesystem;
using Json = nlohmann::json;

constexpr int kPointsPerWay = 25;
// Few enough that a run takes a moment: the restore of thousands has a test of its own.
constexpr int kCameraFiles = 30;
constexpr int kSyncedPhotos = 8;

std::string uuidOf(int number) {
  char text[40];
  std::snprintf(text, sizeof text, "%08X-0000-4000-8000-%012X", number, number * 7);
  return text;
}

std::string cameraPath(int number) {
  return std::string(device_paths::kDcim) + "/" + std::to_string(100 + number % 3) + "CAMRA/IMG_" +
         std::to_string(1000 + number) + (number % 6 == 5 ? ".MOV" : ".JPG");
}

// A device with photos, films and albums of its own and with synced ones, its backup both with and
// without the library, and restores of it that are killed.
class RestoreKillTest : public testing::Test {
 protected:
  void SetUp() override {
    if (!canTrace()) GTEST_SKIP() << "this process may not trace its children";
    // A kill loses nothing that was written, so that memory will do, and is faster.
    const fs::path memory = "/dev/shm";
    std::error_code none;
    const bool hasMemory = fs::space(memory, none).available > (std::uintmax_t{1} << 28);
    std::string pattern =
        ((hasMemory ? memory : fs::temp_directory_path()) / "kxrestoreXXXXXX").string();
    ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
    top_ = pattern;
    ::unsetenv("KXSYNC_PLUGIN");
    makeDevice();
    makeBundle();
    succeed({program("kxsync"), "sync", "--json", at("bundle"), at("device")});
    succeed({program("kxsync"), "backup", at("device"), at("plain")});
    succeed({program("kxsync"), "backup", "--with-library", at("device"), at("library")});
    expectedFiles_ = cameraFiles("device");
    expectedAlbums_ = ownAlbums("device");
    ASSERT_EQ(expectedFiles_.size(), static_cast<std::size_t>(kCameraFiles + kCameraFiles / 6));
    ASSERT_EQ(expectedAlbums_.size(), 2U);
  }
  void TearDown() override {
    if (!top_.empty()) fs::remove_all(top_);
  }

  std::string at(const std::string& name) const { return (top_ / name).string(); }
  static std::string program(const std::string& name) { return KX_TEST_BIN_DIR "/" + name; }
  static Json succeed(const std::vector<std::string>& command) {
    int exitCode = -1;
    const std::string output = runForOutput(command, &exitCode);
    EXPECT_EQ(exitCode, 0) << command[1] << ": " << output;
    return Json::parse(output, nullptr, false);
  }
  std::vector<std::string> restoreCommand(const std::string& backup) const {
    return {program("kxsync"), "restore", "--json", at(backup), at("killed")};
  }

  void makeDevice() const {
    DeviceOptions options;
    options.root = at("device");
    options.create = true;
    ErrorPtr error;
    const auto device = ReferenceDevice::open(options, &error);
    ASSERT_NE(device, nullptr);
    for (int number = 0; number < kCameraFiles; ++number) {
      NewDeviceAsset asset;
      asset.uuid = uuidOf(number);
      asset.path = cameraPath(number);
      asset.isVideo = asset.path.ends_with(".MOV");
      asset.creationDate = Date{600000000.0 + number};
      writeCamera(asset.path, number);
      if (number % 6 == 0) {
        // A film that belongs to the still.
        asset.files = {asset.path, fs::path(asset.path).replace_extension(".MOV").string()};
        writeCamera(asset.files[1], 10000 + number);
      }
      ASSERT_TRUE(device->admin().addAsset(asset, &error));
    }
    for (int number = 0; number < 2; ++number) {
      NewDeviceAlbum album;
      album.uuid = uuidOf(500 + number);
      album.title = "Album " + std::to_string(number);
      for (int member = kCameraFiles - 1 - number; member >= 0; member -= 3) {
        album.assets.push_back(uuidOf(member));
      }
      ASSERT_TRUE(device->admin().addAlbum(album, &error));
    }
  }
  void writeCamera(const std::string& path, int number) const {
    fs::create_directories(fs::path(at("device") + path).parent_path());
    std::ofstream(at("device") + path, std::ios::binary)
        << "\xff\xd8\xff\xe0 photo " << number << std::string(2000, 'p') << "\xff\xd9";
  }
  void makeBundle() const {
    SnapshotBuilder builder;
    builder.library("LIBRARY").userAgent("restore test");
    std::vector<std::string> all;
    fs::create_directories(at("bundle") + "/media");
    for (int number = 0; number < kSyncedPhotos; ++number) {
      SnapshotBuilder::Asset asset;
      asset.uuid = uuidOf(2000 + number);
      asset.exposureDate = 3200000000.0 + number;
      asset.modificationDate = 3200000000.0;
      builder.asset(asset);
      all.push_back(asset.uuid);
      std::ofstream(at("bundle") + "/media/" + asset.uuid + ".JPG", std::ios::binary)
          << "\xff\xd8\xff\xe0 synced " << number << "\xff\xd9";
    }
    builder.album(uuidOf(2800), "Synced", all);
    builder.masterAlbum(all, uuidOf(2999));
    const auto bytes = builder.bytes();
    std::ofstream(at("bundle") + "/PhotoLibrary.plist", std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
  }

  // Content by name.
  std::map<std::string, std::string> cameraFiles(const std::string& device) const {
    std::map<std::string, std::string> files;
    const std::string camera = at(device) + device_paths::kDcim;
    for (const auto& entry : fs::recursive_directory_iterator(camera)) {
      if (!entry.is_regular_file()) continue;
      std::ifstream file(entry.path(), std::ios::binary);
      files[fs::relative(entry.path(), camera).string()] =
          std::string(std::istreambuf_iterator<char>(file), {});
    }
    return files;
  }
  Json dump(const std::string& device) const {
    return succeed({program("kxsync"), "dump", "--json", at(device)});
  }
  // Title and members' paths of each album of the device's own, in order.
  std::vector<std::string> ownAlbums(const std::string& device) const {
    const Json all = dump(device);
    std::vector<std::string> texts;
    for (const Json& album : all.at("albums")) {
      if (album.at("kind") != 2) continue;
      std::string text = album.at("uuid").get<std::string>() + album.at("title").dump();
      for (const Json& member : album.at("assets")) {
        text += " " + all.at("assets").at(member.get<std::string>()).at("path").get<std::string>();
      }
      texts.push_back(text);
    }
    return texts;
  }

  void expectRestored() {
    EXPECT_EQ(cameraFiles("killed"), expectedFiles_);
    EXPECT_EQ(ownAlbums("killed"), expectedAlbums_);
    const Json all = dump("killed");
    std::size_t own = 0;
    for (const auto& [uuid, asset] : all.at("assets").items()) {
      EXPECT_FALSE(asset.at("incomplete").get<bool>()) << asset.at("path");
      if (asset.at("savedAssetType") != 256) ++own;
    }
    EXPECT_EQ(own, static_cast<std::size_t>(kCameraFiles));
    for (const char* album : {"camera", "otaRestoreProgress"}) {
      EXPECT_EQ(all.at(album).at("pendingItemsCount"), 0) << album;
      EXPECT_EQ(all.at(album).at("pendingItemsType"), 1) << album;
    }
    for (const char* left : {device_paths::kRestoreMarker, device_paths::kRestoreContext}) {
      EXPECT_FALSE(fs::exists(at("killed") + left)) << left;
    }
    EXPECT_TRUE(fs::is_empty(at("killed") + device_paths::kStaging));
  }
  void expectSyncedAgain() {
    const Json synced = succeed({program("kxsync"), "sync", "--json", at("bundle"), at("killed")});
    EXPECT_EQ(synced.value("imported", -1), kSyncedPhotos);
    EXPECT_EQ(ownAlbums("killed"), expectedAlbums_);
    EXPECT_EQ(dump("killed").at("assets").size(),
              static_cast<std::size_t>(kCameraFiles + kSyncedPhotos));
  }

  void killAtRandomPoints(const std::string& backup) {
    fs::remove_all(at("killed"));
    std::uint64_t effects = runTraced(restoreCommand(backup), 0).effects;
    ASSERT_GT(effects, static_cast<std::uint64_t>(kPointsPerWay));
    expectRestored();
    const unsigned seed = std::random_device()();
    SCOPED_TRACE("seed " + std::to_string(seed));
    std::printf("seed %u, %llu calls\n", seed, static_cast<unsigned long long>(effects));
    std::mt19937_64 random(seed);
    int missed = 0;
    for (int i = 0; i < kPointsPerWay;) {
      const std::uint64_t point = 1 + random() % effects;
      SCOPED_TRACE("killed before call " + std::to_string(point));
      fs::remove_all(at("killed"));
      const auto run = runTraced(restoreCommand(backup), point);
      if (!run.killed) {
        // How many calls there are depends on how the files fall into batches, and that on time.
        effects = std::min(effects, run.effects);
        ASSERT_LE(++missed, kPointsPerWay);
        continue;
      }
      // Every third restore is killed a second time.
      if (i % 3 == 0) runTraced(restoreCommand(backup), 1 + random() % effects);
      const Json result = succeed(restoreCommand(backup));
      EXPECT_TRUE(result.at("failed").empty());
      expectRestored();
      if (i % 5 == 0) expectSyncedAgain();
      if (HasFailure()) return;
      ++i;
    }
  }

  fs::path top_;
  std::map<std::string, std::string> expectedFiles_;
  std::vector<std::string> expectedAlbums_;
};

TEST_F(RestoreKillTest, WithTheLibraryItCanBeKilledAnywhere) { killAtRandomPoints("library"); }

TEST_F(RestoreKillTest, WithoutTheLibraryItCanBeKilledAnywhere) { killAtRandomPoints("plain"); }

}  // namespace
}  // namespace kx::test
