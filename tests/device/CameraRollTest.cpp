#include "device/CameraRoll.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <random>

#include "device/CameraMetadata.h"
#include "device/DeviceFileSystem.h"
#include "tests/device/CameraFiles.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

constexpr const char* kFolder = "/var/mobile/Media/DCIM/100CAMRA/";
// 2020-01-02 03:04:05 UTC, since 2001-01-01.
constexpr double kTaken = 599627045.0;

using Texts = std::vector<std::string>;

CameraMetadata exifOf(const std::string& content) {
  return readExif({reinterpret_cast<const std::uint8_t*>(content.data()), content.size()});
}

TEST(CameraMetadataTest, ReadsTimeAndPlaceInBothByteOrders) {
  for (const bool little : {true, false}) {
    const std::string tiff = cameraTiff({"2020:01:02 03:04:05", "", 48.5, -11.25}, little);
    for (const std::string& content : {tiff, cameraJpeg(tiff),
                                       "\0\0\0\x18"
                                       "ftypheic" +
                                           std::string("Exif\0\0", 6) + tiff}) {
      const CameraMetadata metadata = exifOf(content);
      ASSERT_TRUE(metadata.captured.has_value());
      EXPECT_EQ(metadata.captured->secondsSinceReference, kTaken);
      EXPECT_EQ(metadata.place, (Coordinate{48.5, -11.25}));
    }
  }
}

TEST(CameraMetadataTest, TakesTheOffsetIntoAccount) {
  EXPECT_EQ(exifOf(cameraTiff({"2020:01:02 03:04:05", "+02:00", {}, {}}, true))
                .captured->secondsSinceReference,
            kTaken - 7200.0);
  EXPECT_EQ(exifOf(cameraTiff({"2020:01:02 03:04:05", "-00:30", {}, {}}, true))
                .captured->secondsSinceReference,
            kTaken + 1800.0);
}

TEST(CameraMetadataTest, LeavesOutWhatMakesNoSense) {
  for (const char* time : {"0000:00:00 00:00:00", "2020:13:02 03:04:05", "2020:01:32 03:04:05",
                           "2020:01:02 24:04:05", "    :  :     :  :  ", "2020:01:02"}) {
    EXPECT_FALSE(exifOf(cameraTiff({time, "", {}, {}}, true)).captured.has_value()) << time;
  }
  EXPECT_FALSE(exifOf(cameraTiff({"", "", 0.0, 0.0}, true)).place.has_value());
  EXPECT_FALSE(exifOf(cameraTiff({"", "", 91.0, 0.0}, true)).place.has_value());
  EXPECT_FALSE(exifOf("").captured.has_value());
  EXPECT_FALSE(exifOf(std::string("Exif\0\0II*\0\xff\xff\xff\xff", 14)).captured.has_value());
}

TEST(CameraMetadataTest, StandsAnyBytes) {
  const auto seed = std::random_device()();
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937 random(seed);
  const std::string whole =
      cameraJpeg(cameraTiff({"2020:01:02 03:04:05", "+02:00", 48.5, 11.25}, true));
  std::size_t read = 0;
  for (int round = 0; round < 20000; ++round) {
    std::string content = whole.substr(0, 1 + random() % whole.size());
    for (int changes = static_cast<int>(random() % 4); changes > 0; --changes) {
      content[random() % content.size()] = static_cast<char>(random());
    }
    const CameraMetadata metadata = exifOf(content);
    if (metadata.captured) ++read;
    if (metadata.place) {
      EXPECT_LE(std::abs(metadata.place->latitude), 90.0);
      EXPECT_LE(std::abs(metadata.place->longitude), 180.0);
    }
  }
  EXPECT_GT(read, 0U);
}

TEST(CameraMetadataTest, StandsAnyFilm) {
  const auto seed = std::random_device()();
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937 random(seed);
  const std::string whole = cameraFilm(3660771845U, "+10.5000-020.2500/");
  const UniqueFd file(::memfd_create("film", MFD_CLOEXEC));
  ASSERT_TRUE(file);
  std::size_t read = 0;
  for (int round = 0; round < 5000; ++round) {
    std::string content = whole.substr(0, 1 + random() % whole.size());
    if (round % 2 == 0) content = whole;
    for (int changes = static_cast<int>(random() % 4); changes > 0; --changes) {
      content[random() % content.size()] = static_cast<char>(random());
    }
    ASSERT_EQ(::ftruncate(file.get(), 0), 0);
    ASSERT_EQ(::pwrite(file.get(), content.data(), content.size(), 0),
              static_cast<ssize_t>(content.size()));
    const CameraMetadata metadata = readFilmHeader(file.get(), content.size());
    if (metadata.captured) ++read;
    if (metadata.place) {
      EXPECT_LE(std::abs(metadata.place->latitude), 90.0);
      EXPECT_LE(std::abs(metadata.place->longitude), 180.0);
    }
  }
  EXPECT_GT(read, 0U);
}

class CameraRollTest : public DeviceTest {
 protected:
  std::vector<CameraAsset> find(const std::unordered_set<std::string>& known = {}) {
    const DeviceLog log(logs_.sinks());
    return findCameraAssets(device().root(), platform().files(), known, log);
  }
  void put(const std::string& name, const std::string& bytes) {
    putFile(kFolder + name, bytes);
    const struct timespec time = {1'000'000'000, 500'000'000};
    const struct timespec times[2] = {time, time};
    ASSERT_EQ(::utimensat(AT_FDCWD, at(kFolder + name).c_str(), times, 0), 0);
  }
  static Texts names(const CameraAsset& asset) {
    Texts all;
    for (const CameraAsset::File& file : asset.files) {
      all.push_back(file.path.substr(std::string(kFolder).size()));
    }
    return all;
  }
};

TEST_F(CameraRollTest, AStillAndAFilmOfOneNameAreOneAsset) {
  put("IMG_0001.JPG", cameraJpeg(cameraTiff({"2020:01:02 03:04:05", "", 48.5, 11.25}, true)));
  put("IMG_0001.MOV", cameraFilm(3660771845U, "+10.0000+020.0000/"));
  put("IMG_0001.AAE", "edits");
  put("IMG_0002.MOV", cameraFilm(3660771845U, "+10.5000-020.2500/"));
  put("IMG_0003.DNG", cameraTiff({"2020:01:02 03:04:06", "", {}, {}}, false));
  const std::vector<CameraAsset> found = find();
  ASSERT_EQ(found.size(), 3U);
  EXPECT_EQ(names(found[0]), (Texts{"IMG_0001.JPG", "IMG_0001.MOV", "IMG_0001.AAE"}));
  EXPECT_FALSE(found[0].isVideo);
  EXPECT_EQ(found[0].creationDate->secondsSinceReference, kTaken);
  EXPECT_EQ(found[0].place, (Coordinate{48.5, 11.25}));
  EXPECT_EQ(found[0].modificationDate->secondsSinceReference, 21692800.5);
  EXPECT_EQ(names(found[1]), (Texts{"IMG_0002.MOV"}));
  EXPECT_TRUE(found[1].isVideo);
  EXPECT_EQ(found[1].creationDate->secondsSinceReference, 599619845.0);
  EXPECT_EQ(found[1].place, (Coordinate{10.5, -20.25}));
  EXPECT_EQ(found[2].creationDate->secondsSinceReference, kTaken + 1.0);
}

TEST_F(CameraRollTest, WhatCannotBeParsedHasItsFilesTime) {
  put("IMG_0001.JPG", "no picture at all");
  put("IMG_0002.MP4", "no film at all");
  put("IMG_0003.JPG", kJpeg);
  const std::vector<CameraAsset> found = find();
  ASSERT_EQ(found.size(), 3U);
  EXPECT_FALSE(found[0].isVideo);
  EXPECT_TRUE(found[1].isVideo);
  for (const CameraAsset& asset : found) {
    EXPECT_EQ(asset.creationDate->secondsSinceReference, 21692800.5);
    EXPECT_EQ(asset.place, std::nullopt);
  }
}

TEST_F(CameraRollTest, PassesOverWhatIsNoPhotoOfTheCamera) {
  put("IMG_0001.JPG", kJpeg);
  put(".hidden.JPG", kJpeg);
  put(".MISC/IMG_0002.JPG", kJpeg);
  put("A.MISC/IMG_0003.JPG", kJpeg);
  put("notes.TXT", "text");
  put("IMG_0009.AAE", "edits");
  put("IMG_0008.JPG", "");
  std::filesystem::create_symlink("/etc/passwd", at(std::string(kFolder) + "IMG_0004.JPG"));
  ASSERT_EQ(::mkfifo(at(std::string(kFolder) + "IMG_0005.JPG").c_str(), 0600), 0);
  put("IMG_0006.JPG", kJpeg);
  const std::vector<CameraAsset> found = find({std::string(kFolder) + "IMG_0006.JPG"});
  ASSERT_EQ(found.size(), 1U);
  EXPECT_EQ(names(found[0]), (Texts{"IMG_0001.JPG"}));
}

}  // namespace
}  // namespace kx
