#include "daemon/RunErrors.h"

#include <csignal>

#include "platform/foundation/Text.h"

namespace kx {

ErrorPtr syncError(SyncErrorCode code, const std::string& message) {
  return Error::make(kSyncErrorDomain, static_cast<std::int64_t>(code),
                     escapeControlCharacters(message));
}

ErrorPtr prefixed(const std::string& prefix, const Error& error) {
  const std::string text = error.message().empty() ? error.description() : error.message();
  return Error::make(error.domain(), error.code(), escapeControlCharacters(prefix + ": " + text));
}

ErrorPtr raisedError(const std::string& call, const RaisedException& raised) {
  return syncError(SyncErrorCode::kPlugin, call + ": " + raised.name + ": " + raised.reason);
}

ErrorPtr interruptedError(int signal) {
  return syncError(SyncErrorCode::kCancelled,
                   signal == SIGINT ? "interrupted; the same command goes on from here"
                                    : "terminated; the same command goes on from here");
}

}  // namespace kx
