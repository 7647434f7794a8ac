#include "host/FaceRegions.h"

#include <gtest/gtest.h>

#include <array>

#include "host/HostLimits.h"
#include "tests/host/SamplePhotos.h"

namespace kx {
namespace {

using test::SampleRegion;
using test::SampleRegions;

std::vector<FaceRegion> facesOf(const SampleRegions& sample, const StoredPicture& picture) {
  Exiv2::XmpData xmp;
  test::addRegions(sample, &xmp);
  return faceRegions(xmp, picture);
}

void expectRect(const Rect& rect, const Rect& expected, const std::string& what) {
  EXPECT_NEAR(rect.x, expected.x, 1e-9) << what;
  EXPECT_NEAR(rect.y, expected.y, 1e-9) << what;
  EXPECT_NEAR(rect.width, expected.width, 1e-9) << what;
  EXPECT_NEAR(rect.height, expected.height, 1e-9) << what;
}

// The point of the displayed picture at which a point of the stored one appears.
std::array<double, 2> displayed(double x, double y, int orientation) {
  switch (orientation) {
    case 2:
      return {1 - x, y};
    case 3:
      return {1 - x, 1 - y};
    case 4:
      return {x, 1 - y};
    case 5:
      return {y, x};
    case 6:
      return {1 - y, x};
    case 7:
      return {1 - y, 1 - x};
    case 8:
      return {y, 1 - x};
    default:
      return {x, y};
  }
}

TEST(FaceRegions, RectanglesAreTurnedBackForAllEightOrientations) {
  const Rect stored{0.1, 0.2, 0.3, 0.05};
  for (int orientation = 1; orientation <= 8; ++orientation) {
    const auto a = displayed(stored.x, stored.y, orientation);
    const auto b = displayed(stored.x + stored.width, stored.y + stored.height, orientation);
    const Rect shown{std::min(a[0], b[0]), std::min(a[1], b[1]), std::abs(a[0] - b[0]),
                     std::abs(a[1] - b[1])};
    expectRect(storedRect(shown, orientation), stored, std::to_string(orientation));
  }
}

// What a region of the stored picture and one of the displayed picture become.
TEST(FaceRegions, BoxesAreInStoredSpaceForAllEightOrientations) {
  for (int orientation = 1; orientation <= 8; ++orientation) {
    const StoredPicture picture{400, 300, orientation};
    const SampleRegions sample{400, 300, {{"Ada", "Face", 0.25, 0.3, 0.1, 0.2}}};
    const std::vector<FaceRegion> faces = facesOf(sample, picture);
    ASSERT_EQ(faces.size(), 1U);
    expectRect(faces[0].rect, {0.2, 0.2, 0.1, 0.2}, std::to_string(orientation));
  }
}

TEST(FaceRegions, RegionsMadeForTheTurnedPictureAreTurnedBack) {
  // Stored centre (0.25, 0.3), size 0.1 by 0.2, as each orientation displays it.
  for (int orientation = 5; orientation <= 8; ++orientation) {
    const auto centre = displayed(0.25, 0.3, orientation);
    const SampleRegions sample{300, 400, {{"Ada", "Face", centre[0], centre[1], 0.2, 0.1}}};
    const std::vector<FaceRegion> faces = facesOf(sample, {400, 300, orientation});
    ASSERT_EQ(faces.size(), 1U);
    expectRect(faces[0].rect, {0.2, 0.2, 0.1, 0.2}, std::to_string(orientation));
  }
}

TEST(FaceRegions, OnlyFacesAreTakenNamedOrNot) {
  const std::vector<FaceRegion> faces = facesOf({400,
                                                 300,
                                                 {{"Rex", "Pet", 0.5, 0.5, 0.1, 0.1},
                                                  {"Ada", "Face", 0.5, 0.5, 0.1, 0.1},
                                                  {"", "Face", 0.2, 0.2, 0.1, 0.1},
                                                  {"", "Focus", 0.2, 0.2, 0.1, 0.1}}},
                                                {400, 300, 1});
  ASSERT_EQ(faces.size(), 2U);
  EXPECT_EQ(faces[0].name, "Ada");
  EXPECT_EQ(faces[1].name, "");
}

TEST(FaceRegions, AreasAreCutAtTheEdgeAndEmptyOnesLeftOut) {
  const std::vector<FaceRegion> faces = facesOf({400,
                                                 300,
                                                 {{"edge", "Face", 0.0, 1.0, 0.2, 0.2},
                                                  {"outside", "Face", 2.0, 2.0, 0.1, 0.1},
                                                  {"empty", "Face", 0.5, 0.5, 0.0, 0.1},
                                                  {"negative", "Face", 0.5, 0.5, -0.1, 0.1}}},
                                                {400, 300, 1});
  ASSERT_EQ(faces.size(), 1U);
  expectRect(faces[0].rect, {0.0, 0.9, 0.1, 0.1}, "edge");
}

TEST(FaceRegions, PixelAreasAreSharesOfTheirDimensions) {
  SampleRegions sample{400, 200, {{"Ada", "Face", 100, 50, 40, 20}}, "pixel"};
  const std::vector<FaceRegion> faces = facesOf(sample, {400, 200, 1});
  ASSERT_EQ(faces.size(), 1U);
  expectRect(faces[0].rect, {0.2, 0.2, 0.1, 0.1}, "pixel");
  sample.unit = "furlong";
  EXPECT_TRUE(facesOf(sample, {400, 200, 1}).empty());
}

TEST(FaceRegions, NumbersThatAreNotFiniteMakeNoFace) {
  Exiv2::XmpData xmp;
  test::addRegions({400, 300, {{"Ada", "Face", 0.5, 0.5, 0.1, 0.1}}}, &xmp);
  for (const char* text : {"nan", "inf", "1e999", ""}) {
    xmp["Xmp.mwg-rs.Regions/mwg-rs:RegionList[1]/mwg-rs:Area/stArea:w"] = text;
    EXPECT_TRUE(faceRegions(xmp, {400, 300, 1}).empty()) << text;
  }
}

TEST(FaceRegions, NoMoreThanTheLimitAreTaken) {
  SampleRegions sample{400, 300, {}};
  for (std::size_t i = 0; i < hostlimits::kFacesPerPhoto + 1; ++i)
    sample.regions.push_back({"Ada", "Face", 0.5, 0.5, 0.1, 0.1});
  EXPECT_EQ(facesOf(sample, {400, 300, 1}).size(), hostlimits::kFacesPerPhoto);
}

}  // namespace
}  // namespace kx
