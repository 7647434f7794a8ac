#pragma once

namespace kx {

// Where daemon, plug-in and photo library meet: absolute device paths. Literals: any thread.

// The snapshot of the sync under way, put there by the daemon.
inline constexpr const char* kKXSnapshotPath = "/var/mobile/Media/Photos/Sync/PhotoLibrary.plist";
// The snapshot of the last completed sync, kept by the photo library.
inline constexpr const char* KXPreviousMetadataSyncFilePath =
    "/var/mobile/Media/Photos/Sync/PhotoLibrary.plist.lastsynced";
// Names the library of the last snapshot that was reconciled; written by the plug-in.
inline constexpr const char* kKXCurrentLibraryUUIDPath =
    "/var/mobile/Media/Photos/Sync/CurrentLibraryUUID.plist";

}  // namespace kx
