// JPEG, PNG, WebP: walks segments and chunks, and takes out those that hold metadata.
#include <exiv2/jpgimage.hpp>

#include <cstring>
#include <string_view>

#include "host/MetadataBlocks.h"

namespace kx {

namespace {

using namespace std::string_view_literals;

constexpr std::string_view kExifHeader = "Exif\0\0"sv;
constexpr std::string_view kXmpHeader = "http://ns.adobe.com/xap/1.0/\0"sv;
constexpr std::string_view kPhotoshopHeader = "Photoshop 3.0\0"sv;
constexpr std::string_view kPngXmpKeyword = "XML:com.adobe.xmp\0"sv;

bool startsWith(const ByteSource& source, std::string_view text) {
  return source.holds(0, text.size()) && source.text(0, text.size()) == text;
}

ByteSource after(const ByteSource& source, std::size_t prefix) {
  return source.range(prefix, source.size() - prefix);
}

void takeXmp(const ByteSource& packet, MetadataBlocks* blocks) {
  if (packet.size() > hostlimits::kXmpBytes) throw MetadataError("its XMP is too large");
  if (blocks->xmp.empty()) blocks->xmp = packet.text(0, packet.size());
}

void takeExif(const ByteSource& tiff, MetadataBlocks* blocks) {
  if (blocks->exif.empty()) addTiffBlocks(tiff, blocks);
}

void takePhotoshop(const ByteSource& resources, MetadataBlocks* blocks) {
  if (!blocks->iptc.empty() || resources.size() > hostlimits::kIptcBytes) return;
  const std::vector<std::uint8_t> raw = resources.bytes(0, resources.size());
  const Exiv2::byte* record = nullptr;
  std::uint32_t headerSize = 0;
  std::uint32_t iptcSize = 0;
  if (Exiv2::Photoshop::locateIptcIrb(raw.data(), static_cast<long>(raw.size()), &record,
                                      &headerSize, &iptcSize) == 0)
    blocks->iptc.assign(record + headerSize, record + headerSize + iptcSize);
}

void takeJpegSegment(std::uint8_t marker, const ByteSource& body, MetadataBlocks* blocks) {
  if (marker == 0xE1 && startsWith(body, kExifHeader)) {
    takeExif(after(body, kExifHeader.size()), blocks);
  } else if (marker == 0xE1 && startsWith(body, kXmpHeader)) {
    takeXmp(after(body, kXmpHeader.size()), blocks);
  } else if (marker == 0xED && startsWith(body, kPhotoshopHeader)) {
    takePhotoshop(after(body, kPhotoshopHeader.size()), blocks);
  } else if (marker >= 0xC0 && marker <= 0xCF && marker != 0xC4 && marker != 0xC8 &&
             marker != 0xCC && blocks->width == 0) {
    blocks->height = body.u16(1);
    blocks->width = body.u16(3);
  }
}

std::uint32_t littleU32(const ByteSource& source, std::uint64_t offset) {
  return __builtin_bswap32(source.u32(offset));
}

}  // namespace

MetadataBlocks readJpegBlocks(const ByteSource& source) {
  MetadataBlocks blocks;
  std::uint64_t at = 2;
  for (std::size_t segments = 0;; ++segments) {
    if (segments > hostlimits::kSegments) throw MetadataError("it has too many segments");
    if (source.u8(at) != 0xFF) throw MetadataError("it is damaged between two segments");
    const std::uint8_t marker = source.u8(at + 1);
    if (marker == 0xFF) {  // a fill byte
      ++at;
      continue;
    }
    if (marker == 0xDA || marker == 0xD9) return blocks;  // picture data, or the end
    if (marker == 0x01 || (marker >= 0xD0 && marker <= 0xD8)) {
      at += 2;
      continue;
    }
    const std::uint16_t length = source.u16(at + 2);
    if (length < 2) throw MetadataError("it has a segment of an impossible size");
    takeJpegSegment(marker, source.range(at + 4, length - 2U), &blocks);
    at += 2ULL + length;
  }
}

MetadataBlocks readPngBlocks(const ByteSource& source) {
  MetadataBlocks blocks;
  std::uint64_t at = 8;
  for (std::size_t chunks = 0; source.holds(at, 12); ++chunks) {
    if (chunks > hostlimits::kSegments) throw MetadataError("it has too many chunks");
    const std::uint32_t length = source.u32(at);
    const std::string type = source.text(at + 4, 4);
    if (type == "IEND") return blocks;
    const ByteSource body = source.range(at + 8, length);
    if (type == "IHDR") {
      blocks.width = body.u32(0);
      blocks.height = body.u32(4);
    } else if (type == "eXIf") {
      takeExif(body, &blocks);
    } else if (type == "iTXt" && startsWith(body, kPngXmpKeyword)) {
      // Behind the keyword: not compressed (0), method 0, two empty texts.
      const std::size_t prefix = kPngXmpKeyword.size();
      if (body.holds(prefix, 4) && body.u32(prefix) == 0) takeXmp(after(body, prefix + 4), &blocks);
    }
    at += 12ULL + length;
  }
  throw MetadataError("it ends before its last chunk");
}

MetadataBlocks readWebPBlocks(const ByteSource& source) {
  MetadataBlocks blocks;
  std::uint64_t at = 12;
  for (std::size_t chunks = 0; source.holds(at, 8); ++chunks) {
    if (chunks > hostlimits::kSegments) throw MetadataError("it has too many chunks");
    const std::string type = source.text(at, 4);
    const std::uint32_t length = littleU32(source, at + 4);
    const ByteSource body = source.range(at + 8, length);
    if (type == "VP8X") {
      blocks.width = (littleU32(body, 4) & 0xFFFFFF) + 1;
      blocks.height = (littleU32(body, 6) >> 8) + 1;
    } else if (type == "EXIF") {
      const bool hasHeader = startsWith(body, kExifHeader);
      takeExif(hasHeader ? after(body, kExifHeader.size()) : body, &blocks);
    } else if (type == "XMP ") {
      takeXmp(body, &blocks);
    }
    at += 8ULL + length + length % 2;
  }
  return blocks;
}

MetadataBlocks readMetadataBlocks(const ByteSource& source, Container container) {
  switch (container) {
    case Container::kNone:
      return {};
    case Container::kJpeg:
      return readJpegBlocks(source);
    case Container::kPng:
      return readPngBlocks(source);
    case Container::kWebP:
      return readWebPBlocks(source);
    case Container::kTiff: {
      MetadataBlocks blocks;
      addTiffBlocks(source, &blocks);
      return blocks;
    }
    case Container::kRaf: {
      // A preview with all of the metadata lies at the offset and of the length given here.
      const std::uint32_t offset = source.u32(84);
      return readJpegBlocks(source.range(offset, source.u32(88)));
    }
    case Container::kHeif:
      return readHeifBlocks(source);
    case Container::kMovie:
      return readMovieBlocks(source);
  }
  return {};
}

}  // namespace kx
