#pragma once

#include <string>
#include <vector>

#include "backup/BackupManifest.h"
#include "backup/BackupTaker.h"

namespace kx {

struct BackupCheck {
  BackupManifest manifest;             // when there is no error
  std::vector<BackupProblem> damaged;  // missing or changed; device paths, or "albums.json",
                                       // "library.sqlite"
  ErrorPtr error;  // why nothing could be said: no backup, its manifest unusable, ended early
};

// Reads every file of a backup and compares it with the manifest. Nothing is changed. Progress has
// the phase kVerifying.
BackupCheck verifyBackup(const std::string& backupPath, const BackupProgressCallback& progress);

}  // namespace kx
