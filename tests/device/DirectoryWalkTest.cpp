#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

namespace fs = std::filesystem;

const std::string kTop = "/var/mobile/Media/DCIM";

// The walk over a real tree.
class DirectoryWalkTest : public DeviceTest {
 protected:
  struct Walk {
    std::vector<FileProperties> entries;
    std::vector<std::pair<std::string, std::int64_t>> errors;  // path and errno
  };
  Walk walk(const std::function<void(const FileProperties&)>& onEntry = {}) {
    Walk found;
    platform().files().enumerate(
        kTop,
        [&](const FileProperties& entry) {
          found.entries.push_back(entry);
          if (onEntry) onEntry(entry);
          return entry.name == "skipped" ? EnumerationChoice::kSkipDescendants
                                         : EnumerationChoice::kDescend;
        },
        [&found](const std::string& path, const ErrorPtr& error) {
          found.errors.emplace_back(path, error->code());
        });
    return found;
  }
  static std::vector<std::string> paths(const Walk& walk) {
    std::vector<std::string> found;
    for (const FileProperties& entry : walk.entries) found.push_back(entry.path);
    return found;
  }
};

TEST_F(DirectoryWalkTest, TellsWhatEveryEntryIs) {
  putFile(kTop + "/a/file", "12345");
  putFile(kTop + "/skipped/unseen", "x");
  fs::create_directory_symlink(at(kTop + "/a"), at(kTop + "/z"));
  ASSERT_EQ(::mkfifo(at(kTop + "/pipe").c_str(), 0600), 0);
  const Walk found = walk();
  EXPECT_EQ(paths(found), (std::vector<std::string>{kTop + "/a", kTop + "/a/file", kTop + "/pipe",
                                                    kTop + "/skipped", kTop + "/z"}));
  EXPECT_TRUE(found.errors.empty());
  FileSystem& files = platform().files();
  for (const FileProperties& entry : found.entries) {
    EXPECT_EQ(entry.error, nullptr);
    EXPECT_EQ(entry.path, entry.parentPath + "/" + entry.name);
    EXPECT_EQ(entry.parentResourceIdentifier, files.resourceIdentifier(entry.parentPath));
    EXPECT_EQ(entry.isDirectory, entry.name == "a" || entry.name == "skipped") << entry.path;
    struct stat status {};
    ASSERT_EQ(::lstat(at(entry.path).c_str(), &status), 0);
    EXPECT_EQ(entry.fileSize, status.st_size) << entry.path;
  }
  EXPECT_EQ(found.entries.at(1).fileSize, 5);
}

TEST_F(DirectoryWalkTest, WhatGoesAwayMeanwhileIsToldAsGoneAndPassedOver) {
  putFile(kTop + "/a", "1");
  putFile(kTop + "/b", "1");
  putFile(kTop + "/c/d", "1");
  putFile(kTop + "/e", "1");
  const Walk found = walk([this](const FileProperties& entry) {
    if (entry.name == "a") fs::remove(at(kTop + "/b"));
    if (entry.name == "c") fs::remove_all(at(kTop + "/c"));
  });
  EXPECT_EQ(paths(found), (std::vector<std::string>{kTop + "/a", kTop + "/c", kTop + "/e"}));
  const std::vector<std::pair<std::string, std::int64_t>> gone = {{kTop + "/b", ENOENT},
                                                                  {kTop + "/c", ENOENT}};
  EXPECT_EQ(found.errors, gone);
}

TEST_F(DirectoryWalkTest, ADirectoryThatCannotBeOpenedDoesNotEndIt) {
  putFile(kTop + "/a/b", "1");
  putFile(kTop + "/c", "1");
  // It becomes a link when it is about to be entered.
  const Walk found = walk([this](const FileProperties& entry) {
    if (entry.name != "a") return;
    fs::remove_all(at(kTop + "/a"));
    fs::create_directory_symlink("/", at(kTop + "/a"));
  });
  EXPECT_EQ(paths(found), (std::vector<std::string>{kTop + "/a", kTop + "/c"}));
  ASSERT_EQ(found.errors.size(), 1U);
  EXPECT_EQ(found.errors[0].first, kTop + "/a");
}

TEST_F(DirectoryWalkTest, AMissingTopIsGone) {
  fs::remove_all(at(kTop));
  const Walk found = walk();
  EXPECT_TRUE(found.entries.empty());
  const std::vector<std::pair<std::string, std::int64_t>> gone = {{kTop, ENOENT}};
  EXPECT_EQ(found.errors, gone);
}

TEST_F(DirectoryWalkTest, ALockOfAnotherProcessIsSeenAndAFreeOneLeftFree) {
  FileSystem& files = platform().files();
  EXPECT_EQ(files.tryLock("/tmp/BackupRunning").outcome, FileSystem::LockOutcome::kNoFile);
  putFile("/tmp/BackupRunning", "");
  EXPECT_EQ(files.tryLock("/tmp/BackupRunning").outcome, FileSystem::LockOutcome::kTaken);
  const int other = ::open(at("/tmp/BackupRunning").c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_EQ(::flock(other, LOCK_EX | LOCK_NB), 0) << "the attempt has let it go";
  EXPECT_EQ(files.tryLock("/tmp/BackupRunning").outcome, FileSystem::LockOutcome::kHeldElsewhere);
  ::close(other);
}

}  // namespace
}  // namespace kx
