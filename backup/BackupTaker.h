#pragma once

#include <functional>
#include <string>
#include <vector>

#include "backup/BackupManifest.h"
#include "backup/BackupScan.h"
#include "device/ReferenceDevice.h"

namespace kx {

struct BackupRequest {
  std::string backupPath;          // the directory of the backup on the host
  std::vector<std::string> paths;  // what to take: entries as the plug-in names them
  bool withLibrary = false;        // the library's database too
  bool allowLosses = false;        // lets a backup pass that the guard would stop
};

enum class BackupPhase { kLooking, kCopying, kLibrary, kFinishing, kVerifying };

struct BackupProgress {
  BackupPhase phase = BackupPhase::kLooking;
  std::size_t filesDone = 0, filesTotal = 0;  // those that have to be copied
  std::uint64_t bytesDone = 0, bytesTotal = 0;
  std::size_t failures = 0;
};
// Called on the thread that takes the backup, often. False ends it early.
using BackupProgressCallback = std::function<bool(const BackupProgress&)>;

struct BackupResult {
  BackupManifest manifest;  // of the new backup, when there is no error
  std::size_t copiedFiles = 0;
  std::uint64_t copiedBytes = 0;
  std::size_t removedFiles = 0;         // in the old backup, not in the new one
  std::size_t albums = 0;               // the device's own
  std::vector<BackupProblem> leftOut;   // links and other things that are no files
  std::vector<BackupProblem> failures;  // not in the backup as they are on the device
  ErrorPtr error;  // why there is no new backup; the old one is untouched, or ends its commit with
                   // the next backup. Domains: kBackupErrorDomain, or the device's.
};

// Takes a backup of a device that was opened for writing, so that nothing else changes its library
// meanwhile; "/tmp/BackupRunning" beneath the device is locked while it runs. Files whose size and
// time are those of the old backup are not copied again; a file that cannot be read keeps its old
// copy. Nothing leaves it as an exception.
BackupResult takeBackup(ReferenceDevice& device, const BackupRequest& request,
                        const BackupProgressCallback& progress);

}  // namespace kx
