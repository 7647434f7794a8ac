#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "platform/foundation/Date.h"
#include "platform/library/KXManagedObjects.h"

namespace kx {

// What a photo or film of the camera says of itself.
struct CameraMetadata {
  std::optional<Date> captured;
  std::optional<Coordinate> place;
};

// Reads at most so many bytes of one file.
inline constexpr std::size_t kCameraHeadBytes = std::size_t{1} << 20;

// The Exif block of a still, found by its mark in the file's first bytes (JPEG, HEIC, PNG) or at
// their start (TIFF and raw forms). Three directories at most are looked at. Times without an
// offset are read as UTC. Never fails: what makes no sense is left out. Any thread.
CameraMetadata readExif(std::span<const std::uint8_t> head);

// The same from the header of a film that is made of boxes: the time of its creation and its place.
// `file` is open for reading, `size` its bytes.
CameraMetadata readFilmHeader(int file, std::uint64_t size);

}  // namespace kx
