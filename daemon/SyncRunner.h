#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/HostLink.h"
#include "device/ReferenceDevice.h"

namespace kx {

class PluginModule;

struct SyncOptions {
  std::string deviceRoot;     // the directory that the device was opened on
  bool allowDeletes = false;  // lets a sync pass that the guard would stop
  // The plug-in module; empty: KXSYNC_PLUGIN, else beside the program, else where it is installed.
  std::string pluginPath;
  std::shared_ptr<PluginModule> plugin;  // set: this one, whatever pluginPath says
  // Bytes that must stay free on the device beside what a sync brings.
  std::uint64_t reserveBytes = 64ULL << 20;
  // Told of what the user should know before the first file is moved; null: nobody is.
  std::function<void(const std::string&)> notice;
};

// The last two are of a restore; planned transfers, too, are kPlanning.
enum class SyncPhase {
  kChecking,
  kPreparing,
  kReconciling,
  kTransferring,
  kFinishing,
  kOpeningBackup,
  kPlanning
};

struct SyncProgress {
  SyncPhase phase = SyncPhase::kChecking;
  std::size_t filesDone = 0;   // transfers ended, well or not
  std::size_t filesTotal = 0;  // 0 until the plug-in has said what it needs
  std::uint64_t bytesDone = 0;
  std::uint64_t bytesTotal = 0;  // as far as the link knows sizes
  std::size_t failures = 0;
};
// Called on the thread that runs the sync, often (per file, and within large ones): it must be
// quick.
using SyncProgressCallback = std::function<void(const SyncProgress&)>;

// Ends a running sync early. Any thread, and signal handlers.
class CancelToken {
 public:
  // `signal` decides the exit code: 128 + signal.
  void cancel(int signal) { signal_.store(signal, std::memory_order_relaxed); }
  bool isCancelled() const { return signal() != 0; }
  int signal() const { return signal_.load(std::memory_order_relaxed); }

 private:
  std::atomic<int> signal_{0};
};

// synced: all done. null: there was nothing to do. partial: some assets did not make it. stopped:
// by the guard or a signal. failed: anything else.
enum class SyncOutcome { kSynced, kNull, kPartial, kStopped, kFailed };
const char* syncOutcomeName(SyncOutcome outcome);

inline constexpr int kExitDone = 0;
inline constexpr int kExitFailed = 1;
inline constexpr int kExitUsage = 2;
inline constexpr int kExitPartial = 3;
inline constexpr int kExitGuard = 4;
inline constexpr int kExitNoSpace = 6;
inline constexpr int kExitLocked = 7;

// The daemon's own errors: domain kSyncErrorDomain with these codes.
inline constexpr const char* kSyncErrorDomain = "com.veltro.ferrule";
enum class SyncErrorCode : std::int64_t {
  kHostUnreadable = 1,  // the host's snapshot cannot be read
  kBadSnapshot = 2,     // it decodes but a check refuses it
  kGuard = 3,           // it would take away too much
  kNoSpace = 4,
  kPlugin = 5,        // the module cannot be loaded or its call raised
  kPrepare = 6,       // prepareForSync answered false
  kReconcile = 7,     // reconcileSync answered false without an error
  kNotSealed = 8,     // everything arrived but the library could not prove it
  kDevice = 9,        // the device's files or library failed
  kCancelled = 10,    // by a signal
  kMissingParts = 11  // some assets did not make it
};

struct SyncFailure {
  std::string uuid;
  std::string domain;
  std::int64_t code = 0;
  std::string reason;
};

struct SyncResult {
  SyncOutcome outcome = SyncOutcome::kFailed;
  bool resync = false;
  std::size_t requested = 0;
  std::size_t imported = 0;
  std::vector<SyncFailure> failed;
  std::size_t deletedAssets = 0;  // those that were not requested again
  std::size_t updatedAssets = 0;  // changed in place
  std::size_t albumsCreated = 0, albumsDeleted = 0, albumsRenamed = 0;
  double seconds = 0.0;
  // Why the run did not end as synced or null: one line for people as its message.
  ErrorPtr error;
  int exitCode = kExitFailed;
};

// One whole sync: checks, snapshot put in place, the calls into the plug-in, transfers, result.
// Loads the plug-in for it and makes, calls and destroys its client on a queue of its own. Nothing
// leaves run as an exception. One sync at a time on a device; run it on any thread.
class SyncRunner {
 public:
  SyncResult run(HostLink& host, ReferenceDevice& device, const SyncOptions& options,
                 const SyncProgressCallback& progress, const CancelToken& cancel);
};

// Opens (and makes, when missing) the device at options.deviceRoot and runs one sync on it: what
// both programs do. An error of opening is in the result, with its exit code.
SyncResult syncDevice(HostLink& host, const SyncOptions& options, const LogSinks& logs,
                      const SyncProgressCallback& progress, const CancelToken& cancel);

// The exit code for an error of ReferenceDevice::open or dump.
int exitCodeForDeviceError(const ErrorPtr& error);
// Whether the error says that the device is full, whichever layer gave it.
bool isNoSpaceError(const ErrorPtr& error);

}  // namespace kx
