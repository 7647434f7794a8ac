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

// Reads only. Null on success; an error when the library cannot be read, since a check that cannot
// be made counts as failed. Blocks on the library's queue; not for use on it.
ErrorPtr compareWithDevice(const CheckedSnapshot& snapshot, Platform& platform,
                           DeviceComparison* comparison);

// Each null when the sync may go on, else what stops it (kSyncErrorDomain).
ErrorPtr refuseDeviceMadeContainers(const DeviceComparison& comparison);
// Stops a sync that takes away more than half of the synced assets and more than 50, and one whose
// snapshot lists no asset while the device has synced ones.
ErrorPtr guardAgainstDeletes(const CheckedSnapshot& snapshot, const DeviceComparison& comparison);
// Stops a sync whose new files cannot fit: bytes needed, free and missing are in the text.
ErrorPtr refuseWithoutSpace(const DeviceComparison& comparison, HostLink& host,
                            const SyncOptions& options);

}  // namespace kx
