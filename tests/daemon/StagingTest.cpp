#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "daemon/FileTransfer.h"
#include "platform/sync/FRAsset.h"
#include "tests/daemon/Support.h"

namespace kx::test {
namespace {

using testing::HasSubstr;

class StagingTest : public testing::Test {
 protected:
  void SetUp() override {
    ErrorPtr error;
    std::filesystem::create_directory(work.at("device"));
    staging = Staging::open(work.at("device"), &error);
    ASSERT_TRUE(staging) << error->description();
  }

  FileDescriptor source(const std::string& name) const {
    return FileDescriptor(
        ::open(work.at(name).c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  }
  Staging::Result take(const std::string& name) const {
    return staging->take(source(name), [](std::uint64_t) { return true; });
  }
  std::string staged(const Staging::Result& result) const {
    return "device/var/mobile/Media/" + result.path;
  }
  std::size_t stagedFiles() const {
    const auto entries =
        std::filesystem::directory_iterator(work.at("device/var/mobile/Media/Photos/Sync/Staging"));
    return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
  }

  TempDirectory work;
  std::unique_ptr<Staging> staging;
};

TEST_F(StagingTest, CopiesWholeUnderANameOfItsOwn) {
  for (const std::size_t size : {0U, 1U, 5U << 20, (8U << 20) + 1}) {
    std::string content(size, 'x');
    for (std::size_t i = 0; i < size; i += 4093) content[i] = static_cast<char>(i % 251);
    work.write("../evil name.jpg" + std::to_string(size), "unused");
    work.write("photo", content);
    std::uint64_t told = 0;
    const auto result = staging->take(source("photo"), [&](std::uint64_t bytes) {
      told += bytes;
      return true;
    });
    ASSERT_FALSE(result.error) << result.error->description();
    EXPECT_EQ(result.bytes, size);
    EXPECT_EQ(told, size);
    EXPECT_THAT(result.path, testing::MatchesRegex("Photos/Sync/Staging/t[0-9]{8}"));
    EXPECT_EQ(work.read(staged(result)), content);
    std::filesystem::remove(work.at("../evil name.jpg" + std::to_string(size)));
  }
}

TEST_F(StagingTest, GivesPrivateModesWhateverTheHostHas) {
  work.write("photo", "bytes");
  ::chmod(work.at("photo").c_str(), 06777);
  struct stat status {};
  ASSERT_EQ(::stat(work.at(staged(take("photo"))).c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0600U);
  ASSERT_EQ(::stat(work.at("device/var/mobile/Media/Photos/Sync/Staging").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0700U);
}

TEST_F(StagingTest, RefusesWhatIsNoRegularFile) {
  ASSERT_EQ(::mkfifo(work.at("fifo").c_str(), 0600), 0);
  std::filesystem::create_directory(work.at("directory"));
  for (const char* name : {"fifo", "directory"}) {
    const auto result = take(name);
    ASSERT_TRUE(result.error) << name;
    EXPECT_EQ(result.error->domain(), kFRErrorDomain);
    EXPECT_EQ(result.error->code(), kFRErrorReadOrWrite);
    EXPECT_EQ(result.error->message(), "it is no regular file");
  }
  EXPECT_EQ(stagedFiles(), 0U);
}

TEST_F(StagingTest, RefusesAFileBeyondTheLimitWithoutReadingIt) {
  work.write("sparse", "");
  ASSERT_EQ(::truncate(work.at("sparse").c_str(), kMediaFileBytes + 1), 0) << errno;
  const auto result = take("sparse");
  ASSERT_TRUE(result.error);
  EXPECT_EQ(result.error->code(), kFRErrorReadOrWrite);
  EXPECT_THAT(result.error->message(), HasSubstr("larger than 68719476736 bytes"));
  EXPECT_EQ(stagedFiles(), 0U);
}

class StagingChangeTest : public StagingTest,
                          public testing::WithParamInterface<std::pair<const char*, off_t>> {};

TEST_P(StagingChangeTest, RefusesAFileThatChangesWhileItIsRead) {
  work.write("photo", std::string(12U << 20, 'x'));
  bool changed = false;
  const auto result = staging->take(source("photo"), [&](std::uint64_t) {
    if (!changed) {
      changed = true;
      EXPECT_EQ(::truncate(work.at("photo").c_str(), GetParam().second), 0);
    }
    return true;
  });
  ASSERT_TRUE(result.error);
  EXPECT_EQ(result.error->code(), kFRErrorReadOrWrite);
  EXPECT_EQ(result.error->message(), "the file changed while it was read");
  EXPECT_EQ(stagedFiles(), 0U);
}

INSTANTIATE_TEST_SUITE_P(Sizes, StagingChangeTest,
                         testing::Values(std::pair{"Shrinks", off_t{5} << 20},
                                         std::pair{"ShrinksToNothing", off_t{0}},
                                         std::pair{"Grows", off_t{13} << 20}),
                         [](const auto& row) { return row.param.first; });

TEST_F(StagingTest, RefusesAFileRewrittenInPlaceWithTheSameSize) {
  work.write("photo", std::string(9U << 20, 'x'));
  const timespec times[2] = {{1000, 0}, {1000, 0}};
  const auto result = staging->take(source("photo"), [&](std::uint64_t) {
    ::utimensat(AT_FDCWD, work.at("photo").c_str(), times, 0);
    return true;
  });
  ASSERT_TRUE(result.error);
  EXPECT_EQ(result.error->message(), "the file changed while it was read");
}

TEST_F(StagingTest, LeavesNothingOfACopyThatWasGivenUp) {
  work.write("photo", std::string(9U << 20, 'x'));
  const auto result = staging->take(source("photo"), [](std::uint64_t) { return false; });
  EXPECT_TRUE(result.cancelled);
  EXPECT_FALSE(result.error);
  EXPECT_TRUE(result.path.empty());
  EXPECT_EQ(stagedFiles(), 0U);
}

TEST_F(StagingTest, NeverWritesThroughWhatLiesInItsWay) {
  work.write("outside", "canary");
  const std::string place = "device/var/mobile/Media/Photos/Sync/Staging/";
  std::filesystem::create_symlink(work.at("outside"), work.at(place + "t00000001"));
  std::filesystem::create_directory(work.at(place + "t00000002"));
  ASSERT_EQ(::mkfifo(work.at(place + "t00000003").c_str(), 0600), 0);
  work.write("photo", "bytes");
  const auto result = take("photo");
  ASSERT_FALSE(result.error);
  EXPECT_EQ(result.path, "Photos/Sync/Staging/t00000004");
  EXPECT_EQ(work.read("outside"), "canary");
}

TEST_F(StagingTest, ClearRemovesLinksAndLeftOversButNotWhatTheyPointTo) {
  work.write("outside/canary", "canary");
  const std::string place = "device/var/mobile/Media/Photos/Sync/Staging/";
  std::filesystem::create_directory_symlink(work.at("outside"), work.at(place + "link"));
  std::filesystem::create_directory(work.at(place + "empty"));
  work.write(place + "t00000009", "left over");
  staging->clear();
  EXPECT_EQ(stagedFiles(), 0U);
  EXPECT_EQ(work.read("outside/canary"), "canary");
}

TEST_F(StagingTest, DropRemovesOneFile) {
  work.write("photo", "bytes");
  const auto first = take("photo");
  const auto second = take("photo");
  staging->drop(first.path);
  staging->drop(first.path);
  EXPECT_FALSE(work.exists(staged(first)));
  EXPECT_TRUE(work.exists(staged(second)));
}

TEST_F(StagingTest, DoesNotOpenThroughALinkedDirectory) {
  TempDirectory other;
  std::filesystem::create_directories(other.at("device/var/mobile"));
  std::filesystem::create_directory(other.at("elsewhere"));
  std::filesystem::create_directory_symlink(other.at("elsewhere"),
                                            other.at("device/var/mobile/Media"));
  ErrorPtr error;
  EXPECT_FALSE(Staging::open(other.at("device"), &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain(), kPosixErrorDomain);
  EXPECT_TRUE(std::filesystem::is_empty(other.at("elsewhere")));
}

TEST(ReadWholeTest, NoticesAFileOfAnotherLength) {
  TempDirectory work;
  work.write("file", "0123456789");
  const FileDescriptor file(::open(work.at("file").c_str(), O_RDONLY));
  std::vector<std::uint8_t> bytes(10);
  EXPECT_EQ(readWhole(file.get(), bytes), 0);
  EXPECT_EQ(bytes[9], '9');
  bytes.resize(9);
  EXPECT_EQ(readWhole(file.get(), bytes), kFileChanged);
  bytes.resize(11);
  EXPECT_EQ(readWhole(file.get(), bytes), kFileChanged);
  EXPECT_EQ(readWhole(-1, bytes), EBADF);
}

}  // namespace
}  // namespace kx::test
