#include "daemon/BundleLink.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "platform/foundation/Limits.h"
#include "tests/daemon/Support.h"

namespace kx::test {
namespace {

using testing::HasSubstr;

class BundleLinkTest : public testing::Test {
 protected:
  std::unique_ptr<BundleLink> open() {
    work.write("PhotoLibrary.plist", "snapshot bytes");
    ErrorPtr error;
    auto link = BundleLink::open(work.path(), &error);
    EXPECT_TRUE(link) << error->description();
    return link;
  }
  static std::string content(BundleLink& link, const std::string& identifier) {
    ErrorPtr error;
    const FileDescriptor file = link.openMedia(identifier, &error);
    if (!file.valid()) return "errno " + std::to_string(error->code());
    char buffer[64];
    const ssize_t length = ::read(file.get(), buffer, sizeof buffer);
    return std::string(buffer, length < 0 ? 0 : static_cast<std::size_t>(length));
  }

  TempDirectory work;
};

TEST_F(BundleLinkTest, FindsTheExactNameFirstThenTheFirstByBytes) {
  work.write("media/A", "exact");
  work.write("media/A.JPG", "other");
  work.write("media/B.jpg", "second");
  work.write("media/B.JPG", "first");
  work.write("media/C.tar.gz", "two dots");
  const auto link = open();
  EXPECT_EQ(content(*link, "A"), "exact");
  EXPECT_EQ(content(*link, "B"), "first");
  EXPECT_EQ(content(*link, "C.tar"), "two dots");
  EXPECT_EQ(content(*link, "C"), "errno " + std::to_string(ENOENT));
  EXPECT_EQ(link->mediaSize("B"), 5);
  EXPECT_EQ(link->mediaSize("C"), std::nullopt);
}

TEST_F(BundleLinkTest, NamesFromTheSnapshotNeverLeaveMedia) {
  work.write("secret", "secret");
  work.write("media/A", "fine");
  const auto link = open();
  for (const std::string& name : {std::string("../secret"), work.at("secret"), std::string("."),
                                  std::string(".."), std::string(""), std::string("A/../../secret"),
                                  std::string("A\0x", 3), std::string(5000, 'x')}) {
    EXPECT_EQ(content(*link, name), "errno " + std::to_string(ENOENT)) << name;
    EXPECT_EQ(link->mediaSize(name), std::nullopt);
  }
}

TEST_F(BundleLinkTest, LinksInMediaAreNotFollowed) {
  work.write("secret", "secret");
  std::filesystem::create_directory(work.at("media"));
  std::filesystem::create_symlink("../secret", work.at("media/A.jpg"));
  std::filesystem::create_symlink("/proc/self/fd/0", work.at("media/B"));
  const auto link = open();
  EXPECT_EQ(content(*link, "A"), "errno " + std::to_string(ELOOP));
  EXPECT_EQ(content(*link, "B"), "errno " + std::to_string(ELOOP));
  EXPECT_EQ(link->mediaSize("A"), std::nullopt);
}

TEST_F(BundleLinkTest, ALinkedMediaDirectoryHoldsNothing) {
  work.write("elsewhere/A", "secret");
  std::filesystem::create_directory_symlink(work.at("elsewhere"), work.at("media"));
  const auto link = open();
  EXPECT_EQ(content(*link, "A"), "errno " + std::to_string(ENOENT));
}

TEST_F(BundleLinkTest, ABundleWithoutMediaHasNoFiles) {
  const auto link = open();
  EXPECT_EQ(content(*link, "A"), "errno " + std::to_string(ENOENT));
}

TEST_F(BundleLinkTest, OpeningAFifoDoesNotWait) {
  std::filesystem::create_directory(work.at("media"));
  ASSERT_EQ(::mkfifo(work.at("media/A").c_str(), 0600), 0);
  const auto link = open();
  ErrorPtr error;
  EXPECT_TRUE(link->openMedia("A", &error).valid());
}

TEST_F(BundleLinkTest, GivesTheSnapshotsBytes) {
  ErrorPtr error;
  const DataPtr bytes = open()->snapshot(&error);
  ASSERT_TRUE(bytes);
  EXPECT_EQ(std::string(bytes->bytes(), bytes->bytes() + bytes->length()), "snapshot bytes");
}

TEST_F(BundleLinkTest, SaysWhyADirectoryIsNoBundle) {
  ErrorPtr error;
  EXPECT_FALSE(BundleLink::open(work.at("missing"), &error));
  EXPECT_THAT(error->message(), HasSubstr("No such file or directory"));
  EXPECT_FALSE(BundleLink::open(work.path(), &error));
  EXPECT_THAT(error->message(), HasSubstr("is no host bundle: it has no file PhotoLibrary.plist"));
  std::filesystem::create_symlink("/etc/hostname", work.at("PhotoLibrary.plist"));
  EXPECT_FALSE(BundleLink::open(work.path(), &error));
}

TEST_F(BundleLinkTest, RefusesASnapshotBeyondTheLimitUnread) {
  const auto link = open();
  const auto size = static_cast<off_t>(limits::kSnapshotFileBytes) + 1;
  ASSERT_EQ(::truncate(work.at("PhotoLibrary.plist").c_str(), size), 0);
  ErrorPtr error;
  EXPECT_FALSE(link->snapshot(&error));
  EXPECT_THAT(error->message(), HasSubstr("is larger than 1073741824 bytes"));
}

TEST_F(BundleLinkTest, ASnapshotThatBecameALinkIsNotRead) {
  const auto link = open();
  std::filesystem::remove(work.at("PhotoLibrary.plist"));
  std::filesystem::create_symlink("/etc/hostname", work.at("PhotoLibrary.plist"));
  ErrorPtr error;
  EXPECT_FALSE(link->snapshot(&error));
  EXPECT_THAT(error->message(), HasSubstr("cannot read"));
}

}  // namespace
}  // namespace kx::test
