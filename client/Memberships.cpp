#include "client/Memberships.h"

#include <algorithm>

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

Memberships::Memberships(const KXSAssetMap& hostAssets, const KXSItemMap& albumsAndEvents) {
  std::vector<Membership> found;
  KXSAssetMap::Cursor cursor;
  for (const auto& entry : albumsAndEvents) {
    const std::uint32_t number = numberOf(entry.key);
    isEvent_.push_back(dynamic_cast<const KXSEvent*>(entry.value.get()) != nullptr);
    const auto* album = dynamic_cast<const KXSAlbum*>(entry.value.get());
    if (album == nullptr) continue;
    const std::optional<ArrayView> uuids = album->assetUUIDs();
    if (!uuids) continue;
    for (std::size_t i = 0; i < uuids->size(); ++i) {
      if (hostAssets.find(*uuids->stringAt(i, kKXSAlbumAssetUUIDsKey), cursor) == nullptr) continue;
      found.push_back({static_cast<std::uint32_t>(cursor.place()), number});
    }
  }
  starts_.assign(hostAssets.places() + 1, 0);
  for (const Membership& membership : found) ++starts_[membership.place + 1];
  for (std::size_t i = 1; i < starts_.size(); ++i) starts_[i] += starts_[i - 1];
  std::vector<std::uint32_t> next = starts_;
  albums_.resize(found.size());
  for (const Membership& membership : found) albums_[next[membership.place]++] = membership.album;
}

void Memberships::setPairs(const std::vector<AssetPair>& pairs) {
  pairs_.clear();
  pairs_.reserve(pairs.size());
  for (const AssetPair& pair : pairs) {
    const OptionalString event = pair.host->value->eventUUID();
    pairs_.emplace_back(static_cast<std::uint32_t>(pair.place),
                        event && !event->empty() ? numberOf(*event) : kNone);
  }
}

const MembershipChanges& Memberships::changesFor(std::size_t pair,
                                                 std::span<const KXGenericAlbumPtr> onDevice) {
  ++round_;
  changes_.toLeave.clear();
  changes_.toJoin.clear();
  const auto [place, event] = pairs_[pair];
  const std::span<const std::uint32_t> albums = albumsAt(place);
  if (event != kNone) atHost_[event] = round_;
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
  if (event != kNone) join(event);
  for (const std::uint32_t album : albums) join(album);
  return changes_;
}

std::vector<std::string_view> Memberships::containersOf(std::size_t place,
                                                        OptionalString event) const {
  const std::span<const std::uint32_t> albums = albumsAt(place);
  std::vector<std::uint32_t> numbers(albums.begin(), albums.end());
  const std::uint32_t* const number = event ? numbers_.find(*event) : nullptr;
  if (number != nullptr && *number < isEvent_.size() && isEvent_[*number]) {
    numbers.push_back(*number);
  }
  std::sort(numbers.begin(), numbers.end());
  numbers.erase(std::unique(numbers.begin(), numbers.end()), numbers.end());
  std::vector<std::string_view> keys;
  keys.reserve(numbers.size());
  for (const std::uint32_t each : numbers) keys.push_back(keys_[each].stringValue());
  return keys;
}

}  // namespace kx
