#include "client/Memberships.h"

namespace kx {

std::uint32_t Memberships::numberOf(const Value& key) {
  if (const std::uint32_t* number = numbers_.find(key.stringValue())) return *number;
  const auto number = static_cast<std::uint32_t>(keys_.size());
  numbers_.set(key, number);
  keys_.push_back(key);
  atHost_.push_back(0);
  onDevice_.push_back(0);
  return number;
}

std::uint32_t Memberships::numberOf(std::string_view key) {
  if (const std::uint32_t* number = numbers_.find(key)) return *number;
  return numberOf(Value::string(key));
}

std::vector<Memberships::Membership> Memberships::membershipsIn(
    const KXSItemMap& albumsAndEvents, const OrderedMap<std::uint32_t>& pairsByUUID) {
  std::vector<Membership> found;
  for (const auto& entry : albumsAndEvents) {
    const auto* album = dynamic_cast<const KXSAlbum*>(entry.value.get());
    if (album == nullptr) continue;
    const std::optional<ArrayView> uuids = album->assetUUIDs();
    if (!uuids) continue;
    const std::uint32_t number = numberOf(entry.key);
    for (std::size_t i = 0; i < uuids->size(); ++i) {
      const std::uint32_t* pair = pairsByUUID.find(*uuids->stringAt(i, kKXSAlbumAssetUUIDsKey));
      if (pair != nullptr) found.push_back({*pair, number});
    }
  }
  return found;
}

void Memberships::build(const std::vector<AssetPair>& pairs, const KXSItemMap* albumsAndEvents) {
  OrderedMap<std::uint32_t> pairsByUUID;
  pairsByUUID.reserve(pairs.size());
  events_.assign(pairs.size(), kNone);
  for (std::size_t i = 0; i < pairs.size(); ++i) {
    pairsByUUID.set(pairs[i].uuid, static_cast<std::uint32_t>(i));
    const OptionalString event = pairs[i].host->eventUUID();
    if (event && !event->empty()) events_[i] = numberOf(*event);
  }
  std::vector<Membership> found;
  if (albumsAndEvents != nullptr) found = membershipsIn(*albumsAndEvents, pairsByUUID);

  starts_.assign(pairs.size() + 1, 0);
  for (const Membership& membership : found) ++starts_[membership.pair + 1];
  for (std::size_t i = 1; i < starts_.size(); ++i) starts_[i] += starts_[i - 1];
  std::vector<std::size_t> next = starts_;
  albums_.resize(found.size());
  for (const Membership& membership : found) albums_[next[membership.pair]++] = membership.album;
}

const MembershipChanges& Memberships::changesFor(std::size_t index,
                                                 std::span<const KXGenericAlbumPtr> onDevice) {
  ++round_;
  changes_.toLeave.clear();
  changes_.toJoin.clear();
  const std::span<const std::uint32_t> albums(albums_.data() + starts_[index],
                                              starts_[index + 1] - starts_[index]);
  if (events_[index] != kNone) atHost_[events_[index]] = round_;
  for (const std::uint32_t album : albums) atHost_[album] = round_;

  for (const KXGenericAlbumPtr& album : onDevice) {
    const OptionalString uuid = album->uuid();
    if (!uuid) continue;
    const std::uint32_t number = numberOf(*uuid);
    if (onDevice_[number] == round_) continue;
    onDevice_[number] = round_;
    if (atHost_[number] != round_) changes_.toLeave.push_back(keys_[number]);
  }

  const auto join = [this](std::uint32_t number) {
    if (onDevice_[number] == round_) return;
    onDevice_[number] = round_;
    changes_.toJoin.push_back(keys_[number]);
  };
  if (events_[index] != kNone) join(events_[index]);
  for (const std::uint32_t album : albums) join(album);
  return changes_;
}

}  // namespace kx
