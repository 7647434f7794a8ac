#pragma once

#include <memory>
#include <string>

#include "platform/files/FileSystem.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/Value.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

// Writes snapshot files from a snapshot's updates and deletes. No state; any thread. Raises
// InternalInconsistency for a null libraryUUID or libraryKind and for an item without item type.
class KXSTransportEncoder {
 public:
  static std::shared_ptr<KXSTransportEncoder> encoder() {
    return std::make_shared<KXSTransportEncoder>();
  }

  // The root dictionary. Never writes the error.
  Value encodeSnapshot(const KXSLibraryChangeSnapshot& snapshot, ErrorPtr* error);
  // Replaces the file whole with a binary property list; true when it was written.
  bool encodeSnapshotToFile(const KXSLibraryChangeSnapshot& snapshot, FileSystem& files,
                            const std::string& path, ErrorPtr* error);
};

}  // namespace kx
