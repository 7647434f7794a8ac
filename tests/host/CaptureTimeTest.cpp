#include "host/CaptureTime.h"

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "tests/host/SamplePhotos.h"

namespace kx {
namespace {

using test::hostTime;

// 2024-05-31 23:30:15 UTC, since 1970.
constexpr double kMoment = 1'717'198'215;

TEST(CaptureTime, ExifTimesCountFromTheirOffset) {
  const auto inUtc = exifTime("2024:05:31 23:30:15", "", "");
  ASSERT_TRUE(inUtc.has_value());
  EXPECT_FALSE(inUtc->offsetMinutes.has_value());
  EXPECT_EQ(inUtc->hostSeconds(0), hostTime(kMoment));
  EXPECT_EQ(inUtc->hostSeconds(120), hostTime(kMoment - 7200));

  const auto withOffset = exifTime("2024:05:31 23:30:15", "250", "-05:30");
  ASSERT_TRUE(withOffset.has_value());
  EXPECT_EQ(withOffset->offsetMinutes, -330);
  EXPECT_EQ(withOffset->hostSeconds(120), hostTime(kMoment + 330 * 60) + 0.25);
  EXPECT_EQ(withOffset->isoDay(), "2024-05-31");
}

TEST(CaptureTime, SubSecondsAreAShareOfASecond) {
  const auto fraction = [](const char* digits) {
    return exifTime("2024:05:31 23:30:15", digits, "")->fraction;
  };
  EXPECT_EQ(fraction("5"), 0.5);
  EXPECT_EQ(fraction("05 "), 0.05);
  EXPECT_EQ(fraction("999"), 0.999);
  EXPECT_EQ(fraction(""), 0.0);
  EXPECT_EQ(fraction("abc"), 0.0);
  EXPECT_EQ(fraction("-1"), 0.0);
  EXPECT_LT(fraction("9999999999999999999999"), 1.0);
}

TEST(CaptureTime, TextThatIsNoTimeIsNone) {
  for (const char* text : {"", "    :  :     :  :  ", "0000:00:00 00:00:00", "2024:13:01 00:00:00",
                           "2023:02:29 10:00:00", "2024:05:31 24:00:00", "2024:05:31 23:60:00",
                           "2024:05:31", "yesterday", "2024:05:31 23:30:61", "24:05:31 23:30:15"})
    EXPECT_FALSE(exifTime(text, "", "").has_value()) << text;
}

TEST(CaptureTime, OtherCamerasFormsAreRead) {
  for (const char* text : {"2024-05-31 23:30:15", "2024:05:31T23:30:15", "2024/05/31 23:30:15",
                           "2024:05:31 23:30:15\0"})
    EXPECT_EQ(exifTime(text, "", "")->hostSeconds(0), hostTime(kMoment)) << text;
  EXPECT_EQ(exifTime("2016:12:31 23:59:60", "", "")->wallSeconds % 60, 59);
}

TEST(CaptureTime, IsoTimesKnowTheirOffset) {
  EXPECT_EQ(isoTime("2024-05-31T23:30:15.25+02:00")->hostSeconds(0),
            hostTime(kMoment - 7200) + 0.25);
  EXPECT_EQ(isoTime("2024-05-31T23:30:15Z")->hostSeconds(60), hostTime(kMoment));
  EXPECT_EQ(isoTime("2024-05-31T23:30:15+0200")->hostSeconds(0), hostTime(kMoment - 7200));
  EXPECT_EQ(isoTime("2024-05-31T23:30")->hostSeconds(0), hostTime(kMoment - 15));
  EXPECT_EQ(isoTime("2024-05-31")->isoDay(), "2024-05-31");
  for (const char* text : {"2024", "2024-05", "2024-05-31T", "2024-05-31T23", "2024-02-30",
                           "2024-05-31T23:30:15+99:00", "2024-05-31T23:30:15 GMT"})
    EXPECT_FALSE(isoTime(text).has_value()) << text;
}

TEST(CaptureTime, OffsetsStayWithinTheGlobe) {
  EXPECT_EQ(parseOffset("+14:00"), 840);
  EXPECT_EQ(parseOffset("-03"), -180);
  EXPECT_EQ(parseOffset("Z"), 0);
  for (const char* text : {"", "+", "+14:01", "05:00", "+5:00", "+05:60", "+05:00x", "   :  "})
    EXPECT_FALSE(parseOffset(text).has_value()) << text;
}

TEST(CaptureTime, TheDayIsTheWallsDayNotUtcs) {
  EXPECT_EQ(exifTime("2024:06:01 00:30:00", "", "+02:00")->isoDay(), "2024-06-01");
  EXPECT_EQ(wallTimeOf(1'717'198'215, 60).isoDay(), "2024-06-01");
  EXPECT_EQ(wallTimeOf(1'717'198'215, 0).isoDay(), "2024-05-31");
  EXPECT_EQ(wallTimeOf(-1, 0).isoDay(), "1969-12-31");
  EXPECT_EQ(exifTime("0001:01:01 00:00:00", "", "")->isoDay(), "0001-01-01");
}

TEST(CaptureTime, FileTimesKeepTheirNanosecondsAsFarAsARealNumberGoes) {
  EXPECT_EQ(hostSecondsOf(0, 0), 2'082'844'800.0);
  EXPECT_EQ(hostSecondsOf(0, 500'000'000), 2'082'844'800.5);
  EXPECT_LT(hostSecondsOf(1'717'198'215, 1'000), hostSecondsOf(1'717'198'215, 2'000));
}

}  // namespace
}  // namespace kx
