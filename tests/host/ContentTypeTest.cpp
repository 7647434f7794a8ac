#include "host/ContentType.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "tests/host/SamplePhotos.h"

namespace kx {
namespace {

ContentType typeOf(const std::string& bytes) {
  return contentTypeOf({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
}

std::string literal(std::string_view text) { return std::string(text); }

std::string movie(const std::string& brand, const std::string& compatible = "") {
  return literal({"\0\0\0\x18", 4}) + "ftyp" + brand + literal({"\0\0\0\0", 4}) + compatible;
}

std::string transportStream(std::size_t start, std::size_t packet) {
  std::string bytes(start + 5 * packet, 'x');
  for (std::size_t i = 0; i < 5; ++i) bytes[start + i * packet] = '\x47';
  return bytes;
}

struct Case {
  std::string bytes;
  std::string mime;
  bool isVideo = false;
};

TEST(ContentType, IsFoundByTheFirstBytes) {
  const std::vector<Case> cases{
      {test::jpeg(), "image/jpeg"},
      {"\x89PNG\r\n\x1A\n...", "image/png"},
      {"GIF89a...", "image/gif"},
      {"GIF87a...", "image/gif"},
      {literal({"II*\0\x08\0\0\0\0\0", 10}), "image/tiff"},
      {literal({"MM\0*\0\0\0\x08", 8}), "image/tiff"},
      {literal({"II*\0\x10\0\0\0CR\x02\0", 12}), "image/x-canon-cr2"},
      {"IIRO....", "image/x-olympus-orf"},
      {literal({"IIU\0....", 8}), "image/x-panasonic-rw2"},
      {"FUJIFILMCCD-RAW 0201", "image/x-fuji-raf"},
      {"RIFF....WEBPVP8 ", "image/webp"},
      {movie("heic"), "image/heic"},
      {movie("mif1", "mif1heic"), "image/heic"},
      {movie("mif1", "mif1avif"), "image/avif"},
      {movie("mif1"), "image/heif"},
      {movie("avif"), "image/avif"},
      {movie("crx "), "image/x-canon-cr3"},
      {literal({"BM\x46\0\0\0\0\0\0\0\x36\0\0\0\x28\0\0\0\2\0\0\0\2\0\0\0", 26}), "image/bmp"},
      {literal({"\0\0\0\x0CjP  \r\n\x87\n", 12}), "image/jp2"},
      {literal({"\0\0\0\x0CJXL \r\n\x87\n", 12}), "image/jxl"},
      {movie("qt  "), "video/quicktime", true},
      {movie("isom"), "video/mp4", true},
      {movie("mp42"), "video/mp4", true},
      {movie("3gp4"), "video/3gpp", true},
      {literal({"\0\0\0\x08", 4}) + "wide....mdat", "video/quicktime", true},
      {"RIFF....AVI LIST", "video/x-msvideo", true},
      {"\x1A\x45\xDF\xA3....matroska", "video/x-matroska", true},
      {"\x1A\x45\xDF\xA3....webm", "video/webm", true},
      {literal({"\0\0\x01\xBA....", 8}), "video/mpeg", true},
      {transportStream(0, 188) + "x", "video/mp2t", true},
      {transportStream(4, 192) + "x", "video/mp2t", true},
      {literal({"\x30\x26\xB2\x75\x8E\x66\xCF\x11\xA6\xD9\x00\xAA\x00\x62\xCE\x6C", 16}),
       "video/x-ms-wmv", true},
  };
  for (const Case& one : cases) {
    const ContentType type = typeOf(one.bytes);
    EXPECT_EQ(type.mime, one.mime);
    EXPECT_EQ(type.isVideo, one.isVideo) << one.mime;
    EXPECT_FALSE(type.extension.empty()) << one.mime;
  }
}

TEST(ContentType, AnythingElseIsNeitherPhotoNorVideo) {
  for (const std::string& bytes :
       {literal(""), literal("\xFF\xD8"), literal("BMW drives"), literal("<?xml version"),
        literal("%PDF-1.7"), literal("RIFF....WAVE"), movie("M4A "), literal("GIF8"),
        literal("\x1A\x45\xDF\xA3....other"), std::string(1024, '\0'),
        transportStream(0, 188).substr(0, 700)})
    EXPECT_FALSE(typeOf(bytes).isMedia()) << bytes.substr(0, 16);
}

TEST(ContentType, NamesThatPromiseAPhoto) {
  EXPECT_TRUE(hasMediaExtension("a/b.JPG"));
  EXPECT_TRUE(hasMediaExtension("film.mov"));
  EXPECT_FALSE(hasMediaExtension("jpg"));
  EXPECT_FALSE(hasMediaExtension("notes.txt"));
}

}  // namespace
}  // namespace kx
