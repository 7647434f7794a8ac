#include "client/ContainerIndex.h"

#include <algorithm>
#include <iterator>

namespace kx {

void ContainerIndex::Places::add(std::string_view text, std::uint32_t place) {
  const std::uint32_t number = texts_.add(text);
  if (number == lasts_.size()) lasts_.push_back(TextNumbers::kNone);
  std::uint32_t& last = lasts_[number];
  if (last != TextNumbers::kNone && links_[last].place == place) return;
  links_.push_back({place, last});
  last = static_cast<std::uint32_t>(links_.size() - 1);
}

std::vector<std::uint32_t> ContainerIndex::Places::of(std::string_view text) const {
  std::vector<std::uint32_t> places;
  const std::uint32_t number = texts_.find(text);
  if (number == TextNumbers::kNone) return places;
  for (std::uint32_t link = lasts_[number]; link != TextNumbers::kNone;
       link = links_[link].before) {
    places.push_back(links_[link].place);
  }
  std::reverse(places.begin(), places.end());
  return places;
}

ContainerIndex::ContainerIndex(const KXSItemMap& albumsAndEvents)
    : albums_(0), events_(albumsAndEvents.size()) {
  keys_.reserve(albumsAndEvents.size());
  for (const auto& entry : albumsAndEvents) {
    const auto place = static_cast<std::uint32_t>(keys_.size());
    keys_.push_back(entry.key.stringValue());
    if (const auto* album = dynamic_cast<const KXSAlbum*>(entry.value.get())) {
      const std::optional<ArrayView> assets = album->assetUUIDs();
      if (!assets) continue;
      for (std::size_t i = 0; i < assets->size(); ++i) {
        albums_.add(*assets->stringAt(i, kKXSAlbumAssetUUIDsKey), place);
      }
    } else if (const auto* event = dynamic_cast<const KXSEvent*>(entry.value.get())) {
      if (const OptionalString uuid = event->uuid()) events_.add(*uuid, place);
    }
  }
}

std::vector<std::string_view> ContainerIndex::containersOf(std::string_view assetUUID,
                                                           OptionalString eventUUID) const {
  const std::vector<std::uint32_t> albums = albums_.of(assetUUID);
  const auto events = eventUUID ? events_.of(*eventUUID) : std::vector<std::uint32_t>();
  std::vector<std::uint32_t> places;
  places.reserve(albums.size() + events.size());
  std::merge(albums.begin(), albums.end(), events.begin(), events.end(),
             std::back_inserter(places));
  std::vector<std::string_view> keys;
  keys.reserve(places.size());
  for (const std::uint32_t place : places) keys.push_back(keys_[place]);
  return keys;
}

}  // namespace kx
