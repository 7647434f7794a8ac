#pragma once

#include <memory>
#include <string>

#include "platform/files/FileSystem.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/Exceptions.h"
#include "platform/foundation/Value.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

class RecordLayouts;

// An item of the snapshot file is neither asset, album nor event.
class UnknownObjectType : public InternalInconsistency {
 public:
  UnknownObjectType() : InternalInconsistency("Unknown object type") {}
  const char* sourceFile() const { return "KXSTransportDecoder"; }
  int line() const { return 137; }
};

// The property list in a device file; null and the reader's error when there is none. A file that
// cannot be read is PropertyListError::kIo.
Value readPropertyListFile(FileSystem& files, const std::string& path, ErrorPtr* error);
// Its bytes alone.
DataPtr readPropertyListBytes(FileSystem& files, const std::string& path, ErrorPtr* error);

// Reads snapshot files. No state; any thread. Results are never null: an unreadable file gives a
// snapshot without identifier and kind, and the reader's error. Raises InternalInconsistency for an
// item of unknown type or without identifier, TypeError for an item list or item of another type.
class KXSTransportDecoder {
 public:
  static std::shared_ptr<KXSTransportDecoder> decoder() {
    return std::make_shared<KXSTransportDecoder>();
  }
  virtual ~KXSTransportDecoder() = default;

  // The file is read once; strings stay views of its bytes. A file that cannot be read is
  // PropertyListError::kIo.
  virtual KXSLibraryChangeSnapshotPtr decodeSnapshotFromFile(FileSystem& files,
                                                             const std::string& path,
                                                             ErrorPtr* error);
  // Never writes the error. A root that is null or no dictionary gives an empty snapshot.
  virtual KXSLibraryChangeSnapshotPtr decodeSnapshotFromPropertyList(const Value& root,
                                                                     ErrorPtr* error);
  // An album, an asset or an event.
  KXSItemPtr _itemFromPropertyList(const Value& dictionary);
};

}  // namespace kx
