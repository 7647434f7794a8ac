#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "daemon/FileDescriptor.h"
#include "platform/foundation/Error.h"

namespace kx {

// Largest media file that is moved.
inline constexpr std::int64_t kMediaFileBytes = 64LL << 30;
// What a copy leaves free on the device: room for the rows of the files that are staged already.
inline constexpr std::uint64_t kWorkingBytes = 4ULL << 20;
// Where arrived files wait for the asset daemon, relative to "/var/mobile/Media/".
inline constexpr const char* kStagingPath = "Photos/Sync/Staging";

// No errno: a file whose size or time changed while it was read.
inline constexpr int kFileChanged = -1;

// Fills the buffer from the file's start, which must be exactly that long. 0, an errno or
// kFileChanged.
int readWhole(int file, std::vector<std::uint8_t>& bytes);

// Opens the directory `path` (relative, plain components) beneath an open directory, component by
// component, no link followed; makes missing ones (mode 0700) when asked. Invalid with errno set on
// failure.
FileDescriptor openDirectoryBeneath(int root, const std::string& path, bool create);

// Bytes that may still be written beneath the directory, or where it would be made; 0 when that
// cannot be told.
std::uint64_t freeBytesAt(const std::string& directory);

// The daemon's staging directory on the device. File names in it are counted, never the host's, and
// it holds nothing that outlives a run: it is emptied before and after each. One thread.
class Staging {
 public:
  // Makes the directory when missing. Null and an error of the domain "POSIX" on failure.
  static std::unique_ptr<Staging> open(const std::string& deviceRoot, ErrorPtr* error);

  struct Result {
    std::string path;         // relative to "/var/mobile/Media/", empty on failure
    std::uint64_t bytes = 0;  // size of the file
    ErrorPtr error;           // domain "FRError", null on success
    bool cancelled = false;   // given up because the callback said so; neither path nor error
    bool ofDevice = false;    // the error is of the side that is written
  };
  // Called between chunks with the bytes moved since the last call; false gives up.
  using OnBytes = std::function<bool(std::uint64_t bytes)>;

  // Copies the open regular file whole, sharing its blocks where the file system can. Anything but
  // a regular file, one that is too large and one that changes meanwhile is an error. The data is
  // not synced to disk here: the asset daemon does that for a batch, before its rows commit.
  Result take(const FileDescriptor& source, const OnBytes& onBytes);
  // Removes a staged file by the path that take gave; a missing one is no error.
  void drop(const std::string& path);
  // Removes every file of the directory.
  void clear();

 private:
  Staging() = default;
  FileDescriptor create(std::string* name);
  bool hasRoomFor(std::uint64_t bytes) const;

  FileDescriptor directory_;
  std::uint64_t counter_ = 0;
};

}  // namespace kx
