#include "transport/KXSTransportDecoder.h"

#include <algorithm>
#include <array>

#include "platform/foundation/EntryPeek.h"
#include "platform/foundation/Limits.h"
#include "platform/foundation/PropertyList.h"
#include "platform/foundation/Text.h"
#include "transport/RecordLayouts.h"

namespace kx {
namespace {

enum class ItemClass { kAlbum, kAsset, kEvent };

struct ClassifiedItem {
  ItemClass itemClass;
  KXSItemPtr item;
};

ItemClass classOfType(std::string_view itemType) {
  if (itemType == kKXSTransportAssetItemType) return ItemClass::kAsset;
  if (itemType == kKXSTransportAlbumItemType) return ItemClass::kAlbum;
  if (itemType == kKXSTransportEventItemType) return ItemClass::kEvent;
  throw UnknownObjectType();
}

ClassifiedItem plainItem(const Value& dictionary) {
  dictionary.asDictionary("item");
  const Value type = dictionary[kKXSTransportItemTypeKey];
  if (!type.isString()) throw UnknownObjectType();
  switch (classOfType(type.stringValue())) {
    case ItemClass::kAlbum:
      return {ItemClass::kAlbum, KXSAlbum::initFromPropertyList(dictionary)};
    case ItemClass::kAsset:
      return {ItemClass::kAsset, KXSAsset::initFromPropertyList(dictionary)};
    default:
      return {ItemClass::kEvent, KXSEvent::initFromPropertyList(dictionary)};
  }
}

// What serves all items of one decoding.
struct Making {
  RecordLayouts layouts;
  RecordBlocks blocks;
};

ClassifiedItem itemFromPropertyList(Value dictionary, Making& making) {
  const RecordLayouts::Layout* layout = making.layouts.find(dictionary);
  if (layout == nullptr) return plainItem(dictionary);
  if (layout->itemType == RecordFields::kAbsent) throw UnknownObjectType();
  const EntryPeek type = EntryPeek::valueOf(dictionary, layout->itemType);
  if (type.kind() != Kind::kString) throw UnknownObjectType();
  switch (classOfType(type.text())) {
    case ItemClass::kAlbum:
      return {ItemClass::kAlbum,
              KXSAlbum::initFromPropertyList(std::move(dictionary), layout->album)};
    case ItemClass::kAsset:
      return {ItemClass::kAsset,
              KXSAsset::initFromPropertyList(std::move(dictionary), layout->asset, making.blocks)};
    default:
      return {ItemClass::kEvent,
              KXSEvent::initFromPropertyList(std::move(dictionary), layout->event)};
  }
}

std::string_view keyOf(const KXSItem& item) {
  const OptionalString uuid = item.uuid();
  if (!uuid) throw InternalInconsistency("item without \"uuid\" cannot be stored");
  return *uuid;
}

void checkCount(std::size_t count, std::uint64_t limit, std::string_view what) {
  if (count <= limit) return;
  throw InternalInconsistency("snapshot holds more than " + std::to_string(limit) + " " +
                              std::string(what));
}

// Inserts assets in their order, each some time after it was added: the map's table is much larger
// than the processor's caches, and what an insertion needs is fetched meanwhile.
class AssetQueue {
 public:
  explicit AssetQueue(KXSAssetMap& assets) : assets_(assets) {}

  // The key is the asset's.
  void add(std::string_view key, KXSAssetPtr asset) {
    __builtin_prefetch(key.data());
    Waiting& place = step();
    place.key = key;
    place.asset = std::move(asset);
  }
  // Inserts those that wait. Before this nothing is to be seen or thrown that comes after them.
  void finish() {
    for (std::size_t i = 0; i < kMostWaiting; ++i) step();
  }

 private:
  struct Waiting {
    std::string_view key;
    KXSAssetPtr asset;  // null: free
    std::uint64_t hash = 0;
  };
  static constexpr std::size_t kMostWaiting = 16;

  // Inserts the oldest and gives its place.
  Waiting& step() {
    Waiting& middle = waiting_[(steps_ + kMostWaiting / 2) % kMostWaiting];
    if (middle.asset) middle.hash = assets_.announce(middle.key);
    Waiting& oldest = waiting_[steps_++ % kMostWaiting];
    if (oldest.asset) {
      Value key = oldest.asset->uuidValue();
      assets_.setHashed(std::move(key), std::move(oldest.asset), oldest.hash);
      checkCount(assets_.size(), limits::kAssets, "assets");
    }
    return oldest;
  }

  KXSAssetMap& assets_;
  std::array<Waiting, kMostWaiting> waiting_;
  std::size_t steps_ = 0;
};

// The collections of one snapshot.
struct Collections {
  KXSAssetMapPtr assets = std::make_shared<KXSAssetMap>();
  KXSItemMapPtr containers = std::make_shared<KXSItemMap>();
  KXSItemListPtr ordered = std::make_shared<KXSItemList>();

  void add(ClassifiedItem classified, AssetQueue& queue) {
    const std::string_view key = keyOf(*classified.item);
    if (classified.itemClass == ItemClass::kAsset) {
      queue.add(key, std::static_pointer_cast<KXSAsset>(std::move(classified.item)));
      return;
    }
    ordered->push_back(classified.item);
    Value keptKey = classified.item->uuidValue();
    containers->set(std::move(keptKey), std::move(classified.item));
    checkCount(ordered->size(), limits::kContainers, "albums and events");
  }
};

// A list can name one item very often: more room than this is made as it is needed.
constexpr std::size_t kMostReserved = std::size_t{1} << 17;

Collections decodeUpdates(const Value& root, Making& making) {
  Collections collections;
  const auto updates = root[kKXSTransportUpdatesKey].asArray(kKXSTransportUpdatesKey);
  if (!updates) return collections;
  const std::size_t count = updates->size();
  collections.assets->reserve(std::min(count, kMostReserved));
  AssetQueue queue(*collections.assets);
  try {
    for (std::size_t i = 0; i < count; ++i) {
      updates->prefetchBehind(i);
      collections.add(itemFromPropertyList((*updates)[i], making), queue);
    }
  } catch (...) {
    queue.finish();  // the first item that cannot be stored is the one that counts
    throw;
  }
  queue.finish();
  return collections;
}

KXSItemMapPtr decodeDeletes(const Value& root, Making& making) {
  auto items = std::make_shared<KXSItemMap>();
  const auto deletes = root[kKXSTransportDeletesKey].asArray(kKXSTransportDeletesKey);
  if (!deletes) return items;
  const std::size_t count = deletes->size();
  for (std::size_t i = 0; i < count; ++i) {
    KXSItemPtr item = itemFromPropertyList((*deletes)[i], making).item;
    keyOf(*item);
    Value key = item->uuidValue();
    items->set(std::move(key), std::move(item));
    checkCount(items->size(), limits::kAssets + limits::kContainers, "deletes");
  }
  return items;
}

OptionalString nameOf(const KXSItem& item) {
  if (const auto* album = dynamic_cast<const KXSAlbum*>(&item)) return album->name();
  if (const auto* event = dynamic_cast<const KXSEvent*>(&item)) return event->name();
  return std::nullopt;
}

KXSItemListPtr sortedByName(const KXSItemList& items) {
  struct Named {
    OptionalString name;
    const KXSItemPtr* item;
  };
  std::vector<Named> named;
  named.reserve(items.size());
  for (const KXSItemPtr& item : items) named.push_back(Named{nameOf(*item), &item});
  std::stable_sort(named.begin(), named.end(),
                   [](const Named& a, const Named& b) { return compareNames(a.name, b.name) < 0; });
  auto sorted = std::make_shared<KXSItemList>();
  sorted->reserve(items.size());
  for (const Named& entry : named) sorted->push_back(*entry.item);
  return sorted;
}

ErrorPtr readFailure(const ErrorPtr& cause) {
  return Error::make(kPropertyListErrorDomain, static_cast<std::int64_t>(PropertyListError::kIo),
                     "E_PLIST_IO: " + (cause ? cause->message() : std::string("cannot be read")));
}

}  // namespace

DataPtr readPropertyListBytes(FileSystem& files, const std::string& path, ErrorPtr* error) {
  ErrorPtr cause;
  DataPtr bytes = files.readFile(path, &cause);
  if (!bytes) setError(error, readFailure(cause));
  return bytes;
}

Value readPropertyListFile(FileSystem& files, const std::string& path, ErrorPtr* error) {
  DataPtr bytes = readPropertyListBytes(files, path, error);
  return bytes ? readPropertyList(std::move(bytes), error) : Value();
}

KXSLibraryChangeSnapshotPtr KXSTransportDecoder::decodeSnapshotFromFile(FileSystem& files,
                                                                        const std::string& path,
                                                                        ErrorPtr* error) {
  return decodeSnapshotFromPropertyList(readPropertyListFile(files, path, error), error);
}

KXSLibraryChangeSnapshotPtr KXSTransportDecoder::decodeSnapshotFromPropertyList(
    const Value& root, ErrorPtr* /*error*/) {
  auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
  snapshot->setLibraryUUIDValue(root[kKXSTransportLibraryUUIDKey]);
  const Value kind = root[kKXSTransportLibraryKindKey];
  snapshot->setLibraryKindValue(kind);
  snapshot->setIsFolderSync(kind.isString() &&
                            kind.stringValue() == kKXSTransportLibraryKindFolderKey);
  Making making;
  Collections collections = decodeUpdates(root, making);
  snapshot->setAssetsByUUID(std::move(collections.assets));
  snapshot->setAlbumsAndEventsByUUID(std::move(collections.containers));
  snapshot->setOrderedAlbums(std::move(collections.ordered));
  snapshot->setUpdates(nullptr);
  snapshot->setDeletes(decodeDeletes(root, making));
  if (snapshot->isFolderSync()) {
    snapshot->setOrderedAlbums(sortedByName(*snapshot->orderedAlbums()));
  }
  return snapshot;
}

KXSItemPtr KXSTransportDecoder::_itemFromPropertyList(const Value& dictionary) {
  return plainItem(dictionary).item;
}

}  // namespace kx
