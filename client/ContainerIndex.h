#pragma once

#include <cstdint>
#include <string_view>
#include <vector>

#include "platform/foundation/TextNumbers.h"
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
  // The places of the containers that go with one text, ascending.
  class Places {
   public:
    explicit Places(std::size_t expected) : texts_(expected) {}
    // Places come in ascending order; the same again counts once.
    void add(std::string_view text, std::uint32_t place);
    std::vector<std::uint32_t> of(std::string_view text) const;

   private:
    struct Link {
      std::uint32_t place;
      std::uint32_t before;  // its number, kNone for a text's first
    };
    TextNumbers texts_;
    std::vector<std::uint32_t> lasts_;  // by a text's number: that of its last link
    std::vector<Link> links_;
  };

  std::vector<std::string_view> keys_;
  Places albums_;  // by asset
  Places events_;  // by their own identifiers
};

}  // namespace kx
