#include "host/HostFiles.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "host/HostImageReader.h"
#include "tests/host/SamplePhotos.h"

namespace kx {
namespace {

using namespace test;

using Opener = int (*)(int, const std::string&, int, FileHandle*);

class OpenBeneath : public ::testing::TestWithParam<Opener> {
 protected:
  OpenBeneath() {
    folder_.write("top", "1");
    folder_.write("a/b/deep", "2");
    outside_.write("secret", "3");
    EXPECT_EQ(::symlink(outside_.path().c_str(), folder_.at("a/out").c_str()), 0);
    EXPECT_EQ(::symlink("deep", folder_.at("a/b/near").c_str()), 0);
    EXPECT_EQ(openFolder(folder_.path(), &handle_), 0);
  }

  int open(const std::string& path) const {
    FileHandle file;
    return GetParam()(handle_.get(), path, O_RDONLY, &file);
  }

  TemporaryFolder folder_;
  TemporaryFolder outside_;
  FileHandle handle_;
};

TEST_P(OpenBeneath, OpensWhatLiesBelow) {
  EXPECT_EQ(open(""), 0);
  EXPECT_EQ(open("top"), 0);
  EXPECT_EQ(open("a/b/deep"), 0);
  EXPECT_EQ(open("a/b"), 0);
  EXPECT_EQ(open("a/none"), ENOENT);
  EXPECT_EQ(open("top/x"), ENOTDIR);
}

TEST_P(OpenBeneath, NeverLeavesTheFolder) {
  for (const std::string& path : {std::string("../") + outside_.path(), std::string(".."),
                                  outside_.at("secret"), std::string("/etc/passwd")})
    EXPECT_EQ(open(path), EXDEV) << path;
  // A component that is a link is refused, whether it stands first or last.
  EXPECT_NE(open("a/out/secret"), 0);
  EXPECT_EQ(open("a/b/near"), ELOOP);
}

INSTANTIATE_TEST_SUITE_P(BothWays, OpenBeneath,
                         ::testing::Values(&openBeneath, &openBeneathByComponents));

TEST(HostFiles, OneComponent) {
  EXPECT_TRUE(isOneComponent("a"));
  EXPECT_TRUE(isOneComponent("..."));
  EXPECT_TRUE(isOneComponent(std::string(255, 'a')));
  for (const std::string& name :
       {std::string(), std::string("."), std::string(".."), std::string("a/b"),
        std::string("a\0b", 3), std::string(256, 'a')})
    EXPECT_FALSE(isOneComponent(name)) << name;
}

TEST(HostFiles, WholeFilesAreReadUpToTheLimit) {
  const TemporaryFolder folder;
  folder.write("a", "12345");
  FileHandle handle;
  FileHandle file;
  ASSERT_EQ(openFolder(folder.path(), &handle), 0);
  ASSERT_EQ(openBeneath(handle.get(), "a", O_RDONLY, &file), 0);
  std::vector<std::uint8_t> bytes;
  EXPECT_EQ(readWhole(file.get(), 5, &bytes), 0);
  EXPECT_EQ(std::string(bytes.begin(), bytes.end()), "12345");
  EXPECT_EQ(readWhole(file.get(), 4, &bytes), EFBIG);
}

TEST(HostImageReader, ReadsWhatASnapshotCarries) {
  const TemporaryFolder folder;
  folder.write("a.jpg", photoTaken("2024:05:31 10:00:00"));
  folder.write("film.mov", std::string("\0\0\0\x08wide", 8));
  folder.write("notes.txt", "no photo");
  HostImageReader reader;
  const ImageReader::Source source = reader.open(folder.at("a.jpg"));
  EXPECT_TRUE(source.isImage);
  EXPECT_EQ(source.typeIdentifier, "image/jpeg");
  EXPECT_EQ(source.properties["Exif"]["Exif.Photo.DateTimeOriginal"].stringValue(),
            "2024:05:31 10:00:00");
  const Value asset = assetNamed(rootOf(*openHost(folder.path())), "a.jpg");
  EXPECT_EQ(asset["assetProperties"]["imageProperties"], source.properties);
  EXPECT_EQ(asset["assetProperties"]["fileProperties"], reader.fileAttributes(folder.at("a.jpg")));
  EXPECT_FALSE(reader.open(folder.at("film.mov")).isImage);
  EXPECT_FALSE(reader.open(folder.at("notes.txt")).isImage);
  EXPECT_FALSE(reader.open(folder.at("none")).isImage);
  EXPECT_TRUE(reader.fileAttributes(folder.at("none")).isNull());
}

}  // namespace
}  // namespace kx
