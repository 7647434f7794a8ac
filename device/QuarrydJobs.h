#pragma once

#include <optional>
#include <set>
#include <string>
#include <vector>

#include "device/Quarryd.h"

namespace kx {

// One file on its way into the library.
struct Quarryd::Import {
  KXSyncSaveJob::Fields fields;
  WholeAssetRow row;
  std::vector<FaceRow> faces;
  std::vector<RowId> albums;
  std::string extension;
  std::optional<RowId> replaced;  // the row of the asset that is there already
  std::string replacedPath;
  bool foreign = false;  // that asset is the device's own
  const std::string& uuid() const { return row.asset.uuid; }
  const std::string& source() const { return *fields.originalAssetPath; }
};

// What a list of jobs handed over together has come to.
struct Quarryd::HandOver {
  std::vector<Import> waiting;  // the next sub-batch
  std::uint64_t waitingBytes = 0;
  std::set<std::string> waitingUUIDs;
  std::set<std::string> namedPaths;  // of every import so far
  std::size_t imported = 0;
  ErrorPtr outcome;
};

}  // namespace kx
