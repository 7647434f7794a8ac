#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <string>

#include "backup/BackupReader.h"
#include "device/ReferenceDevice.h"
#include "tests/e2e/TracedRun.h"

namespace kx::test {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kStep = 3;  // every third call is tried

// A device whose camera files change after a first backup; the second one is killed everywhere.
class BackupKillTest : public testing::Test {
 protected:
  using Contents = std::map<std::string, std::string>;  // by device path

  void SetUp() override {
    if (!canTrace()) GTEST_SKIP() << "this process may not trace its children";
    std::string pattern = (fs::temp_directory_path() / "kxbackupXXXXXX").string();
    ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
    top_ = pattern;
    ::unsetenv("KXSYNC_PLUGIN");
    DeviceOptions options;
    options.root = at("device");
    options.create = true;
    ASSERT_NE(ReferenceDevice::open(options, nullptr), nullptr);
  }
  void TearDown() override {
    if (!top_.empty()) fs::remove_all(top_);
  }

  fs::path at(const std::string& name) const { return top_ / name; }
  fs::path camera() const { return at("device") / "var/mobile/Media/DCIM"; }
  void put(const std::string& name, const std::string& content) {
    fs::create_directories((camera() / name).parent_path());
    std::ofstream(camera() / name, std::ios::binary) << content;
  }
  std::vector<std::string> command(const std::string& backup) const {
    return {KX_TEST_BIN_DIR "/kxsync", "backup",     "--json",
            "--with-library",          at("device"), at(backup)};
  }
  void backUp(const std::string& backup) const {
    int exitCode = -1;
    const std::string output = runForOutput(command(backup), &exitCode);
    ASSERT_EQ(exitCode, 0) << output;
  }
  // What a backup holds, every file of it checked.
  Contents contents(const std::string& backup) const {
    int exitCode = -1;
    const std::string output = runForOutput(
        {KX_TEST_BIN_DIR "/kxsync", "backup", "--json", "--verify", at(backup)}, &exitCode);
    EXPECT_EQ(exitCode, 0) << output;
    Contents found;
    const auto reader = BackupReader::open(at(backup), nullptr);
    if (!reader) return found;
    EXPECT_TRUE(reader->albums(nullptr));
    EXPECT_TRUE(reader->manifest().library);
    for (const BackupFile& file : reader->manifest().files) {
      UniqueFd fd;
      EXPECT_EQ(reader->openFile(file.path, &fd), 0);
      std::ifstream stream("/proc/self/fd/" + std::to_string(fd.get()), std::ios::binary);
      found[file.path] = {std::istreambuf_iterator<char>(stream), {}};
    }
    return found;
  }
  std::vector<std::string> listing(const std::string& backup) const {
    std::vector<std::string> found;
    for (const auto& entry : fs::recursive_directory_iterator(at(backup))) {
      found.push_back(fs::relative(entry.path(), at(backup)).string());
    }
    std::sort(found.begin(), found.end());
    return found;
  }

  fs::path top_;
};

TEST_F(BackupKillTest, TheOldBackupStaysWholeUntilTheNewOneIs) {
  for (int i = 0; i < 4; ++i)
    put("100AB/" + std::to_string(i) + ".JPG", "first " + std::to_string(i));
  put("gone/x.JPG", "gone");
  put("becomes", "a directory");
  backUp("old");
  const Contents before = contents("old");
  put("100AB/0.JPG", "changed");
  put("101AB/9.JPG", "new");
  fs::remove_all(camera() / "gone");
  fs::remove(camera() / "becomes");
  put("becomes/y.JPG", "inside");
  const auto copyOld = [this] {
    fs::remove_all(at("killed"));
    // With the times that files are known by.
    int exitCode = -1;
    runForOutput({"/bin/cp", "-a", at("old"), at("killed")}, &exitCode);
    ASSERT_EQ(exitCode, 0);
  };
  copyOld();
  const std::uint64_t effects = runTraced(command("killed"), 0).effects;
  const Contents after = contents("killed");
  const std::vector<std::string> files = listing("killed");
  ASSERT_NE(before, after);
  ASSERT_GT(effects, 30U);
  int keptOld = 0;
  int hasNew = 0;
  for (std::uint64_t point = 1; point <= effects; point += kStep) {
    SCOPED_TRACE("killed before call " + std::to_string(point) + " of " + std::to_string(effects));
    copyOld();
    runTraced(command("killed"), point);
    const Contents found = contents("killed");
    if (found == before) ++keptOld;
    if (found == after) ++hasNew;
    ASSERT_TRUE(found == before || found == after);
    backUp("killed");
    ASSERT_EQ(contents("killed"), after);
    ASSERT_EQ(listing("killed"), files);
  }
  EXPECT_GT(keptOld, 5);
  EXPECT_GT(hasNew, 5);
}

TEST_F(BackupKillTest, AFirstBackupIsThereWholeOrNotAtAll) {
  for (int i = 0; i < 3; ++i) put("100AB/" + std::to_string(i) + ".JPG", "first");
  const std::uint64_t effects = runTraced(command("killed"), 0).effects;
  const Contents after = contents("killed");
  ASSERT_EQ(after.size(), 3U);
  for (std::uint64_t point = 1; point <= effects; point += kStep) {
    SCOPED_TRACE("killed before call " + std::to_string(point) + " of " + std::to_string(effects));
    fs::remove_all(at("killed"));
    runTraced(command("killed"), point);
    if (BackupReader::open(at("killed"), nullptr)) {
      ASSERT_EQ(contents("killed"), after);
    }
    backUp("killed");
    ASSERT_EQ(contents("killed"), after);
  }
}

}  // namespace
}  // namespace kx::test
