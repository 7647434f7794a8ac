#pragma once

#include <cstdint>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/foundation/Value.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

// From an asset to the albums and events that hold it, so that importing an asset costs no walk
// over every album. Made from the containers of a snapshot, which it keeps no part of: it must go
// before they do. Reading is safe from any thread.
class ContainerIndex {
 public:
  // Raises TypeError for an album or event whose fields have other types.
  explicit ContainerIndex(const KXSItemMap& albumsAndEvents);

  // The keys of the albums that list the asset and of the events of that identifier, each once, in
  // the order of the containers.
  std::vector<std::string_view> containersOf(std::string_view assetUUID,
                                             OptionalString eventUUID) const;

 private:
  std::vector<std::string_view> keys_;
  std::unordered_map<std::string_view, std::vector<std::uint32_t>> albumsByAsset_;
  std::unordered_map<std::string_view, std::vector<std::uint32_t>> eventsByUUID_;
};

}  // namespace kx
