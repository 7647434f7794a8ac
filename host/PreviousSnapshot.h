#pragma once

#include <optional>
#include <string>
#include <unordered_map>
#include <unordered_set>

#include "host/FolderSnapshot.h"
#include "platform/foundation/Data.h"
#include "platform/foundation/Value.h"

namespace kx {

// What an earlier snapshot of the same folder says of files that cannot be read now, so that they
// can stay in the library just as they were. Any thread; the values keep the snapshot's bytes
// alive. Never raises: what makes no sense is as if it were not there.
class PreviousSnapshot {
 public:
  // Looks up the assets of those identifiers alone. Empty when the bytes are null, no property
  // list, or the snapshot of another library.
  PreviousSnapshot(const DataPtr& bytes, const std::string& libraryUUID,
                   const std::unordered_set<std::string>& assetUUIDs);

  // The asset as it was, for the file; nothing when it was not there.
  std::optional<FolderAsset> asset(const std::string& uuid, const ScannedFile& file) const;

 private:
  void take(const Value& item, const std::unordered_set<std::string>& assetUUIDs);
  std::optional<FolderAsset> recorded(const Value& record, const ScannedFile& file) const;

  std::unordered_map<std::string, Value> assets_;
  std::unordered_map<std::string, std::string> names_;  // of albums and events
};

}  // namespace kx
