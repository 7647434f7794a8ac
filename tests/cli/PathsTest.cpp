#include "cli/Paths.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>

#include "cli/Command.h"
#include "cli/HostOpening.h"

namespace kx::cli {
namespace {

namespace fs = std::filesystem;

class PathsTest : public testing::Test {
 protected:
  PathsTest() {
    std::string name = (fs::temp_directory_path() / "kxsync-paths-XXXXXX").string();
    top_ = fs::canonical(::mkdtemp(name.data()));
    fs::create_directories(top_ / "photos" / "2020");
  }
  ~PathsTest() override { fs::remove_all(top_); }

  std::string refusal(const fs::path& host, const fs::path& device) {
    const std::string hostText = host.string();
    const std::string deviceText = device.string();
    try {
      refuseNesting({"HOST", hostText}, {"DEVICE", deviceText});
    } catch (const UsageError& error) {
      return error.what();
    }
    return "";
  }

  fs::path top_;
};

TEST_F(PathsTest, SiblingsAreFine) {
  EXPECT_EQ(refusal(top_ / "photos", top_ / "device"), "");
  EXPECT_EQ(refusal(top_ / "photos", top_ / "photos-device"), "")
      << "a common prefix is no nesting";
}

TEST_F(PathsTest, NestingIsRefusedEitherWay) {
  EXPECT_EQ(refusal(top_ / "photos", top_ / "photos" / "device"),
            "DEVICE lies inside HOST: " + (top_ / "photos" / "device").string());
  EXPECT_EQ(refusal(top_ / "photos" / "2020", top_ / "photos"),
            "HOST lies inside DEVICE: " + (top_ / "photos" / "2020").string());
  EXPECT_EQ(refusal(top_ / "photos", top_ / "photos"),
            "HOST and DEVICE are the same directory: " + (top_ / "photos").string());
}

TEST_F(PathsTest, LinksDotsAndSlashesHideNothing) {
  fs::create_directory_symlink(top_ / "photos", top_ / "link");
  EXPECT_NE(refusal(top_ / "photos", top_ / "link" / "device"), "");
  EXPECT_NE(refusal(top_ / "photos", (top_ / "photos").string() + "/"), "");
  EXPECT_NE(refusal(top_ / "photos", top_ / "photos" / "2020" / ".." / "device"), "");
  EXPECT_EQ(refusal(top_ / "photos", top_ / "photos" / ".." / "device"), "");
}

TEST(TimezoneTest, OffsetsAreReadInMinutes) {
  EXPECT_EQ(timezoneMinutes(""), 0);
  EXPECT_EQ(timezoneMinutes("UTC"), 0);
  EXPECT_EQ(timezoneMinutes("Z"), 0);
  EXPECT_EQ(timezoneMinutes("+2"), 120);
  EXPECT_EQ(timezoneMinutes("+02:00"), 120);
  EXPECT_EQ(timezoneMinutes("-0530"), -330);
  EXPECT_EQ(timezoneMinutes("+14:00"), 840);
}

TEST(TimezoneTest, AnythingElseIsWrongUsage) {
  for (const char* text : {"2", "+", "+15", "+14:01", "+02:60", "+2:0", "CEST", " +2", "+02:00x"}) {
    EXPECT_THROW(timezoneMinutes(text), UsageError) << text;
  }
}

}  // namespace
}  // namespace kx::cli
