#include "host/MetadataText.h"

#include <gtest/gtest.h>

#include <cmath>

#include "host/HostLimits.h"
#include "host/XmpGuard.h"
#include "tests/host/SamplePhotos.h"

namespace kx {
namespace {

TEST(MetadataText, IsTrimmedAndInUtf8) {
  EXPECT_EQ(cleanText("  a b \r\n"), "a b");
  EXPECT_EQ(cleanText(std::string_view("a\0b", 3)), "a");
  EXPECT_EQ(cleanText("   "), "");
  EXPECT_EQ(cleanText("Z\xC3\xBCrich"), "Z\xC3\xBCrich");
  EXPECT_EQ(cleanText("Z\xFCrich"), "Z\xC3\xBCrich");
}

TEST(MetadataText, IsCutAtACharacter) {
  const std::size_t limit = hostlimits::kTextBytes;
  EXPECT_EQ(cleanText(std::string(limit, 'a')).size(), limit);
  EXPECT_EQ(cleanText(std::string(limit + 1, 'a')).size(), limit);
  EXPECT_EQ(cleanText(std::string(limit - 1, 'a') + "\xC3\xBC").size(), limit - 1);
}

TEST(MetadataText, NumbersAreFinite) {
  EXPECT_EQ(finiteNumber(" 5 "), 5.0);
  EXPECT_EQ(finiteNumber("+0.25"), 0.25);
  EXPECT_EQ(finiteNumber("1/4"), 0.25);
  EXPECT_EQ(finiteNumber("-3"), -3.0);
  for (const char* text : {"", "x", "nan", "inf", "1e999", "1/0", "5x", "1/2/3"})
    EXPECT_FALSE(finiteNumber(text).has_value()) << text;
}

TEST(MetadataText, PlacesOfXmp) {
  EXPECT_DOUBLE_EQ(*xmpDegrees("46,34.65N"), 46.5775);
  EXPECT_DOUBLE_EQ(*xmpDegrees("46,34,39S"), -46.5775);
  EXPECT_DOUBLE_EQ(*xmpDegrees("7W"), -7.0);
  for (const char* text : {"", "N", "46,34.65", "-46,1N", "1,2,3,4N", "46;1N", "nanN"})
    EXPECT_FALSE(xmpDegrees(text).has_value()) << text;
}

TEST(MetadataText, PlacesOfMovies) {
  const auto place = iso6709("+46.5775-007.9856+1200.000/");
  ASSERT_TRUE(place.has_value());
  EXPECT_DOUBLE_EQ(place->latitude, 46.5775);
  EXPECT_DOUBLE_EQ(place->longitude, -7.9856);
  for (const char* text : {"", "46.5-7.9/", "+91-007/", "+46/", "+46 -7"})
    EXPECT_FALSE(iso6709(text).has_value()) << text;
}

TEST(MetadataText, PlacesLieOnTheGlobe) {
  EXPECT_TRUE(validPlace(90.0, -180.0).has_value());
  EXPECT_FALSE(validPlace(90.1, 0.0).has_value());
  EXPECT_FALSE(validPlace(0.0, 180.1).has_value());
  EXPECT_FALSE(validPlace(std::nullopt, 1.0).has_value());
  EXPECT_FALSE(validPlace(std::nan(""), 1.0).has_value());
}

TEST(MetadataText, NamesBecomeUtf8WithoutLosingBytes) {
  EXPECT_EQ(nameText("a\nb"), "a\nb");
  EXPECT_EQ(nameText("u\xCC\x88"), "u\xCC\x88");  // decomposed, and left so
  EXPECT_EQ(nameText("a\xFF\xC3\xBC\xC3"), "a\\xFF\xC3\xBC\\xC3");
}

TEST(XmpGuard, LetsOrdinaryPacketsPass) {
  EXPECT_EQ(xmpObjection(""), "");
  EXPECT_EQ(xmpObjection(std::string(8, '\0')), "");
  EXPECT_EQ(xmpObjection("<?xpacket begin=''?>" + test::xmpPacket("xmp:Rating=\"5\"") +
                         "<!-- <!ENTITY --> <![CDATA[<!DOC]]> <?xpacket end='w'?>" +
                         std::string(3, '\0')),
            "");
}

TEST(XmpGuard, RefusesDeclarationsAndEntities) {
  const std::string expected = "its XMP has a document type declaration or entity";
  const std::string document = std::string("<!") + "DOCTYPE a>";
  EXPECT_EQ(xmpObjection(document + test::xmpPacket("")), expected);
  EXPECT_EQ(xmpObjection(test::xmpPacket("") + "<!ENTITY a 'b'>"), expected);
}

TEST(XmpGuard, BoundsNestingAndSize) {
  const auto nested = [](std::size_t depth) {
    std::string text;
    for (std::size_t i = 0; i < depth; ++i) text += "<a b='>'>";
    for (std::size_t i = 0; i < depth; ++i) text += "</a>";
    return text;
  };
  EXPECT_EQ(xmpObjection(nested(hostlimits::kXmpDepth)), "");
  EXPECT_EQ(xmpObjection(nested(hostlimits::kXmpDepth + 1)), "its XMP is nested too deeply");
  EXPECT_EQ(xmpObjection(nested(100'000)), "its XMP is nested too deeply");
  EXPECT_EQ(xmpObjection(std::string(hostlimits::kXmpBytes, ' ')), "");
  EXPECT_EQ(xmpObjection(std::string(hostlimits::kXmpBytes + 1, ' ')), "its XMP is too large");
  // Many siblings are no nesting.
  std::string siblings = "<r>";
  for (int i = 0; i < 1000; ++i) siblings += "<a/><b></b>";
  EXPECT_EQ(xmpObjection(siblings + "</r>"), "");
}

TEST(XmpGuard, RefusesOtherEncodings) {
  EXPECT_EQ(xmpObjection("<a>\xFF</a>"), "its XMP is not in UTF-8");
  EXPECT_EQ(xmpObjection(std::string_view("<\0a\0>\0", 6)), "its XMP is not in UTF-8");
}

}  // namespace
}  // namespace kx
