#pragma once

#include <nlohmann/json.hpp>

#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

// A snapshot as JSON: "libraryUUID", "libraryKind", "isFolderSync", "orderedAlbums" (transport
// dictionaries in order), "assets" and "deletes" (transport dictionaries by identifier, in the
// snapshot's order); null where the snapshot has null. Raises TypeError for a library identifier or
// kind that is no text.
nlohmann::ordered_json snapshotJson(const KXSLibraryChangeSnapshot& snapshot);

// A nullable map from identifier to item as transport dictionaries.
template <typename Map>
nlohmann::ordered_json itemMapJson(const std::shared_ptr<Map>& items);

}  // namespace kx
