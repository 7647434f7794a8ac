#include "daemon/RestoreRunner.h"

#include "daemon/RestoreSession.h"
#include "daemon/RunErrors.h"
#include "device/LibraryReturn.h"

namespace kx {
namespace {

RestoreResult failedResult(const ErrorPtr& error, int exitCode) {
  RestoreResult result;
  result.error = error;
  result.exitCode = exitCode;
  return result;
}

// Brings the backup's library back under the device's lock. A library that cannot even be opened in
// the backup is a damaged one.
ErrorPtr seeToLibrary(const BackupReader& backup, const std::shared_ptr<DeviceRoot>& root,
                      LibraryReturnResult* result) {
  const BackupManifest& manifest = backup.manifest();
  UniqueFd file;
  const int failed = backup.openLibrary(&file);
  if (failed != 0) {
    result->outcome = LibraryReturn::kUnusable;
    result->why = Error::make(kPosixErrorDomain, failed,
                              "the library of the backup is missing or cannot be opened");
    return nullptr;
  }
  return bringLibraryBack(
      root, {file.get(), manifest.library->size, manifest.library->sha256, manifest.identity},
      result);
}

RestoreResult restoreOnto(const BackupReader& backup, const RestoreOptions& given,
                          const LogSinks& logs, const SyncProgressCallback& progress,
                          const CancelToken& cancel) {
  if (progress) {
    SyncProgress opening;
    opening.phase = SyncPhase::kOpeningBackup;
    progress(opening);
  }
  RestoreOptions options = given;
  ErrorPtr error;
  if (!options.plugin) options.plugin = PluginModule::load(options.pluginPath, &error);
  if (!options.plugin) return failedResult(error, kExitFailed);
  std::optional<LibraryReturnResult> library;
  DeviceOptions deviceOptions;
  deviceOptions.root = options.deviceRoot;
  deviceOptions.create = true;
  deviceOptions.logs = logs;
  // A device that needs its backup may have lost files: it is looked through in any case.
  deviceOptions.beforeLibrary = [&](const std::shared_ptr<DeviceRoot>& root) -> ErrorPtr {
    if (!backup.manifest().library) return nullptr;
    return seeToLibrary(backup, root, &library.emplace());
  };
  const auto device = ReferenceDevice::open(deviceOptions, &error);
  if (!device) return failedResult(error, exitCodeForDeviceError(error));
  return RestoreSession({backup, *device, options, progress, cancel}, library).run();
}

}  // namespace

const char* restoreOutcomeName(RestoreOutcome outcome) {
  switch (outcome) {
    case RestoreOutcome::kRestored:
      return "restored";
    case RestoreOutcome::kNothing:
      return "nothing";
    case RestoreOutcome::kPartial:
      return "partial";
    case RestoreOutcome::kStopped:
      return "stopped";
    case RestoreOutcome::kFailed:
      break;
  }
  return "failed";
}

const char* restoreLibraryName(RestoreLibrary library) {
  switch (library) {
    case RestoreLibrary::kBroughtBack:
      return "restored";
    case RestoreLibrary::kKept:
      return "kept";
    case RestoreLibrary::kDamaged:
      return "damaged";
    case RestoreLibrary::kNone:
      break;
  }
  return "none";
}

RestoreResult restoreDevice(const BackupReader& backup, const RestoreOptions& options,
                            const LogSinks& logs, const SyncProgressCallback& progress,
                            const CancelToken& cancel) {
  RestoreResult result;
  const auto raised =
      catchRaised([&] { result = restoreOnto(backup, options, logs, progress, cancel); });
  if (!raised) return result;
  return failedResult(syncError(SyncErrorCode::kDevice, raised->name + ": " + raised->reason),
                      kExitFailed);
}

}  // namespace kx
