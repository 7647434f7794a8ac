#pragma once

#include <vector>

#include "backup/BackupManifest.h"
#include "device/ReferenceDevice.h"

namespace kx {

// The albums of a device that a backup keeps: those that the device itself made, in the order of
// their lists, with their members that the device itself made.
std::vector<BackupAlbum> ownAlbums(const DeviceDump& dump);

}  // namespace kx
