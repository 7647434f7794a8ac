#pragma once

#include <cstddef>
#include <cstdint>

// Limits for what is read from a host folder. A limit is the largest size that is accepted; what is
// beyond it costs the photo its metadata, or (files, depth, path) ends the reading with an error.
namespace kx::hostlimits {

inline constexpr std::uint64_t kFiles = 2'000'000;  // photos and videos below one folder
inline constexpr std::size_t kFolderDepth = 64;
inline constexpr std::size_t kPathBytes = 4095;  // below the folder
inline constexpr std::uint64_t kSnapshotBytes = 1ULL << 30;

inline constexpr std::uint64_t kBytesLookedAt = 64ULL << 20;  // of one file, for its metadata
inline constexpr std::size_t kSegments = 65'536;              // JPEG segments, PNG and RIFF chunks
inline constexpr std::size_t kTiffDirectories = 64;
inline constexpr std::size_t kTiffTags = 16'384;
inline constexpr std::size_t kTiffValueBytes = 8 * 1024;  // larger values are left out
inline constexpr std::size_t kBoxDepth = 16;
inline constexpr std::size_t kBoxes = 65'536;
inline constexpr std::size_t kXmpBytes = 4U << 20;
inline constexpr std::size_t kXmpDepth = 64;
inline constexpr std::size_t kIptcBytes = 1U << 20;
inline constexpr std::size_t kFacesPerPhoto = 1'000;
inline constexpr std::size_t kTextBytes =
    4 * 1024;  // captions, names of people: cut at a character

}  // namespace kx::hostlimits
