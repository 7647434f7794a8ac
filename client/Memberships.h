#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "platform/foundation/OrderedMap.h"
#include "platform/library/KXManagedObjects.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

// One synced asset that host and device both have.
struct AssetPair {
  Value uuid;
  KXManagedAssetPtr device;
  const KXSAsset* host = nullptr;
};

// The containers that one asset must leave and join, by key.
struct MembershipChanges {
  std::vector<Value> toLeave;
  std::vector<Value> toJoin;
};

// Which containers hold each of a run of assets at the host, and how that differs from the device.
// Constant time per asset and membership. Used on one thread.
class Memberships {
 public:
  // `albumsAndEvents` may be null. An asset's event counts as a container, known or not, unless its
  // identifier is empty. Raises TypeError for an album whose list is none of texts.
  void build(const std::vector<AssetPair>& pairs, const KXSItemMap* albumsAndEvents);
  // For the pair at `index`, whose device albums are `onDevice`. The result is good until the next
  // call.
  const MembershipChanges& changesFor(std::size_t index,
                                      std::span<const KXGenericAlbumPtr> onDevice);

 private:
  static constexpr std::uint32_t kNone = 0xFFFFFFFF;
  struct Membership {
    std::uint32_t pair;
    std::uint32_t album;
  };

  std::vector<Membership> membershipsIn(const KXSItemMap& albumsAndEvents,
                                        const OrderedMap<std::uint32_t>& pairsByUUID);
  std::uint32_t numberOf(const Value& key);
  std::uint32_t numberOf(std::string_view key);

  OrderedMap<std::uint32_t> numbers_;  // container key to its number
  std::vector<Value> keys_;            // by number
  std::vector<std::uint32_t> events_;  // by pair: its event's number or kNone
  std::vector<std::size_t> starts_;    // by pair: where its albums start in albums_
  std::vector<std::uint32_t> albums_;  // album numbers, in the order of the containers
  std::vector<std::size_t> atHost_;    // by number: the round that last found it there
  std::vector<std::size_t> onDevice_;
  std::size_t round_ = 0;
  MembershipChanges changes_;
};

}  // namespace kx
