#include <algorithm>
#include <limits>
#include <numeric>
#include <unordered_map>

#include "client/KXSyncClient.h"
#include "client/LogSource.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

constexpr std::size_t kNoPlace = std::numeric_limits<std::size_t>::max();

using HostIndex = std::unordered_map<std::string_view, std::size_t>;

// The synced containers of one kind, with the slots that they have in their device list.
class ContainersOfList {
 public:
  ContainersOfList(std::shared_ptr<KXManagedAlbumList> list, const char* missingMessage)
      : list_(std::move(list)), missingMessage_(missingMessage) {
    if (!list_) return;
    const std::span<const KXGenericAlbumPtr> albums = list_->albums();
    places_.reserve(albums.size());
    for (std::size_t i = 0; i < albums.size(); ++i) places_.emplace(albums[i].get(), i);
  }

  void add(const KXGenericAlbumPtr& container) {
    const auto place = places_.find(container.get());
    if (place == places_.end()) {
      KX_LOG(kClientSource, "_reconcileDeviceAlbumListSortingWithAlbums", LogLevel::kError,
             missingMessage_, container);
      return;
    }
    found_.push_back({container, place->second, kNoPlace});
  }

  // By host index; those without one come last, in their present order.
  void sortByHostIndex(const HostIndex& hostIndex) {
    for (Found& found : found_) {
      const OptionalString uuid = found.container->uuid();
      const auto index = uuid ? hostIndex.find(*uuid) : hostIndex.end();
      if (index != hostIndex.end()) found.hostIndex = index->second;
    }
    std::stable_sort(found_.begin(), found_.end(), [](const Found& a, const Found& b) {
      if (a.hostIndex != b.hostIndex) return a.hostIndex < b.hostIndex;
      return a.hostIndex == kNoPlace && a.place < b.place;
    });
  }

  KXManagedAlbumList* list() const { return list_.get(); }
  // Ascending.
  std::vector<std::size_t> indexes() const {
    std::vector<std::size_t> indexes;
    for (const Found& found : found_) indexes.push_back(found.place);
    std::sort(indexes.begin(), indexes.end());
    return indexes;
  }
  std::vector<KXGenericAlbumPtr> order() const {
    std::vector<KXGenericAlbumPtr> order;
    for (const Found& found : found_) order.push_back(found.container);
    return order;
  }

 private:
  struct Found {
    KXGenericAlbumPtr container;
    std::size_t place;
    std::size_t hostIndex;
  };
  std::shared_ptr<KXManagedAlbumList> list_;
  const char* missingMessage_;
  std::unordered_map<const KXGenericAlbum*, std::size_t> places_;
  std::vector<Found> found_;
};

// The position of every list member that has an identifier of its own; a shared one has none.
std::unordered_map<std::string_view, std::size_t> placesByUUID(
    std::span<const KXGenericAlbumPtr> albums) {
  std::unordered_map<std::string_view, std::size_t> places;
  for (std::size_t i = 0; i < albums.size(); ++i) {
    const OptionalString uuid = albums[i]->uuid();
    if (!uuid) continue;
    const auto [place, isNew] = places.emplace(*uuid, i);
    if (!isNew) place->second = kNoPlace;
  }
  return places;
}

}  // namespace

void KXSyncClient::_reconcileDeviceAlbumListSortingWithAlbums(const DeviceAlbumMap& onDevice,
                                                              const KXSItemList& tesselAlbumOrder) {
  ContainersOfList albums(library_->albumList(),
                          "===== ERROR ===== Didn't find Album %@ in album list");
  ContainersOfList events(library_->eventList(),
                          "===== ERROR ===== Didn't find Event %@ in event list");
  ContainersOfList faceAlbums(library_->facesAlbumList(),
                              "===== ERROR ===== Didn't find Face album %@ in face album list");
  for (const auto& entry : onDevice) {
    const KXGenericAlbumPtr& container = entry.value;
    switch (container->kindValue()) {
      case kKXAlbumKindSyncedAlbum:
        albums.add(container);
        break;
      case kKXAlbumKindSyncedEvent:
        events.add(container);
        break;
      case kKXAlbumKindSyncedFaceAlbum:
        faceAlbums.add(container);
        break;
      default:
        KX_LOG(kClientSource, "_reconcileDeviceAlbumListSortingWithAlbums", LogLevel::kInfo,
               "_reconcileDeviceAlbumListSortingWithAlbums found an album of an unexpected kind %@",
               container);
    }
  }

  HostIndex hostIndex;
  hostIndex.reserve(tesselAlbumOrder.size());
  for (std::size_t i = 0; i < tesselAlbumOrder.size(); ++i) {
    if (const OptionalString uuid = tesselAlbumOrder[i]->uuid()) hostIndex[*uuid] = i;
  }
  for (ContainersOfList* containers : {&albums, &events, &faceAlbums}) {
    if (containers->list() == nullptr) continue;
    containers->sortByHostIndex(hostIndex);
    _reorderAlbumListProxy(*containers->list(), containers->indexes(), containers->order());
  }
}

void KXSyncClient::_reorderAlbumListProxy(KXManagedAlbumList& list,
                                          const std::vector<std::size_t>& indexes,
                                          const std::vector<KXGenericAlbumPtr>& newOrder) {
  const std::span<const KXGenericAlbumPtr> albums = list.albums();
  if (albums.empty()) return;
  if (indexes.size() != newOrder.size()) {
    KX_LOG(kClientSource, "_reorderAlbumListProxy", LogLevel::kError,
           "ERROR in _reorderAlbumListProxy, different count for existingAlbumIndexes and "
           "newAlbumOrderArray");
    return;
  }

  // Members without an identifier of their own keep their slots: these are not handed out.
  const auto places = placesByUUID(albums);
  const auto placeOf = [&places](const KXGenericAlbum& album) {
    const OptionalString uuid = album.uuid();
    const auto place = uuid ? places.find(*uuid) : places.end();
    return place == places.end() ? kNoPlace : place->second;
  };
  std::vector<std::size_t> slots;
  for (const std::size_t index : indexes) {
    if (index < albums.size() && placeOf(*albums[index]) != kNoPlace) slots.push_back(index);
  }

  std::vector<std::size_t> newPlaces(albums.size());
  std::iota(newPlaces.begin(), newPlaces.end(), std::size_t{0});
  bool changed = false;
  std::size_t next = 0;
  for (const KXGenericAlbumPtr& container : newOrder) {
    const std::size_t place = placeOf(*container);
    if (place == kNoPlace || next == slots.size()) continue;
    const std::size_t slot = slots[next++];
    changed = changed || place != slot;
    newPlaces[place] = slot;
  }
  if (!changed) return;

  std::vector<std::size_t> sorted(albums.size());
  std::iota(sorted.begin(), sorted.end(), std::size_t{0});
  std::stable_sort(sorted.begin(), sorted.end(), [&newPlaces](std::size_t a, std::size_t b) {
    return newPlaces[a] < newPlaces[b];
  });
  std::vector<KXGenericAlbumPtr> arranged;
  arranged.reserve(albums.size());
  for (const std::size_t index : sorted) arranged.push_back(albums[index]);
  list.reorder(std::move(arranged));
}

void KXSyncClient::_persistAssetAlbumOrderStructures() {
  KXPhotoLibraryFramework& framework = platform_.photoLibrary();
  const std::string path = framework.pathToAssetAlbumOrderStructure();
  platform_.files().removeItem(path, nullptr);
  if (!hostWork_.assetOrder.valid()) startHostWork();
  const std::vector<std::uint8_t> bytes = hostWork_.assetOrder.get();
  if (bytes.empty() || !platform_.files().writeFileAtomically(path, bytes, nullptr)) {
    KX_LOG(kClientSource, "_persistAssetAlbumOrderStructures", LogLevel::kError,
           "Failed to write assetOrdersByAlbumUUID to path %@", path);
  }
  framework.clearAssetOrderByAbumUUIDs();
}

void KXSyncClient::_createAlbumUUIDToObjectIDMap(const DispatchGroupPtr& group) {
  submitBlock(group, [this] {
    albumURIs_.emplace();
    if (!albumsAndEvents_) return;
    albumURIs_->reserve(albumsAndEvents_->size());
    for (const auto& entry : *albumsAndEvents_) {
      const KXGenericAlbumPtr album = library_->albumWithUUID(entry.key.stringValue());
      if (!album) continue;
      const std::string uri = album->objectID().URIRepresentation();
      if (!uri.empty()) albumURIs_->set(entry.key, uri);
    }
  });
}

const std::string* KXSyncClient::_albumURIForAlbumUUID(OptionalString uuid) const {
  return uuid && albumURIs_ ? albumURIs_->find(*uuid) : nullptr;
}

}  // namespace kx
