#include "host/MetadataBlocks.h"

#include <gtest/gtest.h>

#include <exiv2/exiv2.hpp>

#include "host/PhotoMetadata.h"
#include "tests/host/SamplePhotos.h"

namespace kx {
namespace {

std::string big(std::uint64_t value, int bytes) {
  std::string text;
  for (int shift = 8 * (bytes - 1); shift >= 0; shift -= 8)
    text.push_back(static_cast<char>(value >> shift & 0xFF));
  return text;
}

std::string little(std::uint64_t value, int bytes) {
  const std::string text = big(value, bytes);
  return {text.rbegin(), text.rend()};
}

std::string box(const std::string& type, const std::string& body) {
  return big(8 + body.size(), 4) + type + body;
}

std::string segment(char marker, const std::string& body) {
  return std::string("\xFF") + marker + big(body.size() + 2, 2) + body;
}

std::string jpegWith(const std::string& segments) {
  const std::string plain = test::jpeg();
  return plain.substr(0, 2) + segments + plain.substr(2);
}

std::string jpegWithTiff(const std::string& tiff) {
  return jpegWith(segment('\xE1', std::string("Exif\0\0", 6) + tiff));
}

// One tag of a little-endian TIFF.
std::string tag(unsigned number, unsigned type, std::uint32_t count, std::uint32_t value) {
  return little(number, 2) + little(type, 2) + little(count, 4) + little(value, 4);
}

std::string tiffHeader(std::uint32_t firstDirectory) {
  return std::string("II*\0", 4) + little(firstDirectory, 4);
}

std::string directory(const std::vector<std::string>& tags, std::uint32_t next = 0) {
  std::string text = little(tags.size(), 2);
  for (const std::string& one : tags) text += one;
  return text + little(next, 4);
}

// The Exif block of a photo taken at that time.
std::string tiffTaken(const std::string& time) {
  const std::string photo = test::photoTaken(time);
  const std::size_t start = photo.find(std::string("Exif\0\0", 6)) + 6;
  return photo.substr(start, photo.find("\xFF\xC0") - start);
}

PhotoMetadata read(const std::string& bytes) {
  const std::span<const std::uint8_t> span(reinterpret_cast<const std::uint8_t*>(bytes.data()),
                                           bytes.size());
  const ByteSource source(span);
  return readPhotoMetadata(source, {contentTypeOf(span), std::nullopt, 0});
}

std::string dayOf(const PhotoMetadata& metadata) {
  return metadata.captureTime ? metadata.captureTime->isoDay() : "none";
}

// The metadata of a damaged file: none, and one word about why.
void expectRefused(const std::string& bytes, const std::string& problem) {
  const PhotoMetadata metadata = read(bytes);
  ASSERT_EQ(metadata.problems.size(), 1U) << problem;
  EXPECT_EQ(metadata.problems[0], problem);
  EXPECT_FALSE(metadata.captureTime.has_value());
  EXPECT_EQ(metadata.imageProperties["MQFileUTType"].isString(), true);
  EXPECT_EQ(metadata.imageProperties.dictionaryValue().size(), 1U);
}

TEST(MetadataBlocks, ExifIsFoundInEveryContainerThatHoldsIt) {
  const std::string tiff = tiffTaken("2024:05:31 10:00:00");
  EXPECT_EQ(dayOf(read(jpegWithTiff(tiff))), "2024-05-31");
  EXPECT_EQ(dayOf(read(tiff)), "2024-05-31");

  const auto chunk = [](const std::string& type, const std::string& body) {
    return big(body.size(), 4) + type + body + "crc!";
  };
  const std::string png = "\x89PNG\r\n\x1A\n" + chunk("IHDR", big(640, 4) + big(480, 4) + "12345") +
                          chunk("eXIf", tiff) + chunk("IEND", "");
  EXPECT_EQ(dayOf(read(png)), "2024-05-31");

  const std::string padded = tiff.size() % 2 == 0 ? tiff : tiff + '\0';
  const std::string webp = "RIFF" + little(100, 4) + "WEBP" + "VP8X" + little(10, 4) +
                           std::string(4, '\0') + little(639, 3) + little(479, 3) + "EXIF" +
                           little(tiff.size(), 4) + padded;
  EXPECT_EQ(dayOf(read(webp)), "2024-05-31");
}

TEST(MetadataBlocks, XmpIsFoundInPngAndWebP) {
  const std::string xmp = test::xmpPacket("xmp:Rating=\"4\"");
  const std::string png = "\x89PNG\r\n\x1A\n" + big(xmp.size() + 22, 4) + "iTXt" +
                          std::string("XML:com.adobe.xmp\0\0\0\0\0", 22) + xmp + "crc!" +
                          big(0, 4) + "IENDcrc!";
  EXPECT_EQ(read(png).rating, 4);
  const std::string webp = "RIFF" + little(100, 4) + "WEBPXMP " + little(xmp.size(), 4) + xmp;
  EXPECT_EQ(read(webp).rating, 4);
}

std::string heic(const std::string& tiff, std::uint32_t lengthError = 0) {
  const std::string item = big(0, 4) + tiff;
  const std::string infe =
      box("infe", big(2, 1) + big(0, 3) + big(1, 2) + big(0, 2) + "Exif" + std::string(1, '\0'));
  const std::string iinf = box("iinf", big(0, 4) + big(1, 2) + infe);
  const std::string ispe = box("ispe", big(0, 4) + big(400, 4) + big(300, 4));
  const std::string iprp = box("iprp", box("ipco", ispe));
  const auto meta = [&](std::uint64_t offset) {
    const std::string iloc =
        box("iloc", big(0, 4) + big(0x44, 1) + big(0, 1) + big(1, 2) + big(1, 2) + big(0, 2) +
                        big(1, 2) + big(offset, 4) + big(item.size() + lengthError, 4));
    return box("meta", big(0, 4) + iinf + iprp + iloc);
  };
  const std::string head = box("ftyp", "heic" + big(0, 4) + "mif1heic");
  const std::uint64_t offset = head.size() + meta(0).size() + 8;
  return head + meta(offset) + box("mdat", item);
}

TEST(MetadataBlocks, HeicItemsAreFoundByTheirLocation) {
  EXPECT_EQ(dayOf(read(heic(tiffTaken("2024:05:31 10:00:00")))), "2024-05-31");
  expectRefused(heic(tiffTaken("2024:05:31 10:00:00"), 1000), "it ends before its metadata does");
}

std::string movieWith(const std::string& inMovie) {
  return box("ftyp", "qt  " + big(0, 4)) + box("mdat", std::string(100'000, 'x')) +
         box("moov", inMovie);
}

TEST(MetadataBlocks, MoviesStateTimeAndPlace) {
  const std::string mvhd =
      box("mvhd", big(0, 4) + big(static_cast<std::uint64_t>(1'717'198'215LL + 2'082'844'800), 4));
  const std::string place = "+46.5775+007.9856/";
  const std::string udta =
      box("udta", box("\xA9xyz", big(place.size(), 2) + big(0x15C7, 2) + place));
  const PhotoMetadata metadata = read(movieWith(mvhd + udta));
  ASSERT_TRUE(metadata.captureTime.has_value());
  EXPECT_EQ(metadata.captureTime->hostSeconds(0), test::hostTime(1'717'198'215));
  ASSERT_TRUE(metadata.place.has_value());
  EXPECT_DOUBLE_EQ(metadata.place->longitude, 7.9856);
  EXPECT_TRUE(metadata.problems.empty());
}

TEST(MetadataBlocks, MovieKeysComeBeforeTheHeadersTime) {
  const std::string mvhd = box("mvhd", big(0, 4) + big(3'800'000'000, 4));
  const std::string key = "org.example.creationdate";
  const std::string keys = box("keys", big(0, 4) + big(1, 4) + box("mdta", key));
  const std::string item =
      box(big(1, 4), box("data", big(1, 4) + big(0, 4) + "2024-05-31T23:30:15+0200"));
  const std::string hdlr = box("hdlr", std::string(24, '\0'));
  const PhotoMetadata metadata =
      read(movieWith(mvhd + box("meta", hdlr + keys + box("ilst", item))));
  ASSERT_TRUE(metadata.captureTime.has_value());
  EXPECT_EQ(metadata.captureTime->hostSeconds(0), test::hostTime(1'717'198'215 - 7200));
}

TEST(MetadataBlocks, BoxesThatMakeNoSenseAreRefused) {
  const std::string head = box("ftyp", "isom" + big(0, 4));
  expectRefused(head + big(7, 4) + "moov", "it has a box of an impossible size");
  expectRefused(head + big(1, 4) + "moov" + big(~0ULL, 8), "it has a box of an impossible size");
  expectRefused(head + big(1, 4) + "moov" + big(15, 8), "it has a box of an impossible size");
  expectRefused(head + big(1, 4) + "moov", "it ends before its metadata does");
  expectRefused(head + big(100, 4) + "moov", "it has a box of an impossible size");
  // To the end of the file.
  EXPECT_TRUE(read(head + big(0, 4) + "moov").problems.empty());
}

TEST(MetadataBlocks, TooManyBoxesAreRefused) {
  std::string boxes;
  for (std::size_t i = 0; i < hostlimits::kBoxes; ++i) boxes += box("free", "");
  expectRefused(box("ftyp", "isom" + big(0, 4)) + boxes, "it has too many boxes");
  EXPECT_TRUE(read(box("ftyp", "isom" + big(0, 4)) + boxes.substr(8)).problems.empty());
}

TEST(MetadataBlocks, ExifDirectoriesThatLoopAreRefused) {
  const std::string loop = "its Exif directories form a loop";
  // The Exif pointer leads to the directory that holds it; then both pointers to one place.
  expectRefused(jpegWithTiff(tiffHeader(8) + directory({tag(0x8769, 4, 1, 8)})), loop);
  expectRefused(
      jpegWithTiff(tiffHeader(8) + directory({tag(0x8769, 4, 1, 38), tag(0x8825, 4, 1, 38)}) +
                   directory({})),
      loop);
}

TEST(MetadataBlocks, ExifCountsAndOffsetsPastTheEndAreRefused) {
  expectRefused(jpegWithTiff(tiffHeader(8) + little(65'535, 2)), "it has too many Exif tags");
  expectRefused(jpegWithTiff(tiffHeader(8) + little(9, 2)),
                "an Exif directory reaches past its end");
  expectRefused(jpegWithTiff(tiffHeader(4'000'000'000)), "it ends before its metadata does");
  expectRefused(jpegWithTiff("XX*"), "its Exif block has no byte order");
  expectRefused(jpegWithTiff("IIxx\x08" + std::string(3, '\0')), "its Exif block is no TIFF");
}

TEST(MetadataBlocks, AValueOutsideTheFileCostsThatValueAlone) {
  const PhotoMetadata metadata = read(jpegWithTiff(
      tiffHeader(8) + directory({tag(0x010F, 2, 100, 4'000'000'000), tag(0x0112, 3, 1, 6)})));
  ASSERT_EQ(metadata.problems.size(), 1U);
  EXPECT_EQ(metadata.problems[0], "an Exif value lies outside the file");
  EXPECT_EQ(metadata.imageProperties["Exif"]["Exif.Image.Orientation"].numberValue().int64Value(),
            6);
  EXPECT_TRUE(metadata.imageProperties["Exif"]["Exif.Image.Make"].isNull());
}

TEST(MetadataBlocks, LargeValuesAndMakerNotesAreLeftOut) {
  const std::uint32_t at = 8 + 2 + 2 * 12 + 4;
  const std::uint32_t size = hostlimits::kTiffValueBytes + 1;
  const std::string photo = jpegWithTiff(
      tiffHeader(8) + directory({tag(0x010E, 2, size, at), tag(0x0110, 2, 4, 0x41424344)}) +
      std::string(size, 'x'));
  const PhotoMetadata metadata = read(photo);
  EXPECT_TRUE(metadata.problems.empty());
  EXPECT_EQ(metadata.caption, "");
  EXPECT_EQ(metadata.imageProperties["Exif"]["Exif.Image.Model"].stringValue(), "DCBA");
}

TEST(MetadataBlocks, DamagedSegmentsAreRefused) {
  expectRefused(jpegWith(std::string("\xFF\xE1\x00\x01", 4)),
                "it has a segment of an impossible size");
  expectRefused(jpegWith(segment('\xFE', "comment") + "garbage"),
                "it is damaged between two segments");
  expectRefused(std::string("\xFF\xD8\xFF\xE1\x40\x00", 6), "it ends before its metadata does");
  std::string many;
  for (std::size_t i = 0; i <= hostlimits::kSegments; ++i) many += segment('\xFE', "");
  expectRefused(jpegWith(many), "it has too many segments");
}

TEST(MetadataBlocks, DamagedXmpIsRefusedAndTheRestKept) {
  const auto photo = [](const std::string& xmp) {
    const std::string header("http://ns.adobe.com/xap/1.0/\0", 29);
    return jpegWith(segment('\xE1', std::string("Exif\0\0", 6) + tiffTaken("2024:05:31 10:00:00")) +
                    segment('\xE1', header + xmp));
  };
  const std::string declaration = std::string("<!") + "DOCTYPE a>";
  for (const std::string& xmp : {std::string("<a"), declaration + test::xmpPacket(""),
                                 test::xmpPacket("xmp:Rating=\"5\"").substr(0, 300)}) {
    const PhotoMetadata metadata = read(photo(xmp));
    EXPECT_EQ(metadata.problems.size(), 1U) << xmp;
    EXPECT_EQ(dayOf(metadata), "2024-05-31");
    EXPECT_FALSE(metadata.rating.has_value());
  }
}

TEST(MetadataBlocks, EveryCutOfAPhotoIsSurvived) {
  const std::string photo = test::withMetadata(test::jpeg(), [](Exiv2::Image& image) {
    image.exifData()["Exif.Photo.DateTimeOriginal"] = "2024:05:31 10:00:00";
    image.xmpData()["Xmp.xmp.Rating"] = "5";
    image.iptcData()["Iptc.Application2.Caption"] = "A caption";
  });
  EXPECT_TRUE(read(photo).problems.empty());
  for (std::size_t size = 3; size < photo.size(); ++size) {
    const PhotoMetadata metadata = read(photo.substr(0, size));
    EXPECT_LE(metadata.problems.size(), 2U) << size;
  }
}

TEST(MetadataBlocks, TheBudgetOfBytesIsKept) {
  const std::vector<std::uint8_t> bytes(1024, 0);
  const ByteSource source{std::span<const std::uint8_t>(bytes)};
  std::uint64_t done = 0;
  for (; done + 1024 <= hostlimits::kBytesLookedAt; done += 1024)
    EXPECT_EQ(source.bytes(0, 1024).size(), 1024U);
  EXPECT_EQ(done, hostlimits::kBytesLookedAt);
  EXPECT_THROW((void)source.u8(0), MetadataError);
}

}  // namespace
}  // namespace kx
