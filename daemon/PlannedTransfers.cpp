#include "daemon/PlannedTransfers.h"

#include <sys/stat.h>

#include <cerrno>

#include "daemon/FileTransfer.h"

namespace kx {
namespace {

ErrorPtr unreadable(const std::string& reason) {
  return Error::make(kFRErrorDomain, kFRErrorReadOrWrite, reason);
}

// What the device makes of a file of that size.
ErrorPtr refusalOfSize(std::int64_t size) {
  if (size == 0) {
    return Error::make(kDeviceErrorDomain, static_cast<std::int64_t>(DeviceError::kBadFile),
                       "the file is empty");
  }
  if (size > kMediaFileBytes) {
    return unreadable("it is larger than " + std::to_string(kMediaFileBytes) + " bytes");
  }
  return nullptr;
}

}  // namespace

void PlannedTransfers::run(const std::vector<FRAssetPtr>& outstanding) {
  SyncProgress progress;
  progress.phase = SyncPhase::kPlanning;
  std::vector<FRAssetPtr> requests;
  for (const FRAssetPtr& request : outstanding) {
    if (request && !request->isRestore()) requests.push_back(request);
  }
  result_.requested = requests.size();
  plan_.requests.reserve(requests.size());
  for (const FRAssetPtr& request : requests) {
    if (context_.cancel.isCancelled()) {
      cancelled_ = true;
      return;
    }
    SyncPlan::Request planned{request->identifier(), request->prettyName(), std::nullopt};
    const ErrorPtr failure = look(&planned);
    if (!failure && planned.size) plan_.bytesToBring += static_cast<std::uint64_t>(*planned.size);
    plan_.requests.push_back(std::move(planned));
    report(request, failure);
    if (context_.progress) context_.progress(progress);
  }
}

ErrorPtr PlannedTransfers::look(SyncPlan::Request* request) {
  request->size = context_.host.mediaSize(request->uuid);
  if (request->size) return refusalOfSize(*request->size);
  ErrorPtr error;
  const FileDescriptor file = context_.host.openMedia(request->uuid, &error);
  if (!file.valid()) {
    const bool isMissing = !error || (error->domain() == kPosixErrorDomain &&
                                      (error->code() == ENOENT || error->code() == ENOTDIR));
    return isMissing ? Error::make(kFRErrorDomain, kFRErrorFileMissingAtHost,
                                   "the host does not have the file")
                     : unreadable(error->message());
  }
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return unreadable("it cannot be examined");
  if (!S_ISREG(status.st_mode)) return unreadable("it is no regular file");
  request->size = status.st_size;
  return refusalOfSize(status.st_size);
}

void PlannedTransfers::report(const FRAssetPtr& request, const ErrorPtr& failure) {
  ErrorPtr reported = failure;
  const auto raised = context_.plugin.call([&](FRClient& client) {
    if (!failure) request->setPath(std::string(kStagingPath) + "/p" + std::to_string(++counter_));
    client.assetTransfer(request, failure == nullptr, failure);
  });
  if (raised && !reported) {
    reported = Error::make(kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kPlugin),
                           raised->name + ": " + raised->reason);
  }
  if (!reported) return;
  result_.failed.push_back(SyncFailure{request->identifier(), reported->domain(), reported->code(),
                                       reported->message()});
}

}  // namespace kx
