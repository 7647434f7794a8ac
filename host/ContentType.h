#pragma once

#include <cstdint>
#include <span>
#include <string_view>

namespace kx {

// How the metadata of a file is found.
enum class Container : std::uint8_t {
  kNone,  // known as photo or video, but holds nothing that is read here
  kJpeg,
  kPng,
  kWebP,
  kTiff,   // TIFF itself and the raw formats built on it
  kRaf,    // holds a whole JPEG
  kHeif,   // HEIC, HEIF, AVIF
  kMovie,  // QuickTime, MP4, 3GP
};

// What a file is by its first bytes, whatever its name.
struct ContentType {
  std::string_view mime;       // "" when it is neither photo nor video
  std::string_view extension;  // that a file of this content gets, without dot
  bool isVideo = false;
  Container container = Container::kNone;

  bool isMedia() const { return !mime.empty(); }
};

// The first bytes that contentTypeOf needs, at most.
inline constexpr std::size_t kContentTypeBytes = 1024;

// Photos: JPEG, PNG, GIF, BMP, TIFF, WebP, HEIC, HEIF, AVIF, JPEG 2000, JPEG XL, and the raw forms
// CR2, CR3, ORF, RW2, RAF and those whose files are plain TIFF (DNG, NEF, ARW, PEF, SRW).
// Videos: QuickTime, MP4, M4V, 3GP, AVI, Matroska, WebM, MPEG program and transport streams, ASF.
ContentType contentTypeOf(std::span<const std::uint8_t> firstBytes);

// Whether the name looks like a photo or video: then it is worth a word that the content is none.
bool hasMediaExtension(std::string_view name);

// What a file that cannot be read may be, by its name: a photo or video of unknown content when it
// is named like one, or has no extension at all; else no media.
ContentType contentTypeOfName(std::string_view path);

}  // namespace kx
