#pragma once

#include <cstdint>
#include <string>

#include "platform/foundation/Error.h"

namespace kx {

inline constexpr const char* kBackupErrorDomain = "com.veltro.kxbackup";
enum class BackupError : std::int64_t {
  kMissing = 1,      // no such directory, or no whole backup in it
  kNotOurs = 2,      // another user's directory, or one that holds something else
  kUnusable = 3,     // the manifest is damaged or makes no sense
  kNewerForm = 4,    // written by a newer version
  kInUse = 5,        // another process uses the backup; userInfo "pid" when it is known
  kNoSpace = 6,      // the backup's disk is full
  kIo = 7,           // any other system error; userInfo "errno"
  kDamagedFile = 8,  // a file of the backup is missing, or not what the manifest says
  kGuard = 9,        // the new backup would lose too much of the old one
  kCancelled = 10,   // ended by the caller
};

// Makers of the backup's errors. Texts name the object; control bytes in it are escaped.
ErrorPtr backupError(BackupError code, const std::string& message);
// kNoSpace for ENOSPC and EDQUOT, else kIo: "<what> <object>: <system text>".
ErrorPtr backupSystemError(const std::string& what, const std::string& object, int errorNumber);

}  // namespace kx
