#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <stdexcept>
#include <string>
#include <vector>

#include "host/HostLimits.h"

namespace kx {

// Metadata that is damaged or beyond a limit. The photo is synced without what could not be read.
class MetadataError : public std::runtime_error {
 public:
  explicit MetadataError(const std::string& text) : std::runtime_error(text) {}
};

// The bytes of a file could not be read: errno.
class ReadError : public std::runtime_error {
 public:
  explicit ReadError(int error);
  int error() const { return error_; }

 private:
  int error_;
};

// Random access to a file's bytes, or to a range of them, by copying reads (never by mapping: a
// file that is truncated meanwhile gives an error, no signal). All ranges of one file share one
// read-ahead window and one budget of bytes to look at (hostlimits::kBytesLookedAt).
// Threads: one at a time. Lifetime: the descriptor or the memory must outlive it.
class ByteSource {
 public:
  explicit ByteSource(int fd, std::uint64_t size);
  explicit ByteSource(std::span<const std::uint8_t> memory);

  std::uint64_t size() const { return size_; }
  bool holds(std::uint64_t offset, std::uint64_t length) const {
    return offset <= size_ && length <= size_ - offset;
  }

  // MetadataError when the range is not wholly inside, or the budget is used up; ReadError when the
  // system fails to read it.
  void read(std::uint64_t offset, std::span<std::uint8_t> into) const;
  std::vector<std::uint8_t> bytes(std::uint64_t offset, std::uint64_t length) const;
  std::string text(std::uint64_t offset, std::uint64_t length) const;
  // Big-endian numbers.
  std::uint8_t u8(std::uint64_t offset) const;
  std::uint16_t u16(std::uint64_t offset) const;
  std::uint32_t u32(std::uint64_t offset) const;
  std::uint64_t u64(std::uint64_t offset) const;

  // The first bytes, at most `length`.
  std::vector<std::uint8_t> head(std::size_t length) const;
  ByteSource range(std::uint64_t offset, std::uint64_t length) const;

 private:
  struct File;
  ByteSource(std::shared_ptr<File> file, std::uint64_t start, std::uint64_t size)
      : file_(std::move(file)), start_(start), size_(size) {}

  std::shared_ptr<File> file_;
  std::uint64_t start_ = 0;
  std::uint64_t size_ = 0;
};

}  // namespace kx
