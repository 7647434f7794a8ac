#pragma once

#include <string>

#include "platform/foundation/Error.h"
#include "platform/foundation/Value.h"
#include "platform/sync/SyncPaths.h"

namespace kx {

class FileSystem;

// Holds what the current library file was before a reconcile for another library.
inline constexpr const char* kLibraryMarkerPath =
    "/var/mobile/Media/Photos/Sync/.CurrentLibraryUUID.before";

// Keeps a reconcile that is cut off from looking like a finished change of library. The reconcile
// names the new library on the device before it has worked on it, so a copy of the old name is put
// aside first and put back unless the reconcile ended well. All on one thread.
class LibrarySwitch {
 public:
  explicit LibrarySwitch(FileSystem& files) : files_(files) {}

  // Puts the current library file aside, unless it already names `newLibraryUUID`, when putting it
  // back would change nothing. Null on success.
  ErrorPtr begin(const std::string& newLibraryUUID);
  // The reconcile ended well: forgets the copy.
  ErrorPtr commit();
  // Puts back what a begin without commit left, be it of an earlier run. Nothing happens without
  // such a copy; one that cannot be read is dropped.
  ErrorPtr rollBack();

 private:
  FileSystem& files_;
};

// The property list in a device file; null when it is missing or malformed.
Value readDevicePropertyList(FileSystem& files, const std::string& path);

}  // namespace kx
