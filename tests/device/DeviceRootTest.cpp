#include "device/DeviceRoot.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "device/DeviceErrors.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

namespace fs = std::filesystem;

class DeviceRootTest : public ::testing::Test {
 protected:
  void SetUp() override {
    root_ = DeviceRoot::open(inside(), true, nullptr);
    ASSERT_NE(root_, nullptr);
    std::ofstream(outside() + "/secret") << "secret";
  }
  std::string inside() const { return directory_.path() + "/device"; }
  std::string outside() const { return directory_.path(); }
  int write(const std::string& path, const std::string& text) {
    return root_->writeAtomically(
        path, {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
  }
  std::string text(const std::string& path) {
    std::vector<std::uint8_t> bytes;
    EXPECT_EQ(root_->readFile(path, &bytes), 0);
    return {bytes.begin(), bytes.end()};
  }
  std::size_t entriesOutside() const {
    return static_cast<std::size_t>(
        std::distance(fs::directory_iterator(outside()), fs::directory_iterator()));
  }

  TemporaryDirectory directory_;
  std::shared_ptr<DeviceRoot> root_;
};

TEST_F(DeviceRootTest, RefusesEveryPathThatIsNotPlain) {
  const std::string nul("/a\0b", 4);
  for (const std::string& path :
       {std::string(), std::string("a"), std::string("a/b"), std::string("/.."),
        std::string("/../secret"), std::string("/a/../../secret"), std::string("/a/.."),
        std::string("//etc/passwd"), std::string("/a/"), std::string("/."), std::string("/a//b"),
        nul}) {
    EXPECT_EQ(write(path, "x"), EINVAL) << path;
    EXPECT_EQ(root_->makeDirectories(path), EINVAL) << path;
    EXPECT_EQ(root_->remove(path), EINVAL) << path;
    UniqueFd fd;
    EXPECT_EQ(root_->openFile(path, O_RDONLY, &fd), EINVAL) << path;
  }
  EXPECT_EQ(write("/" + std::string(5000, 'a'), "x"), ENAMETOOLONG);
  EXPECT_EQ(write("/" + std::string(256, 'a'), "x"), ENAMETOOLONG);
  EXPECT_EQ(write("/" + std::string(255, 'a'), "x"), 0);
  EXPECT_EQ(entriesOutside(), 2U);
}

TEST_F(DeviceRootTest, KeepsOddNamesAsTheyAre) {
  for (const std::string name : {"\n", "-rf", "\xE2\x80\xAE", "\\", "..."}) {
    EXPECT_EQ(write("/" + name, name), 0);
    EXPECT_EQ(text("/" + name), name);
  }
}

TEST_F(DeviceRootTest, FollowsNoLink) {
  fs::create_directory(inside() + "/real");
  fs::create_directory_symlink(outside(), inside() + "/parent");
  fs::create_directory_symlink("real", inside() + "/near");
  fs::create_symlink(outside() + "/secret", inside() + "/leaf");
  fs::create_symlink("nowhere", inside() + "/dangling");
  fs::create_symlink("/proc/self/fd/0", inside() + "/magic");
  std::vector<std::uint8_t> bytes;
  EXPECT_EQ(root_->readFile("/parent/secret", &bytes), ELOOP);
  EXPECT_EQ(root_->readFile("/leaf", &bytes), ELOOP);
  EXPECT_EQ(root_->readFile("/dangling", &bytes), ELOOP);
  EXPECT_EQ(root_->readFile("/magic", &bytes), ELOOP);
  EXPECT_EQ(write("/parent/new", "x"), ENOTDIR);
  EXPECT_EQ(write("/near/new", "x"), ENOTDIR);
  EXPECT_NE(root_->makeDirectories("/parent/new"), 0);
  EXPECT_EQ(root_->remove("/parent/secret"), ENOTDIR);
  // Writing over a link replaces the link itself; so does removing it.
  EXPECT_EQ(write("/leaf", "mine"), 0);
  EXPECT_EQ(root_->remove("/dangling"), 0);
  std::ifstream secret(outside() + "/secret");
  std::string word;
  secret >> word;
  EXPECT_EQ(word, "secret");
  EXPECT_EQ(entriesOutside(), 2U);
}

TEST_F(DeviceRootTest, AtomicWriteLeavesEqualBytesAlone) {
  ASSERT_EQ(write("/state", "one"), 0);
  struct stat first;
  struct stat second;
  ASSERT_EQ(root_->status("/state", &first), 0);
  ASSERT_EQ(write("/state", "one"), 0);
  ASSERT_EQ(root_->status("/state", &second), 0);
  EXPECT_EQ(first.st_ino, second.st_ino);
  ASSERT_EQ(write("/state", "two"), 0);
  ASSERT_EQ(root_->status("/state", &second), 0);
  EXPECT_NE(first.st_ino, second.st_ino);
  EXPECT_EQ(text("/state"), "two");
  std::vector<std::string> names;
  ASSERT_EQ(root_->list("/", &names), 0);
  EXPECT_EQ(names, (std::vector<std::string>{"state"}));
}

TEST_F(DeviceRootTest, FilesArePrivate) {
  ASSERT_EQ(root_->makeDirectories("/a/b"), 0);
  ASSERT_EQ(write("/a/b/c", "x"), 0);
  struct stat status;
  ASSERT_EQ(root_->status("/a/b/c", &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0600U);
  ASSERT_EQ(root_->status("/a/b", &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0700U);
}

TEST_F(DeviceRootTest, RenameNeverReplaces) {
  ASSERT_EQ(write("/a", "a"), 0);
  ASSERT_EQ(write("/b", "b"), 0);
  EXPECT_EQ(root_->renameNew("/a", "/b"), EEXIST);
  EXPECT_EQ(text("/b"), "b");
  EXPECT_EQ(root_->renameNew("/a", "/c"), 0);
  EXPECT_EQ(text("/c"), "a");
}

TEST_F(DeviceRootTest, KnowsItsTemporaryNamesAlone) {
  EXPECT_TRUE(DeviceRoot::isTemporaryName(DeviceRoot::temporaryName()));
  EXPECT_NE(DeviceRoot::temporaryName(), DeviceRoot::temporaryName());
  EXPECT_FALSE(DeviceRoot::isTemporaryName(".kxtmp-"));
  EXPECT_FALSE(DeviceRoot::isTemporaryName(".kxtmp-0123456789abcdeg"));
  EXPECT_FALSE(DeviceRoot::isTemporaryName("IMG_0001.JPG"));
}

TEST_F(DeviceRootTest, SaysWhyADirectoryCannotBeTheDevice) {
  ErrorPtr error;
  EXPECT_EQ(DeviceRoot::open(outside() + "/none", false, &error), nullptr);
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(DeviceError::kMissing));
  EXPECT_EQ(DeviceRoot::open(outside() + "/secret", false, &error), nullptr);
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(DeviceError::kNotOurs));
  if (::geteuid() == 0) {
    fs::create_directory(outside() + "/foreign");
    ASSERT_EQ(::chown((outside() + "/foreign").c_str(), 1, 1), 0);
    EXPECT_EQ(DeviceRoot::open(outside() + "/foreign", false, &error), nullptr);
    EXPECT_EQ(error->code(), static_cast<std::int64_t>(DeviceError::kNotOurs));
  }
}

TEST_F(DeviceRootTest, ErrorsNameObjectAndSystemError) {
  const ErrorPtr full = systemError("cannot write", "/a\n", ENOSPC);
  EXPECT_EQ(full->code(), static_cast<std::int64_t>(DeviceError::kNoSpace));
  EXPECT_EQ(full->userInfo()["errno"], Value::integer(ENOSPC));
  EXPECT_EQ(full->message().find('\n'), std::string::npos);
  EXPECT_EQ(systemError("cannot write", "/a", EIO)->code(),
            static_cast<std::int64_t>(DeviceError::kIo));
}

}  // namespace
}  // namespace kx
