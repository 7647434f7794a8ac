#include "host/ContentType.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <string>

namespace kx {

namespace {

using namespace std::string_view_literals;

class Head {
 public:
  explicit Head(std::span<const std::uint8_t> bytes)
      : text_(reinterpret_cast<const char*>(bytes.data()), bytes.size()) {}

  bool at(std::size_t offset, std::string_view expected) const {
    return text_.size() >= offset + expected.size() &&
           text_.substr(offset, expected.size()) == expected;
  }
  std::string_view part(std::size_t offset, std::size_t length) const {
    return offset <= text_.size() ? text_.substr(offset, length) : std::string_view();
  }
  std::uint8_t byte(std::size_t offset) const { return static_cast<std::uint8_t>(text_[offset]); }
  std::size_t size() const { return text_.size(); }

 private:
  std::string_view text_;
};

constexpr ContentType kJpegType{"image/jpeg", "jpg", false, Container::kJpeg};
constexpr ContentType kMovieType{"video/quicktime", "mov", true, Container::kMovie};

struct Brand {
  std::string_view name;
  ContentType type;
};

constexpr ContentType kHeicType{"image/heic", "heic", false, Container::kHeif};
constexpr ContentType kHeifType{"image/heif", "heif", false, Container::kHeif};
constexpr ContentType kAvifType{"image/avif", "avif", false, Container::kHeif};
constexpr ContentType k3gpType{"video/3gpp", "3gp", true, Container::kMovie};
constexpr ContentType kNothing{};

// Brands of the ISO base media format that are no plain MP4. No type: sound alone.
constexpr std::array kBrands{
    Brand{"heic"sv, kHeicType},
    Brand{"heix"sv, kHeicType},
    Brand{"heim"sv, kHeicType},
    Brand{"heis"sv, kHeicType},
    Brand{"hevc"sv, {"image/heic-sequence", "heic", false, Container::kHeif}},
    Brand{"hevx"sv, {"image/heic-sequence", "heic", false, Container::kHeif}},
    Brand{"avif"sv, kAvifType},
    Brand{"avis"sv, kAvifType},
    Brand{"mif1"sv, kHeifType},
    Brand{"mif2"sv, kHeifType},
    Brand{"msf1"sv, kHeifType},
    Brand{"crx "sv, {"image/x-canon-cr3", "cr3", false, Container::kNone}},
    Brand{"qt  "sv, kMovieType},
    Brand{"M4V "sv, {"video/x-m4v", "m4v", true, Container::kMovie}},
    Brand{"3gp4"sv, k3gpType},
    Brand{"3gp5"sv, k3gpType},
    Brand{"3gp6"sv, k3gpType},
    Brand{"3gp7"sv, k3gpType},
    Brand{"3g2a"sv, {"video/3gpp2", "3g2", true, Container::kMovie}},
    Brand{"M4A "sv, kNothing},
    Brand{"M4B "sv, kNothing},
    Brand{"M4P "sv, kNothing},
    Brand{"F4A "sv, kNothing},
    Brand{"F4B "sv, kNothing},
};

// A general image brand says less than a compatible one behind it.
ContentType heifTypeOf(const Head& head, const ContentType& general) {
  for (std::size_t offset = 16; offset + 4 <= std::min<std::size_t>(head.size(), 64); offset += 4) {
    if (head.at(offset, "heic") || head.at(offset, "heix")) return kHeicType;
    if (head.at(offset, "avif")) return kAvifType;
  }
  return general;
}

ContentType isoTypeOf(const Head& head) {
  const std::string_view major = head.part(8, 4);
  for (const Brand& brand : kBrands) {
    if (brand.name != major) continue;
    return brand.type.mime == kHeifType.mime ? heifTypeOf(head, brand.type) : brand.type;
  }
  return {"video/mp4", "mp4", true, Container::kMovie};
}

ContentType riffTypeOf(const Head& head) {
  if (head.at(8, "WEBP")) return {"image/webp", "webp", false, Container::kWebP};
  if (head.at(8, "AVI ")) return {"video/x-msvideo", "avi", true, Container::kNone};
  return {};
}

ContentType tiffTypeOf(const Head& head) {
  if (head.at(0, "II*\0"sv) && head.at(8, "CR\x02"sv))
    return {"image/x-canon-cr2", "cr2", false, Container::kTiff};
  if (head.at(0, "II*\0"sv) || head.at(0, "MM\0*"sv))
    return {"image/tiff", "tif", false, Container::kTiff};
  if (head.at(0, "IIRO") || head.at(0, "IIRS") || head.at(0, "MMOR"))
    return {"image/x-olympus-orf", "orf", false, Container::kTiff};
  if (head.at(0, "IIU\0"sv)) return {"image/x-panasonic-rw2", "rw2", false, Container::kTiff};
  return {};
}

ContentType matroskaTypeOf(const Head& head) {
  if (head.part(0, 64).find("webm") != std::string_view::npos)
    return {"video/webm", "webm", true, Container::kNone};
  if (head.part(0, 64).find("matroska") != std::string_view::npos)
    return {"video/x-matroska", "mkv", true, Container::kNone};
  return {};
}

bool isTransportStream(const Head& head, std::size_t firstOffset, std::size_t packetSize) {
  if (head.size() < firstOffset + 4 * packetSize + 1) return false;
  for (std::size_t packet = 0; packet < 5; ++packet) {
    if (head.byte(firstOffset + packet * packetSize) != 0x47) return false;
  }
  return true;
}

// A bitmap starts with two letters only, so its header must make sense as well.
bool isBitmap(const Head& head) {
  if (!head.at(0, "BM") || head.size() < 26 || !head.at(6, "\0\0\0\0"sv)) return false;
  const std::uint8_t headerSize = head.byte(14);
  return (headerSize == 12 || headerSize == 40 || headerSize == 52 || headerSize == 56 ||
          headerSize == 64 || headerSize == 108 || headerSize == 124) &&
         head.at(15, "\0\0\0"sv);
}

// QuickTime files from before there were brands start with one of these.
bool isOldQuickTime(const Head& head) {
  return head.at(4, "moov") || head.at(4, "mdat") || head.at(4, "wide") || head.at(4, "pnot");
}

struct NamedKind {
  std::string_view extension;
  bool isVideo = false;
};

constexpr std::array kNamedKinds{
    NamedKind{"jpg"sv},        NamedKind{"jpeg"sv},       NamedKind{"jpe"sv},
    NamedKind{"jfif"sv},       NamedKind{"mpo"sv},        NamedKind{"png"sv},
    NamedKind{"gif"sv},        NamedKind{"tif"sv},        NamedKind{"tiff"sv},
    NamedKind{"webp"sv},       NamedKind{"heic"sv},       NamedKind{"heif"sv},
    NamedKind{"hif"sv},        NamedKind{"avif"sv},       NamedKind{"bmp"sv},
    NamedKind{"jp2"sv},        NamedKind{"jxl"sv},        NamedKind{"dng"sv},
    NamedKind{"nef"sv},        NamedKind{"cr2"sv},        NamedKind{"cr3"sv},
    NamedKind{"arw"sv},        NamedKind{"orf"sv},        NamedKind{"rw2"sv},
    NamedKind{"raf"sv},        NamedKind{"pef"sv},        NamedKind{"srw"sv},
    NamedKind{"mp4"sv, true},  NamedKind{"mov"sv, true},  NamedKind{"m4v"sv, true},
    NamedKind{"3gp"sv, true},  NamedKind{"3g2"sv, true},  NamedKind{"avi"sv, true},
    NamedKind{"mkv"sv, true},  NamedKind{"webm"sv, true}, NamedKind{"mpg"sv, true},
    NamedKind{"mpeg"sv, true}, NamedKind{"mts"sv, true},  NamedKind{"m2ts"sv, true},
    NamedKind{"wmv"sv, true},  NamedKind{"asf"sv, true}};

const NamedKind* kindOfExtension(std::string_view extension) {
  const auto found =
      std::find_if(kNamedKinds.begin(), kNamedKinds.end(),
                   [extension](const NamedKind& kind) { return kind.extension == extension; });
  return found == kNamedKinds.end() ? nullptr : &*found;
}

// In small letters, without dot; "" when the last component has none.
std::string extensionOf(std::string_view path) {
  const std::string_view name = path.substr(path.rfind('/') + 1);
  const std::size_t dot = name.rfind('.');
  if (dot == std::string_view::npos) return {};
  std::string extension(name.substr(dot + 1));
  for (char& letter : extension) {
    if (letter >= 'A' && letter <= 'Z') letter = static_cast<char>(letter - 'A' + 'a');
  }
  return extension;
}

ContentType streamTypeOf(const Head& head) {
  if (head.at(0, "\0\0\x01\xBA"sv) || head.at(0, "\0\0\x01\xB3"sv))
    return {"video/mpeg", "mpg", true, Container::kNone};
  if (head.at(0, "\x30\x26\xB2\x75\x8E\x66\xCF\x11\xA6\xD9\x00\xAA\x00\x62\xCE\x6C"sv))
    return {"video/x-ms-wmv", "wmv", true, Container::kNone};
  if (isTransportStream(head, 0, 188) || isTransportStream(head, 4, 192))
    return {"video/mp2t", "ts", true, Container::kNone};
  return {};
}

}  // namespace

ContentType contentTypeOf(std::span<const std::uint8_t> firstBytes) {
  const Head head(firstBytes);
  if (head.at(0, "\xFF\xD8\xFF")) return kJpegType;
  if (head.at(0, "\x89PNG\r\n\x1A\n")) return {"image/png", "png", false, Container::kPng};
  if (head.at(0, "GIF87a") || head.at(0, "GIF89a"))
    return {"image/gif", "gif", false, Container::kNone};
  if (head.at(4, "ftyp")) return isoTypeOf(head);
  if (head.at(0, "RIFF")) return riffTypeOf(head);
  if (const ContentType tiff = tiffTypeOf(head); tiff.isMedia()) return tiff;
  if (head.at(0, "FUJIFILMCCD-RAW ")) return {"image/x-fuji-raf", "raf", false, Container::kRaf};
  if (isBitmap(head)) return {"image/bmp", "bmp", false, Container::kNone};
  if (head.at(0, "\0\0\0\x0CjP  \r\n\x87\n"sv))
    return {"image/jp2", "jp2", false, Container::kNone};
  if (head.at(0, "\0\0\0\x0CJXL \r\n\x87\n"sv))
    return {"image/jxl", "jxl", false, Container::kNone};
  if (head.at(0, "\x1A\x45\xDF\xA3")) return matroskaTypeOf(head);
  if (isOldQuickTime(head)) return kMovieType;
  return streamTypeOf(head);
}

bool hasMediaExtension(std::string_view name) {
  const std::string extension = extensionOf(name);
  return !extension.empty() && kindOfExtension(extension) != nullptr;
}

ContentType contentTypeOfName(std::string_view path) {
  constexpr std::string_view kUnknownBytes = "application/octet-stream";
  const std::string extension = extensionOf(path);
  if (extension.empty()) return {kUnknownBytes, "bin", false, Container::kNone};
  const NamedKind* kind = kindOfExtension(extension);
  if (kind == nullptr) return {};
  return {kUnknownBytes, kind->extension, kind->isVideo, Container::kNone};
}

}  // namespace kx
