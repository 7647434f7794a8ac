#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "daemon/DeviceChecks.h"
#include "daemon/HostLink.h"
#include "daemon/SyncRunner.h"
#include "device/LibraryDifference.h"

namespace kx {

// What a sync would do, found by running it on a device that keeps every change in memory.
struct SyncPlan {
  struct Request {
    std::string uuid;
    std::optional<std::string> caption;
    std::optional<std::int64_t> size;  // bytes; nothing when the host does not know it
  };

  // How that sync would end, as far as it can be told, and what it would count. When a check would
  // stop it before it changes anything, the counts are those of a sync that is let pass.
  SyncResult result;
  LibraryDifference difference;
  std::vector<Request> requests;    // files that it would bring, in its order
  std::uint64_t bytesToBring = 0;   // of those that the host can give
  std::uint64_t bytesToFree = 0;    // of the files that go, replaced ones too
  std::optional<GuardFacts> guard;  // when the guard would stop it
  std::optional<SpaceFacts> space;  // when the device is too small
  ErrorPtr stop;                    // the first of the two
};

// Runs the real plug-in over the device at options.deviceRoot and changes nothing there, nor makes
// it when it is missing. Whatever ends it is in the result, with the exit code.
SyncPlan planSync(HostLink& host, const SyncOptions& options, const LogSinks& logs,
                  const SyncProgressCallback& progress, const CancelToken& cancel);

}  // namespace kx
