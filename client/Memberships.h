#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/foundation/OrderedMap.h"
#include "platform/library/KXManagedObjects.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

// One synced asset that host and device both have: the device's, in a list that outlives this, and
// the host's with its place in the map of the host's assets.
struct AssetPair {
  KXManagedAssetPtr* device = nullptr;
  const KXSAssetMap::Entry* host = nullptr;
  std::size_t place = 0;
};

// The containers that one asset must leave and join, by key.
struct MembershipChanges {
  std::vector<Value> toLeave;
  std::vector<Value> toJoin;
};

// Which containers hold each asset of the host, and how that differs from the device. Constant time
// per asset and membership. An asset goes by its place in the map of the host's assets, a container
// by its key, which is its UUID. Used on one thread after the other.
class Memberships {
 public:
  // In the host's albums. Raises TypeError for an album whose list is none of texts. Keeps no part
  // of either map but the keys of the containers.
  Memberships(const KXSAssetMap& hostAssets, const KXSItemMap& albumsAndEvents);
  // An asset's event counts as a container, known or not, unless its identifier is empty.
  void setPairs(const std::vector<AssetPair>& pairs);
  // For one of these pairs, whose device albums are `onDevice`. The result is good until the next
  // call.
  const MembershipChanges& changesFor(std::size_t pair,
                                      std::span<const KXGenericAlbumPtr> onDevice);
  // The keys of the albums that list the asset at a place of that map, and of the event of that
  // identifier, each once, in the order of the containers. Good until the next call of another
  // function.
  std::vector<std::string_view> containersOf(std::size_t place, OptionalString event) const;

 private:
  static constexpr std::uint32_t kNone = 0xFFFFFFFF;
  struct Membership {
    std::uint32_t place;
    std::uint32_t album;
  };

  std::uint32_t numberOf(const Value& key);
  std::uint32_t numberOf(std::string_view key);
  // In the order of the containers.
  std::span<const std::uint32_t> albumsAt(std::size_t place) const {
    return {albums_.data() + starts_[place], albums_.data() + starts_[place + 1]};
  }

  OrderedMap<std::uint32_t> numbers_;  // container key to its number; the host's come first
  std::vector<Value> keys_;            // by number
  std::vector<bool> isEvent_;          // by number, of the host's containers
  // By pair: its place in the map of the host's assets, and its event's number or kNone.
  std::vector<std::pair<std::uint32_t, std::uint32_t>> pairs_;
  std::vector<std::uint32_t> starts_;  // by place: where its albums start in albums_
  std::vector<std::uint32_t> albums_;  // album numbers, in the order of the containers
  std::vector<std::size_t> atHost_;    // by number: the round that last found it there
  std::vector<std::size_t> onDevice_;
  std::size_t round_ = 0;
  MembershipChanges changes_;
};

}  // namespace kx
