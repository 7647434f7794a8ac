#include "daemon/TransferLoop.h"

#include <cerrno>

namespace kx {
namespace {

// Codes of kFRErrorDomain after which trying again can help. A full disk is recoverable, too, but
// only by somebody who makes room.
bool isWorthRetrying(const ErrorPtr& error) {
  return error && error->code() != kFRErrorFileMissingAtHost && error->code() != kFRErrorDiskFull;
}

}  // namespace

void TransferLoop::run(const std::vector<FRAssetPtr>& outstanding) {
  std::vector<FRAssetPtr> requests;
  requests.reserve(outstanding.size());
  progress_.phase = SyncPhase::kTransferring;
  for (const FRAssetPtr& request : outstanding) {
    if (!request || request->isRestore()) continue;
    requests.push_back(request);
    const auto size = context_.host.mediaSize(request->identifier());
    if (size && *size > 0) progress_.bytesTotal += static_cast<std::uint64_t>(*size);
  }
  progress_.filesTotal = requests.size();
  result_.requested = requests.size();
  tell();
  for (const FRAssetPtr& request : requests) {
    if (context_.cancel.isCancelled()) cancelled_ = true;
    if (cancelled_) break;
    transfer(request);
    tell();
  }
  if (progress_.filesDone < requests.size()) allArrived_ = false;
}

void TransferLoop::transfer(const FRAssetPtr& request) {
  // The asset daemon may have met the full disk first.
  if (!diskFull_ && isNoSpaceError(context_.health.firstFailure())) diskFull_ = true;
  Staging::Result fetched;
  if (diskFull_) {
    fetched.error = Error::make(kFRErrorDomain, kFRErrorDiskFull, "no space left on the device");
  } else {
    const std::uint64_t bytesBefore = progress_.bytesDone;
    fetched = fetch(*request);
    if (fetched.cancelled) {
      cancelled_ = true;
      return;
    }
    progress_.bytesDone = bytesBefore + fetched.bytes;
  }
  ++progress_.filesDone;
  if (fetched.error && fetched.error->code() == kFRErrorDiskFull) diskFull_ = true;
  report(request, fetched);
}

Staging::Result TransferLoop::fetch(const FRAsset& request) {
  Staging::Result fetched;
  for (int attempt = 0; attempt < kTransferAttempts; ++attempt) {
    fetched = fetchOnce(request);
    if (!isWorthRetrying(fetched.error)) break;
  }
  return fetched;
}

Staging::Result TransferLoop::fetchOnce(const FRAsset& request) {
  Staging::Result fetched;
  if (!request.isDownload()) {
    fetched.error = Error::make(kFRErrorDomain, kFRErrorReadOrWrite, "sending is not supported");
    return fetched;
  }
  ErrorPtr error;
  const FileDescriptor source = context_.host.openMedia(request.identifier(), &error);
  if (!source.valid()) {
    const bool isMissing = !error || (error->domain() == kPosixErrorDomain &&
                                      (error->code() == ENOENT || error->code() == ENOTDIR));
    fetched.error = isMissing ? Error::make(kFRErrorDomain, kFRErrorFileMissingAtHost,
                                            "the host does not have the file")
                              : Error::make(kFRErrorDomain, kFRErrorReadOrWrite, error->message());
    return fetched;
  }
  const std::uint64_t bytesBefore = progress_.bytesDone;
  fetched = context_.staging.take(source, [this](std::uint64_t bytes) {
    progress_.bytesDone += bytes;
    tell();
    return !context_.cancel.isCancelled();
  });
  if (fetched.path.empty()) progress_.bytesDone = bytesBefore;
  return fetched;
}

void TransferLoop::report(const FRAssetPtr& request, const Staging::Result& fetched) {
  const bool arrived = fetched.error == nullptr;
  const auto raised = context_.plugin.call([&](FRClient& client) {
    if (arrived) request->setPath(fetched.path);
    client.assetTransfer(request, arrived, fetched.error);
  });
  if (!arrived) {
    fail(*request, fetched.error->domain(), fetched.error->code(), fetched.error->message());
  }
  if (!raised) return;
  if (arrived) {
    context_.staging.drop(fetched.path);
    fail(*request, kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kPlugin),
         raised->name + ": " + raised->reason);
  }
}

void TransferLoop::fail(const FRAsset& request, std::string domain, std::int64_t code,
                        std::string reason) {
  allArrived_ = false;
  ++progress_.failures;
  result_.failed.push_back(
      SyncFailure{request.identifier(), std::move(domain), code, std::move(reason)});
}

void TransferLoop::tell() {
  if (context_.progress) context_.progress(progress_);
}

}  // namespace kx
