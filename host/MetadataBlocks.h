#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/ByteSource.h"
#include "host/ContentType.h"

namespace kx {

// What a movie's own header says, as text and numbers of its own.
struct MovieFacts {
  std::optional<std::int64_t> createdUtc;  // seconds since 1970-01-01 UTC
  std::string creationDate;                // ISO 8601, from the movie's metadata keys
  std::string location;                    // ISO 6709
  std::string description;
};

// The metadata of one file, taken out of its container: small, bounded, and free of everything that
// is not used (maker notes, thumbnails, picture data).
struct MetadataBlocks {
  std::vector<std::uint8_t>
      exif;  // a whole little TIFF of the wanted tags; empty when there is none
  std::vector<std::uint8_t> iptc;  // IIM records
  std::string xmp;                 // packet
  std::uint32_t width = 0;         // stored pixels, 0 when unknown
  std::uint32_t height = 0;
  MovieFacts movie;
  std::string damage;  // what had to be left out because it is damaged; "" when nothing
};

// Reads the blocks of a file. MetadataError when its structure is damaged or beyond a limit;
// ReadError when its bytes cannot be read.
MetadataBlocks readMetadataBlocks(const ByteSource& source, Container container);

// The parts, for one container each.
MetadataBlocks readJpegBlocks(const ByteSource& source);
MetadataBlocks readPngBlocks(const ByteSource& source);
MetadataBlocks readWebPBlocks(const ByteSource& source);
MetadataBlocks readHeifBlocks(const ByteSource& source);
MetadataBlocks readMovieBlocks(const ByteSource& source);
// Adds what a TIFF structure holds: Exif, and XMP and IPTC where there is none yet.
void addTiffBlocks(const ByteSource& source, MetadataBlocks* blocks);

}  // namespace kx
