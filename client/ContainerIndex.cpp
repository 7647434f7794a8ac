#include "client/ContainerIndex.h"

#include <algorithm>
#include <iterator>

namespace kx {

ContainerIndex::ContainerIndex(const KXSItemMap& albumsAndEvents) {
  keys_.reserve(albumsAndEvents.size());
  for (const auto& entry : albumsAndEvents) {
    const auto place = static_cast<std::uint32_t>(keys_.size());
    keys_.push_back(entry.key.stringValue());
    if (const auto* album = dynamic_cast<const KXSAlbum*>(entry.value.get())) {
      const std::optional<ArrayView> assets = album->assetUUIDs();
      if (!assets) continue;
      for (const Value& uuid : *assets) {
        std::vector<std::uint32_t>& places = albumsByAsset_[*uuid.asString(kKXSAlbumAssetUUIDsKey)];
        if (places.empty() || places.back() != place) places.push_back(place);
      }
    } else if (const auto* event = dynamic_cast<const KXSEvent*>(entry.value.get())) {
      if (const OptionalString uuid = event->uuid()) eventsByUUID_[*uuid].push_back(place);
    }
  }
}

std::vector<std::string_view> ContainerIndex::containersOf(std::string_view assetUUID,
                                                           OptionalString eventUUID) const {
  static const std::vector<std::uint32_t> kNone;
  const auto albums = albumsByAsset_.find(assetUUID);
  const auto& albumPlaces = albums == albumsByAsset_.end() ? kNone : albums->second;
  const auto events = eventUUID ? eventsByUUID_.find(*eventUUID) : eventsByUUID_.end();
  const auto& eventPlaces = events == eventsByUUID_.end() ? kNone : events->second;

  std::vector<std::uint32_t> places;
  places.reserve(albumPlaces.size() + eventPlaces.size());
  std::merge(albumPlaces.begin(), albumPlaces.end(), eventPlaces.begin(), eventPlaces.end(),
             std::back_inserter(places));
  std::vector<std::string_view> keys;
  keys.reserve(places.size());
  for (const std::uint32_t place : places) keys.push_back(keys_[place]);
  return keys;
}

}  // namespace kx
