#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/TextNumbers.h"
#include "platform/foundation/Value.h"

namespace kx {

// What the checks that compare a snapshot with a device need of it. Identifiers are views of texts
// of `root`; "" counts nowhere and is left out.
struct CheckedSnapshot {
  Value root;
  std::string libraryUUID;
  TextNumbers assetUUIDs;
  std::vector<std::string_view> containerUUIDs;  // albums and events, in file order
};

// Checks a snapshot whole, before anything is done with it: it is a property list within the
// limits, the library's UUID is there, every field has the type that its reader needs, numbers that
// are dates, coordinates or rectangles are finite. Only what no sync could work on is refused:
// unknown members, repeated identifiers and the like are the sync's own affair. Nullopt and one
// error (kSyncErrorDomain, kBadSnapshot) that names place, expected and found. Any thread.
std::optional<CheckedSnapshot> checkSnapshot(DataPtr bytes, ErrorPtr* error);

}  // namespace kx
