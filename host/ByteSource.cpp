#include "host/ByteSource.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>

#include "host/HostFiles.h"

namespace kx {

namespace {

constexpr std::size_t kWindowBytes = 16 * 1024;

}  // namespace

ReadError::ReadError(int error)
    : std::runtime_error("cannot be read: " + systemErrorText(error)), error_(error) {}

struct ByteSource::File {
  int fd = -1;
  std::uint64_t size = 0;
  std::span<const std::uint8_t> memory;
  std::uint64_t budget = hostlimits::kBytesLookedAt;
  std::vector<std::uint8_t> window;
  std::uint64_t windowStart = 0;

  void spend(std::uint64_t count) {
    if (count > budget) throw MetadataError("more of the file would have to be looked at");
    budget -= count;
  }

  // Reads from the descriptor; less than asked for only at the end of the file.
  std::size_t readFile(std::uint64_t offset, std::uint8_t* into, std::size_t length) {
    spend(length);
    std::size_t done = 0;
    while (done < length) {
      const ssize_t got =
          ::pread(fd, into + done, length - done, static_cast<off_t>(offset + done));
      if (got < 0 && errno == EINTR) continue;
      if (got < 0) throw ReadError(errno);
      if (got == 0) break;
      done += static_cast<std::size_t>(got);
    }
    return done;
  }

  void read(std::uint64_t offset, std::span<std::uint8_t> into) {
    if (into.empty()) return;
    if (fd < 0) {
      spend(into.size());
      std::memcpy(into.data(), memory.data() + offset, into.size());
      return;
    }
    if (into.size() > kWindowBytes / 2) {
      if (readFile(offset, into.data(), into.size()) < into.size()) throw ReadError(EIO);
      return;
    }
    if (offset < windowStart || offset - windowStart > window.size() ||
        window.size() - (offset - windowStart) < into.size()) {
      window.resize(static_cast<std::size_t>(std::min<std::uint64_t>(kWindowBytes, size - offset)));
      windowStart = offset;
      window.resize(readFile(offset, window.data(), window.size()));
      if (window.size() < into.size()) throw ReadError(EIO);
    }
    std::memcpy(into.data(), window.data() + (offset - windowStart), into.size());
  }
};

ByteSource::ByteSource(int fd, std::uint64_t size) : file_(std::make_shared<File>()), size_(size) {
  file_->fd = fd;
  file_->size = size;
}

ByteSource::ByteSource(std::span<const std::uint8_t> memory)
    : file_(std::make_shared<File>()), size_(memory.size()) {
  file_->memory = memory;
  file_->size = memory.size();
}

void ByteSource::read(std::uint64_t offset, std::span<std::uint8_t> into) const {
  if (!holds(offset, into.size())) throw MetadataError("it ends before its metadata does");
  file_->read(start_ + offset, into);
}

std::vector<std::uint8_t> ByteSource::bytes(std::uint64_t offset, std::uint64_t length) const {
  if (!holds(offset, length)) throw MetadataError("it ends before its metadata does");
  if (length > hostlimits::kBytesLookedAt) throw MetadataError("its metadata is too large");
  std::vector<std::uint8_t> result(static_cast<std::size_t>(length));
  read(offset, result);
  return result;
}

std::string ByteSource::text(std::uint64_t offset, std::uint64_t length) const {
  const std::vector<std::uint8_t> raw = bytes(offset, length);
  return std::string(raw.begin(), raw.end());
}

std::uint8_t ByteSource::u8(std::uint64_t offset) const {
  std::array<std::uint8_t, 1> raw = {};
  read(offset, raw);
  return raw[0];
}

std::uint16_t ByteSource::u16(std::uint64_t offset) const {
  std::array<std::uint8_t, 2> raw = {};
  read(offset, raw);
  return static_cast<std::uint16_t>(raw[0] << 8 | raw[1]);
}

std::uint32_t ByteSource::u32(std::uint64_t offset) const {
  std::array<std::uint8_t, 4> raw = {};
  read(offset, raw);
  return static_cast<std::uint32_t>(raw[0]) << 24 | static_cast<std::uint32_t>(raw[1]) << 16 |
         static_cast<std::uint32_t>(raw[2]) << 8 | raw[3];
}

std::uint64_t ByteSource::u64(std::uint64_t offset) const {
  return static_cast<std::uint64_t>(u32(offset)) << 32 | u32(offset + 4);
}

std::vector<std::uint8_t> ByteSource::head(std::size_t length) const {
  return bytes(0, std::min<std::uint64_t>(length, size_));
}

ByteSource ByteSource::range(std::uint64_t offset, std::uint64_t length) const {
  if (!holds(offset, length)) throw MetadataError("it ends before its metadata does");
  return ByteSource(file_, start_ + offset, length);
}

}  // namespace kx
