#pragma once

#include <functional>
#include <string>
#include <vector>

#include "backup/BackupManifest.h"
#include "device/DeviceRoot.h"

namespace kx {

// A file or directory that is not in a backup, and why: one line for people.
struct BackupProblem {
  std::string path;  // device path
  std::string reason;
};

// A file of the device that belongs into a backup.
struct BackupCandidate {
  std::string path;  // device path
  std::int64_t size = 0;
  BackupFileTime modified;
};

struct BackupScan {
  std::vector<BackupCandidate> files;   // by path, ascending by bytes
  std::vector<BackupProblem> leftOut;   // links and other things that are no files
  std::vector<BackupProblem> failures;  // what could not be looked at; a directory stands for all
                                        // that is beneath it
};

// Lists the regular files beneath the device paths, which may be missing. No link is followed, no
// other file system entered; temporary files of interrupted writes are passed over. Asked for every
// directory, `goOn` ends the walk by saying no.
BackupScan scanForBackup(const DeviceRoot& device, const std::vector<std::string>& paths,
                         const std::function<bool()>& goOn);

}  // namespace kx
