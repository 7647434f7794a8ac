#pragma once

#include <cstddef>
#include <cstdint>

// Size limits for input that is not to be trusted. A limit is the largest size that is accepted.
namespace kx::limits {

inline constexpr std::uint64_t kSnapshotFileBytes = 1ULL << 30;
inline constexpr std::uint64_t kObjects = 64ULL << 20;  // and never more than the file has bytes
inline constexpr std::size_t kNestingDepth = 64;
inline constexpr std::uint64_t kVisits = 256ULL << 20;  // objects met, shared ones each time
inline constexpr std::size_t kStringBytes = 1U << 20;
inline constexpr std::size_t kKeyUnits = 256;  // UTF-16 units
inline constexpr std::size_t kDataBytes = 64U << 20;
inline constexpr std::uint64_t kDecodeBaseBytes = 64ULL << 20;  // memory of a decoding:
inline constexpr std::uint64_t kDecodeBytesPerFileByte = 4;     // base + this for each file byte
inline constexpr std::size_t kXmlTextBytes = 1U << 20;          // text or comment, data apart
inline constexpr std::size_t kXmlNameBytes = 64;
inline constexpr std::size_t kXmlAttributes = 1;
inline constexpr std::uint64_t kAssets = 2'000'000;
inline constexpr std::uint64_t kContainers = 200'000;
inline constexpr std::uint64_t kFaces = 4U << 20;
inline constexpr std::uint64_t kMemberships = 16U << 20;
inline constexpr std::size_t kLogLineBytes = 4096;

}  // namespace kx::limits
