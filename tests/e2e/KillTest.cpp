#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>
#include <set>
#include <string>

#include "testing/SnapshotBuilder.h"
#include "tests/e2e/TracedRun.h"

namespace kx::test {
namespace {

namespace fs = std::filesystem;
using Json = nlohmann::json;

constexpr int kPointsPerSync = 45;

std::string uuidOf(int number) {
  char text[40];
  std::snprintf(text, sizeof text, "%08X-0000-4000-8000-%012X", number, number * 7);
  return text;
}

// A host bundle, a device before the sync that is killed, and the device as that sync should leave
// it when nothing happens.
class KillTest : public testing::Test {
 protected:
  void SetUp() override {
    if (!canTrace()) GTEST_SKIP() << "this process may not trace its children";
    std::string pattern = (fs::temp_directory_path() / "kxkillXXXXXX").string();
    ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
    top_ = pattern;
    // The daemon of these programs would otherwise look elsewhere first.
    ::unsetenv("KXSYNC_PLUGIN");
  }
  void TearDown() override {
    if (!top_.empty()) fs::remove_all(top_);
  }

  fs::path at(const std::string& name) const { return top_ / name; }
  std::vector<std::string> syncCommand(const std::string& bundle, const std::string& device) const {
    return {KX_TEST_BIN_DIR "/ferrule", "sync",     "--json",
            "--allow-deletes",          at(bundle), at(device)};
  }
  Json sync(const std::string& bundle, const std::string& device) const {
    int exitCode = -1;
    const std::string output = runForOutput(syncCommand(bundle, device), &exitCode);
    EXPECT_EQ(exitCode, 0) << output;
    return Json::parse(output, nullptr, false);
  }
  Json dump(const std::string& device) const {
    int exitCode = -1;
    const std::string output = runForOutput(
        {KX_TEST_BIN_DIR "/kxsync", "dump", "--json", "--hash", at(device)}, &exitCode);
    EXPECT_EQ(exitCode, 0) << output;
    return Json::parse(output, nullptr, false);
  }
  void writeMedia(const std::string& bundle, int number, const std::string& version) const {
    fs::create_directories(at(bundle) / "media");
    std::ofstream(at(bundle) / "media" / (uuidOf(number) + ".JPG"), std::ios::binary)
        << "\xff\xd8\xff\xe0 photo " << number << version << std::string(3000, 'p') << "\xff\xd9";
  }
  void writeSnapshot(const std::string& bundle, const SnapshotBuilder& builder) const {
    const auto bytes = builder.bytes();
    std::ofstream(at(bundle) / "PhotoLibrary.plist", std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
  }
  void addAsset(SnapshotBuilder& builder, const std::string& bundle, int number,
                double modified = 3200000000.0) const {
    SnapshotBuilder::Asset asset;
    asset.uuid = uuidOf(number);
    asset.exposureDate = 3200000000.0 + number;
    asset.modificationDate = modified;
    asset.eventUUID = uuidOf(900 + number % 3);
    asset.originalFileName = "IMG_" + std::to_string(number) + ".JPG";
    if (number % 5 == 0) asset.faces = {{1, 0.1, 0.2, 0.3, 0.25, uuidOf(950)}};
    builder.asset(asset);
    writeMedia(bundle, number, std::to_string(modified));
  }
  // Assets from..to with albums over them; every fifth is changed when `modified` says so.
  void writeBundle(const std::string& bundle, const std::string& library, int from, int to,
                   bool modified) const {
    SnapshotBuilder builder;
    builder.library(library).userAgent("kill test");
    std::vector<std::string> all, odd;
    for (int number = from; number < to; ++number) {
      addAsset(builder, bundle, number, modified && number % 5 == 0 ? 3200000500.0 : 3200000000.0);
      all.push_back(uuidOf(number));
      if (number % 2 != 0) odd.insert(odd.begin(), uuidOf(number));
    }
    for (int event = 900; event < 903; ++event) {
      builder.event(uuidOf(event), (modified ? "Later " : "Event ") + std::to_string(event));
    }
    if (modified) builder.album(uuidOf(801), "New", all);
    builder.album(uuidOf(800), modified ? "Odd ones" : "Odd", odd);
    if (!modified) builder.album(uuidOf(802), "Gone later", all);
    builder.album(uuidOf(950), "Somebody", all, SnapshotBuilder::kFaceAlbum);
    builder.masterAlbum(all, uuidOf(999));
    writeSnapshot(bundle, builder);
  }
  void copyDevice(const std::string& from, const std::string& to) const {
    fs::remove_all(at(to));
    if (fs::exists(at(from))) fs::copy(at(from), at(to), fs::copy_options::recursive);
  }
  std::set<std::string> filesOf(const std::string& device) const {
    std::set<std::string> files;
    for (const auto& entry : fs::recursive_directory_iterator(at(device))) {
      if (entry.is_regular_file()) files.insert(fs::relative(entry.path(), at(device)).string());
    }
    return files;
  }

  // Kills the sync of `bundle` onto a copy of `before` at points spread over all it does to disk,
  // and expects the sync after that to end as one that nobody killed.
  void killEverywhere(const std::string& bundle, const std::string& before) {
    copyDevice(before, "whole");
    const std::uint64_t effects = runTraced(syncCommand(bundle, "whole"), 0).effects;
    ASSERT_GT(effects, static_cast<std::uint64_t>(kPointsPerSync));
    const Json expected = dump("whole");
    const std::set<std::string> expectedFiles = filesOf("whole");
    int killed = 0;
    for (int i = 0; i < kPointsPerSync; ++i) {
      const std::uint64_t point =
          1 + effects * static_cast<std::uint64_t>(i) / static_cast<std::uint64_t>(kPointsPerSync);
      SCOPED_TRACE("killed before call " + std::to_string(point) + " of " +
                   std::to_string(effects));
      copyDevice(before, "killed");
      if (runTraced(syncCommand(bundle, "killed"), point).killed) ++killed;
      expectRecovery(bundle, expected, expectedFiles);
      if (HasFatalFailure()) return;
    }
    // The number of calls varies a little between runs, so the last points may come too late.
    EXPECT_GE(killed, kPointsPerSync - 5);
  }

  void expectRecovery(const std::string& bundle, const Json& expected,
                      const std::set<std::string>& expectedFiles) {
    const Json result = sync(bundle, "killed");
    ASSERT_TRUE(result.is_object());
    EXPECT_TRUE(result.at("failed").empty());
    EXPECT_EQ(dump("killed"), expected);
    EXPECT_EQ(filesOf("killed"), expectedFiles);
  }

  fs::path top_;
};

TEST_F(KillTest, AFirstSyncCanBeKilledAnywhere) {
  writeBundle("bundle", "LIBRARY-1", 0, 40, false);
  killEverywhere("bundle", "nothing");
}

TEST_F(KillTest, ASyncOfChangesCanBeKilledAnywhere) {
  writeBundle("first", "LIBRARY-1", 0, 40, false);
  sync("first", "before");
  writeBundle("second", "LIBRARY-1", 8, 52, true);
  killEverywhere("second", "before");
}

TEST_F(KillTest, AChangeOfLibraryCanBeKilledAnywhere) {
  writeBundle("first", "LIBRARY-1", 0, 40, false);
  sync("first", "before");
  writeBundle("second", "LIBRARY-2", 20, 60, true);
  killEverywhere("second", "before");
}

// What was imported before the kill is not asked for again.
TEST_F(KillTest, WhatWasImportedIsNotMovedAgain) {
  writeBundle("bundle", "LIBRARY-1", 0, 40, false);
  const std::uint64_t effects = runTraced(syncCommand("bundle", "whole"), 0).effects;
  int partly = 0;
  for (std::uint64_t part = 50; part < 100; part += 5) {
    fs::remove_all(at("killed"));
    runTraced(syncCommand("bundle", "killed"), effects * part / 100);
    // What a reader sees is what the last commit left.
    const std::size_t present = dump("killed").at("assets").size();
    const Json result = sync("bundle", "killed");
    EXPECT_EQ(result.at("requested").get<std::size_t>(), 40 - present);
    EXPECT_EQ(result.at("imported").get<std::size_t>(), 40 - present);
    if (present > 0) ++partly;
  }
  EXPECT_GT(partly, 0);
}

}  // namespace
}  // namespace kx::test
