#include "daemon/SyncRunner.h"

#include <cerrno>
#include <utility>

#include "daemon/SyncSession.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

SyncResult failedResult(const ErrorPtr& error, int exitCode) {
  SyncResult result;
  result.error = error;
  result.exitCode = exitCode;
  return result;
}

ErrorPtr raisedError(const RaisedException& raised) {
  return Error::make(kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kDevice),
                     escapeControlCharacters(raised.name + ": " + raised.reason));
}

// Whatever is raised outside the plug-in's calls is a failure of ours or of the device.
SyncResult catching(const std::function<SyncResult()>& body) {
  SyncResult result;
  if (const auto raised = catchRaised([&] { result = body(); })) {
    result = failedResult(raisedError(*raised), kExitFailed);
  }
  return result;
}

}  // namespace

const char* syncOutcomeName(SyncOutcome outcome) {
  switch (outcome) {
    case SyncOutcome::kSynced:
      return "synced";
    case SyncOutcome::kNull:
      return "null";
    case SyncOutcome::kPartial:
      return "partial";
    case SyncOutcome::kStopped:
      return "stopped";
    case SyncOutcome::kFailed:
      break;
  }
  return "failed";
}

SyncResult SyncRunner::run(HostLink& host, ReferenceDevice& device, const SyncOptions& options,
                           const SyncProgressCallback& progress, const CancelToken& cancel) {
  return catching([&] {
    ErrorPtr error;
    auto snapshot = readHostSnapshot(host, options.deviceRoot, &error);
    if (!snapshot) return failedResult(error, kExitFailed);
    return SyncSession({host, device, options, progress, cancel}, std::move(*snapshot)).run();
  });
}

SyncResult syncDevice(HostLink& host, const SyncOptions& options, const LogSinks& logs,
                      const SyncProgressCallback& progress, const CancelToken& cancel) {
  return catching([&] {
    // A host that cannot be read must not make a device.
    ErrorPtr error;
    auto snapshot = readHostSnapshot(host, options.deviceRoot, &error);
    if (!snapshot) return failedResult(error, kExitFailed);
    DeviceOptions deviceOptions;
    deviceOptions.root = options.deviceRoot;
    deviceOptions.create = true;
    deviceOptions.logs = logs;
    const auto device = ReferenceDevice::open(deviceOptions, &error);
    if (!device) return failedResult(error, exitCodeForDeviceError(error));
    return SyncSession({host, *device, options, progress, cancel}, std::move(*snapshot)).run();
  });
}

SyncPlan planSync(HostLink& host, const SyncOptions& options, const LogSinks& logs,
                  const SyncProgressCallback& progress, const CancelToken& cancel) {
  SyncPlan plan;
  plan.result = catching([&] {
    ErrorPtr error;
    auto snapshot = readHostSnapshot(host, options.deviceRoot, &error);
    if (!snapshot) return failedResult(error, kExitFailed);
    DeviceOptions deviceOptions;
    deviceOptions.root = options.deviceRoot;
    deviceOptions.planOnly = true;
    deviceOptions.logs = logs;
    const auto device = ReferenceDevice::open(deviceOptions, &error);
    if (!device) return failedResult(error, exitCodeForDeviceError(error));
    return SyncSession({host, *device, options, progress, cancel, &plan}, std::move(*snapshot))
        .run();
  });
  return plan;
}

bool isNoSpaceError(const ErrorPtr& error) {
  if (!error) return false;
  const std::int64_t code = error->code();
  const std::string& domain = error->domain();
  if (domain == kDeviceErrorDomain) return code == static_cast<std::int64_t>(DeviceError::kNoSpace);
  if (domain == kPosixErrorDomain) return code == ENOSPC || code == EDQUOT;
  if (domain == kFRErrorDomain) return code == kFRErrorDiskFull;
  return domain == kSyncErrorDomain && code == static_cast<std::int64_t>(SyncErrorCode::kNoSpace);
}

int exitCodeForDeviceError(const ErrorPtr& error) {
  if (isNoSpaceError(error)) return kExitNoSpace;
  const bool isLocked = error && error->domain() == kDeviceErrorDomain &&
                        error->code() == static_cast<std::int64_t>(DeviceError::kLocked);
  return isLocked ? kExitLocked : kExitFailed;
}

}  // namespace kx
