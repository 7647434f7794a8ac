#pragma once

#include "platform/sync/SyncPaths.h"

// Where things lie on the device: absolute device paths without a trailing slash.
namespace kx::device_paths {

inline constexpr const char* kMobileHome = "/var/mobile";
inline constexpr const char* kMedia = "/var/mobile/Media";
inline constexpr const char* kDcim = "/var/mobile/Media/DCIM";
inline constexpr const char* kPhotoData = "/var/mobile/Media/PhotoData";
inline constexpr const char* kCaches = "/var/mobile/Media/PhotoData/Caches";
inline constexpr const char* kCascades = "/var/mobile/Media/PhotoCascades";
inline constexpr const char* kSyncedAssets = "/var/mobile/Media/PhotoData/SyncedAssets";
inline constexpr const char* kFaceThumbnails = "/var/mobile/Media/PhotoData/FaceThumbnails";
inline constexpr const char* kSyncInfo = "/var/mobile/Media/PhotoData/SyncInfo.plist";
inline constexpr const char* kAssetOrder = "/var/mobile/Media/PhotoData/AssetOrder.plist";
inline constexpr const char* kDatabase = "/var/mobile/Media/PhotoData/Photos.sqlite";
// Held (flock) by the one process that writes. Its text is the holder's process id, or "clean".
inline constexpr const char* kLock = "/var/mobile/Media/PhotoData/Photos.lock";
inline constexpr const char* kRestoreContext =
    "/var/mobile/Media/PhotoData/Caches/restoreContext.plist";
// There while a restore from backup is under way, with the backup's identity.
inline constexpr const char* kRestoreMarker = "/var/mobile/Media/PhotoData/RestoreMarker.plist";
inline constexpr const char* kSync = "/var/mobile/Media/Photos/Sync";
inline constexpr const char* kSnapshot = kKXSnapshotPath;
inline constexpr const char* kLastSynced = KXPreviousMetadataSyncFilePath;
inline constexpr const char* kCurrentLibraryUUID = kKXCurrentLibraryUUIDPath;
// Transferred files until quarryd takes them; on the same file system as kSyncedAssets.
inline constexpr const char* kStaging = "/var/mobile/Media/Photos/Sync/Staging";
inline constexpr const char* kTemporary = "/tmp";

}  // namespace kx::device_paths
