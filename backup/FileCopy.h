#pragma once

#include <functional>
#include <string>

#include "backup/BackupManifest.h"
#include "device/DeviceRoot.h"

namespace kx {

struct FileCopy {
  enum class Outcome {
    kCopied,
    kGone,         // the source is not there any more
    kUnreadable,   // `error` says why; that file alone
    kChanging,     // it was written to each time it was read
    kNotWritable,  // the target failed: `error`
    kStopped
  };
  Outcome outcome = Outcome::kCopied;
  int error = 0;    // errno
  BackupFile file;  // as it was copied
};

struct FileCopyJob {
  const DeviceRoot& from;
  std::string path;  // device path
  const DeviceRoot& to;
  std::string target;  // in a directory that is there
  bool sync = false;   // fsync the copy
  // Told of the bytes of each piece that was copied (less than nothing when a reading begins anew);
  // false ends the copy.
  std::function<bool(std::int64_t)> onBytes;
};

// Copies a regular file, hashing it on the way, with its modification time. A file that changes
// meanwhile is read again, three times in all. After a failure no target is left.
FileCopy copyFile(const FileCopyJob& job);

}  // namespace kx
