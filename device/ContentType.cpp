#include "device/ContentType.h"

#include <array>
#include <string>

namespace kx {
namespace {

struct Magic {
  std::size_t offset;
  std::string_view bytes;
  std::string_view extension;
};

using namespace std::string_view_literals;

constexpr std::array kMagics = {
    Magic{0, "\xFF\xD8\xFF"sv, "JPG"},
    Magic{0, "\x89PNG\r\n\x1A\n"sv, "PNG"},
    Magic{0, "GIF87a"sv, "GIF"},
    Magic{0, "GIF89a"sv, "GIF"},
    Magic{0, "II*\0\x10\0\0\0CR"sv, "CR2"},
    Magic{0, "II*\0"sv, "TIF"},
    Magic{0, "MM\0*"sv, "TIF"},
    Magic{0, "FUJIFILMCCD-RAW"sv, "RAF"},
    Magic{0, "BM"sv, "BMP"},
    Magic{8, "WEBPVP8"sv, "WEBP"},
    Magic{8, "AVI LIST"sv, "AVI"},
    Magic{0, "\x1A\x45\xDF\xA3"sv, "MKV"},
    Magic{0, "\0\0\x01\xBA"sv, "MPG"},
    Magic{0, "\0\0\x01\xB3"sv, "MPG"},
    Magic{4, "moov"sv, "MOV"},
    Magic{4, "mdat"sv, "MOV"},
    Magic{4, "wide"sv, "MOV"},
};

// Brands of files that begin with a file type box.
constexpr std::array kBrands = {
    Magic{8, "heic"sv, "HEIC"}, Magic{8, "heix"sv, "HEIC"}, Magic{8, "heim"sv, "HEIC"},
    Magic{8, "heis"sv, "HEIC"}, Magic{8, "hevc"sv, "HEIC"}, Magic{8, "mif1"sv, "HEIC"},
    Magic{8, "msf1"sv, "HEIC"}, Magic{8, "avif"sv, "AVIF"}, Magic{8, "avis"sv, "AVIF"},
    Magic{8, "qt  "sv, "MOV"},  Magic{8, "crx "sv, "CR3"},  Magic{8, "M4V"sv, "M4V"},
    Magic{8, "3gp"sv, "3GP"},   Magic{8, "3g2"sv, "3G2"},
};

bool matches(std::string_view content, const Magic& magic) {
  return content.size() >= magic.offset + magic.bytes.size() &&
         content.substr(magic.offset, magic.bytes.size()) == magic.bytes;
}

}  // namespace

std::string_view extensionForContent(std::span<const std::uint8_t> firstBytes) {
  const std::string content(firstBytes.begin(), firstBytes.end());
  for (const Magic& magic : kMagics) {
    if (matches(content, magic)) return magic.extension;
  }
  if (matches(content, Magic{4, "ftyp"sv, ""})) {
    for (const Magic& brand : kBrands) {
      if (matches(content, brand)) return brand.extension;
    }
    return "MP4";
  }
  return "DAT";
}

}  // namespace kx
