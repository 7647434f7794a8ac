#include "daemon/BackupRunner.h"

#include <sys/statvfs.h>

#include <cerrno>
#include <exception>
#include <functional>

#include "backup/BackupErrors.h"
#include "daemon/PluginHost.h"
#include "daemon/RunErrors.h"
#include "device/DeviceErrors.h"

namespace kx {
namespace {

constexpr int kSignalExitBase = 128;
constexpr const char* kPhotoKey = "Photo";
constexpr const char* kShoeboxKey = "Shoebox";

// Loads the plug-in, makes its client on the device and calls it once. False and an error.
bool askPlugin(ReferenceDevice& device, std::shared_ptr<PluginModule> module,
               const std::function<void(FRClient&)>& body, ErrorPtr* error) {
  if (!module) module = PluginModule::load({}, error);
  if (!module) return false;
  PluginHost host(std::move(module), device.platform());
  if (ErrorPtr failed = host.createClient()) {
    setError(error, std::move(failed));
    return false;
  }
  std::optional<RaisedException> raised = host.call(body);
  const std::optional<RaisedException> atEnd = host.destroyClient();
  if (!raised) raised = atEnd;
  if (!raised) return true;
  setError(error, raisedError("a call", *raised));
  return false;
}

bool askForPaths(ReferenceDevice& device, const std::shared_ptr<PluginModule>& module,
                 std::vector<std::string>* paths, ErrorPtr* error) {
  return askPlugin(
      device, module,
      [paths](FRClient& client) {
        StringList backup;
        StringList notBackup;
        client.pathsToBackup(&backup, &notBackup);
        paths->assign(backup.begin(), backup.end());
      },
      error);
}

BackupResult takeIt(const BackupOptions& options, const LogSinks& logs,
                    const BackupProgressCallback& progress, const CancelToken& cancel) {
  BackupResult result;
  DeviceOptions deviceOptions;
  deviceOptions.root = options.deviceRoot;
  deviceOptions.logs = logs;
  const auto device = ReferenceDevice::open(deviceOptions, &result.error);
  if (!device) return result;
  std::shared_ptr<PluginModule> module = options.plugin;
  if (!module && !options.pluginPath.empty()) {
    module = PluginModule::load(options.pluginPath, &result.error);
    if (!module) return result;
  }
  BackupRequest request;
  request.backupPath = options.backupPath;
  request.withLibrary = options.withLibrary;
  request.allowLosses = options.allowLosses;
  if (!askForPaths(*device, module, &request.paths, &result.error)) return result;
  return takeBackup(*device, request, [&](const BackupProgress& state) {
    return (!progress || progress(state)) && !cancel.isCancelled();
  });
}

std::unique_ptr<ReferenceDevice> openForReading(const std::string& root, const LogSinks& logs,
                                                ErrorPtr* error) {
  DeviceOptions options;
  options.root = root;
  options.readOnly = true;
  options.logs = logs;
  return ReferenceDevice::open(options, error);
}

DeviceMetrics::Kind kindOf(const Value& metrics) {
  const auto number = [&metrics](const char* key) {
    return metrics[key].isNull() ? 0 : metrics[key].numberValue().uint64Value();
  };
  return {number("_PhysicalSize"), number("_Count")};
}

bool measureDisk(const DeviceRoot& root, DeviceMetrics* metrics, ErrorPtr* error) {
  struct statvfs disk;
  if (::fstatvfs(root.fd(), &disk) != 0) {
    setError(error, systemError("cannot examine", root.hostPath(), errno));
    return false;
  }
  metrics->capacity = static_cast<std::uint64_t>(disk.f_frsize) * disk.f_blocks;
  metrics->free = static_cast<std::uint64_t>(disk.f_frsize) * disk.f_bavail;
  return true;
}

}  // namespace

BackupResult backUpDevice(const BackupOptions& options, const LogSinks& logs,
                          const BackupProgressCallback& progress, const CancelToken& cancel) {
  try {
    return takeIt(options, logs, progress, cancel);
  } catch (const std::exception& failure) {
    BackupResult result;
    result.error = syncError(SyncErrorCode::kDevice, failure.what());
    return result;
  }
}

int exitCodeForBackup(const ErrorPtr& error, bool partial, const CancelToken& cancel) {
  if (!error) return partial ? kExitPartial : kExitDone;
  if (error->domain() != kBackupErrorDomain) return exitCodeForDeviceError(error);
  switch (static_cast<BackupError>(error->code())) {
    case BackupError::kCancelled:
      return cancel.isCancelled() ? kSignalExitBase + cancel.signal() : kExitFailed;
    case BackupError::kGuard:
      return kExitGuard;
    case BackupError::kNoSpace:
      return kExitNoSpace;
    case BackupError::kInUse:
      return kExitLocked;
    default:
      return kExitFailed;
  }
}

std::optional<std::vector<std::string>> readBackupPaths(const std::string& deviceRoot,
                                                        const LogSinks& logs, ErrorPtr* error) {
  const auto device = openForReading(deviceRoot, logs, error);
  std::vector<std::string> paths;
  if (!device || !askForPaths(*device, nullptr, &paths, error)) return std::nullopt;
  return paths;
}

std::optional<DeviceMetrics> readMetrics(const std::string& deviceRoot, const LogSinks& logs,
                                         ErrorPtr* error) {
  const auto device = openForReading(deviceRoot, logs, error);
  if (!device) return std::nullopt;
  Value answer;
  const auto ask = [&answer](FRClient& client) { answer = client.installedAssetMetrics(); };
  if (!askPlugin(*device, nullptr, ask, error)) return std::nullopt;
  DeviceMetrics metrics;
  if (!measureDisk(device->root(), &metrics, error)) return std::nullopt;
  metrics.backupRunning = answer[kPhotoKey].isNull() && answer[kShoeboxKey].isNull();
  metrics.photo = kindOf(answer[kPhotoKey]);
  metrics.shoebox = kindOf(answer[kShoeboxKey]);
  return metrics;
}

}  // namespace kx
