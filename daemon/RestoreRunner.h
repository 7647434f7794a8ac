#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "backup/BackupReader.h"
#include "daemon/SyncRunner.h"

namespace kx {

struct RestoreOptions {
  std::string deviceRoot;
  // As SyncOptions has them.
  std::string pluginPath;
  std::shared_ptr<PluginModule> plugin;
  std::uint64_t reserveBytes = 64ULL << 20;
};

// restored: all of the backup is on the device. nothing: it was there already. partial: some files
// did not make it. stopped: by a signal. failed: anything else.
enum class RestoreOutcome { kRestored, kNothing, kPartial, kStopped, kFailed };
const char* restoreOutcomeName(RestoreOutcome outcome);

// What became of the backup's library: there is none in it; it is the device's now; the device has
// photos or albums of its own, so its library was kept; it was damaged.
enum class RestoreLibrary { kNone, kBroughtBack, kKept, kDamaged };
const char* restoreLibraryName(RestoreLibrary library);

struct RestoreFailure {
  std::string path;  // device path; "albums.json" and "library.sqlite" for these
  std::string domain;
  std::int64_t code = 0;
  std::string reason;
};

struct RestoreResult {
  RestoreOutcome outcome = RestoreOutcome::kFailed;
  RestoreLibrary library = RestoreLibrary::kNone;
  std::size_t requested = 0;  // files that the plug-in asked for
  std::size_t restored = 0;   // files brought
  std::size_t present = 0;    // files that were there already, the same
  std::vector<RestoreFailure> failed;
  std::size_t registered = 0;  // photos that the device's library has taken in
  std::size_t albumsCreated = 0;
  double seconds = 0.0;
  ErrorPtr error;  // why the run did not end as restored or nothing: one line for people
  int exitCode = kExitFailed;
};

// Opens (and makes, when missing) the device and brings back what the backup holds. Whatever ends
// it, the same call goes on where it stopped. Nothing leaves it as an exception. Any thread.
RestoreResult restoreDevice(const BackupReader& backup, const RestoreOptions& options,
                            const LogSinks& logs, const SyncProgressCallback& progress,
                            const CancelToken& cancel);

}  // namespace kx
