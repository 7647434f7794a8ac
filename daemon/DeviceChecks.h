#pragma once

#include <cstdint>
#include <string_view>
#include <vector>

#include "daemon/HostLink.h"
#include "daemon/SnapshotChecker.h"
#include "daemon/SyncRunner.h"

namespace kx {

// What a checked snapshot means for a device, read through a library object of its own.
struct DeviceComparison {
  std::size_t syncedAssets = 0;             // on the device
  std::size_t unlisted = 0;                 // of those, the ones that the snapshot does not list
  std::vector<std::string_view> newAssets;  // listed, not on the device; views as the snapshot's
  std::string deviceMadeContainer;  // a listed container with a device-made album's UUID, or ""
};

// What a sync would take away: the guard's figures.
struct GuardFacts {
  std::size_t syncedAssets = 0;
  std::size_t deletes = 0, photos = 0, videos = 0;  // deletes: photos and videos together
  bool listsNone = false;                           // the host lists no asset at all
};

// Bytes. needed: of the files that are to come; kept: what has to stay free beside them.
struct SpaceFacts {
  std::uint64_t needed = 0, kept = 0, free = 0, missing = 0;
};

// Reads only. Null on success; an error when the library cannot be read, since a check that cannot
// be made counts as failed. Blocks on the library's queue; not for use on it.
ErrorPtr compareWithDevice(const CheckedSnapshot& snapshot, Platform& platform,
                           DeviceComparison* comparison);

// Each null when the sync may go on, else what stops it (kSyncErrorDomain).
ErrorPtr refuseDeviceMadeContainers(const DeviceComparison& comparison);
// Stops a sync that takes away more than half of the synced assets and more than 50, and one whose
// snapshot lists no asset while the device has synced ones. Null when it may pass.
std::optional<GuardFacts> guardAgainstDeletes(const CheckedSnapshot& snapshot,
                                              const DeviceComparison& comparison,
                                              ReferenceDevice& device);
ErrorPtr guardError(const GuardFacts& facts);
// Stops a sync whose new files cannot fit, even when those of the assets that go have made room.
std::optional<SpaceFacts> refuseWithoutSpace(const CheckedSnapshot& snapshot,
                                             const DeviceComparison& comparison, HostLink& host,
                                             ReferenceDevice& device, const SyncOptions& options);
// Whether files of so many bytes fit: with what is missing when they do not.
std::optional<SpaceFacts> shortage(std::uint64_t needed, std::uint64_t kept, std::uint64_t free);
// "no space left on the device: " and the figures.
ErrorPtr spaceError(const SpaceFacts& facts);

}  // namespace kx
