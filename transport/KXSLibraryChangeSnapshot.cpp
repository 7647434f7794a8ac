#include "transport/KXSLibraryChangeSnapshot.h"

#include <typeinfo>

#include "platform/foundation/Exceptions.h"
#include "platform/sync/FRLog.h"
#include "records/RecordArchives.h"

namespace kx {
namespace {

// Enough for any log; the rest of a large map is left out.
constexpr std::size_t kMostDescribedBytes = 1U << 16;

template <typename Pointer>
std::size_t countOf(const Pointer& collection) {
  return collection ? collection->size() : 0;
}

std::string describeItems(const KXSItemMapPtr& items) {
  if (!items) return "(null)";
  std::string text = "{\n";
  for (const auto& entry : *items) {
    if (text.size() > kMostDescribedBytes) return text + "...";
    text += "    \"" + entry.key.description() + "\" = " + entry.value->description() + ";\n";
  }
  return text + "}";
}

std::shared_ptr<ArchivableMap> archivableMap(const KXSItemMapPtr& items) {
  if (!items) return nullptr;
  auto map = std::make_shared<ArchivableMap>();
  map->reserve(items->size());
  for (const auto& entry : *items) map->set(entry.key, entry.value);
  return map;
}

KXSItemMapPtr itemMap(const std::shared_ptr<ArchivableMap>& map, std::string_view key) {
  if (!map) return nullptr;
  auto items = std::make_shared<KXSItemMap>();
  items->reserve(map->size());
  for (const auto& entry : *map) {
    auto item = std::dynamic_pointer_cast<KXSItem>(entry.value);
    if (!item) {
      throw TypeError(key, "KXSItem", entry.value ? entry.value->archiveClassName() : "null");
    }
    items->set(entry.key, std::move(item));
  }
  return items;
}

// Null-tolerant equality whatever the values' types: comparing snapshots never raises.
bool equalValues(const Value& first, const Value& second) { return first == second; }

bool equalItems(const KXSItem& item, const KXSItem& other) {
  if (typeid(item) != typeid(other)) return false;
  if (const auto* album = dynamic_cast<const KXSAlbum*>(&item)) {
    return album->isEqualToAlbum(&other);
  }
  const auto* event = dynamic_cast<const KXSEvent*>(&item);
  return event != nullptr && event->isEqualToEvent(&other);
}

void logDifference(const char* message) {
  KX_LOG("KXSLibraryChangeSnapshot", "isEqualToSnapshot", LogLevel::kDebug, message);
}

}  // namespace

KXSLibraryChangeSnapshotPtr KXSLibraryChangeSnapshot::init() {
  auto snapshot = std::make_shared<KXSLibraryChangeSnapshot>();
  snapshot->updates_ = std::make_shared<KXSItemMap>();
  snapshot->deletes_ = std::make_shared<KXSItemMap>();
  snapshot->libraryUUID_ = Value::string("");
  snapshot->libraryKind_ = Value::string("");
  snapshot->orderedAlbums_ = std::make_shared<KXSItemList>();
  snapshot->albumsAndEventsByUUID_ = std::make_shared<KXSItemMap>();
  snapshot->assetsByUUID_ = std::make_shared<KXSAssetMap>();
  return snapshot;
}

KXSLibraryChangeSnapshotPtr KXSLibraryChangeSnapshot::initWithCoder(KeyedUnarchiver& coder) {
  auto snapshot = std::make_shared<KXSLibraryChangeSnapshot>();
  snapshot->updates_ =
      itemMap(coder.decodeObjectMap(kKXSLibrarySnapshotUpdatesKey), kKXSLibrarySnapshotUpdatesKey);
  snapshot->deletes_ =
      itemMap(coder.decodeObjectMap(kKXSLibrarySnapshotDeletesKey), kKXSLibrarySnapshotDeletesKey);
  snapshot->libraryUUID_ = coder.decodeValue(kKXSLibraryChangeSnapshotLibraryUUIDKey);
  snapshot->libraryKind_ = coder.decodeValue(kKXSLibraryChangeSnapshotLibraryKindKey);
  return snapshot;
}

std::string KXSLibraryChangeSnapshot::description() const {
  return "KXSLibraryChangeSnapshot, libraryUUID: " + libraryUUID_.description() +
         " libraryKind:" + libraryKind_.description() + "\nupdates: " + describeItems(updates_) +
         "\ndeletes: " + describeItems(deletes_);
}

void KXSLibraryChangeSnapshot::encodeWithCoder(KeyedArchiver& coder) const {
  coder.encodeObjectMap(kKXSLibrarySnapshotUpdatesKey, archivableMap(updates_).get());
  coder.encodeObjectMap(kKXSLibrarySnapshotDeletesKey, archivableMap(deletes_).get());
  coder.encodeValue(kKXSLibraryChangeSnapshotLibraryUUIDKey, libraryUUID_);
  coder.encodeValue(kKXSLibraryChangeSnapshotLibraryKindKey, libraryKind_);
}

bool KXSLibraryChangeSnapshot::hasChangedObjects() const {
  return countOf(updates_) > 0 || countOf(deletes_) > 0;
}

std::vector<std::string> KXSLibraryChangeSnapshot::keyPathsForValuesAffectingValueForKey(
    std::string_view key) {
  if (key == "hasChangedObjects") return {"updates", "deletes"};
  return {};
}

bool KXSLibraryChangeSnapshot::isEqualToSnapshot(const KXSLibraryChangeSnapshot* other) const {
  if (other == nullptr) return false;
  if (other == this) return true;
  if (!equalValues(libraryKind_, other->libraryKind_)) {
    logDifference("snapshot libraryKind not equal");
    return false;
  }
  if (!equalValues(libraryUUID_, other->libraryUUID_)) {
    logDifference("snapshot libraryUUID not equal");
    return false;
  }
  if (countOf(orderedAlbums_) != countOf(other->orderedAlbums_)) {
    logDifference("snapshot orderedAlbums count not equal");
    return false;
  }
  if (!hasEqualAlbums(*other)) {
    logDifference("snapshot albums not equal");
    return false;
  }
  if (countOf(assetsByUUID_) != countOf(other->assetsByUUID_)) {
    logDifference("snapshot assetsByUUID count not equal");
    return false;
  }
  return hasEquivalentAssets(*other);
}

bool KXSLibraryChangeSnapshot::isEqualToTwin() const {
  if (!equalValues(libraryKind_, libraryKind_)) {
    logDifference("snapshot libraryKind not equal");
    return false;
  }
  if (!equalValues(libraryUUID_, libraryUUID_)) {
    logDifference("snapshot libraryUUID not equal");
    return false;
  }
  static const KXSItemList kNoItems;
  for (const KXSItemPtr& item : orderedAlbums_ ? *orderedAlbums_ : kNoItems) {
    const auto* album = dynamic_cast<const KXSAlbum*>(item.get());
    const auto* event = dynamic_cast<const KXSEvent*>(item.get());
    if (album != nullptr ? album->hasEqualFields(*album)
                         : event != nullptr && event->hasEqualFields(*event)) {
      continue;
    }
    logDifference("snapshot albums not equal");
    return false;
  }
  static const KXSAssetMap kNoAssets;
  for (const auto& entry : assetsByUUID_ ? *assetsByUUID_ : kNoAssets) {
    if (!entry.value->hasEquivalentFields(*entry.value)) return false;
  }
  return true;
}

bool KXSLibraryChangeSnapshot::hasEqualAlbums(const KXSLibraryChangeSnapshot& other) const {
  for (std::size_t i = 0; i < countOf(orderedAlbums_); ++i) {
    if (!equalItems(*(*orderedAlbums_)[i], *(*other.orderedAlbums_)[i])) return false;
  }
  return true;
}

bool KXSLibraryChangeSnapshot::hasEquivalentAssets(const KXSLibraryChangeSnapshot& other) const {
  if (countOf(assetsByUUID_) == 0) return true;
  // Both maps mostly are in the same order: then no look-up is needed.
  auto guess = other.assetsByUUID_->begin();
  const auto end = other.assetsByUUID_->end();
  for (const auto& entry : *assetsByUUID_) {
    const KXSAssetPtr* asset = nullptr;
    if (guess != end && guess->key.stringValue() == entry.key.stringValue()) {
      asset = &guess->value;
    } else {
      asset = other.assetsByUUID_->find(entry.key.stringValue());
    }
    if (guess != end) ++guess;
    // The other's asset is asked, so that its missing location is the one that counts.
    if (asset == nullptr || !(*asset)->isEquivalentTo(entry.value)) return false;
  }
  return true;
}

bool KXSLibraryChangeSnapshot::stringEqualsString(OptionalString first, OptionalString second) {
  return first == second;
}

bool KXSLibraryChangeSnapshot::numberEqualsNumber(const std::optional<Number>& first,
                                                  const std::optional<Number>& second) {
  if (!first || !second) return !first && !second;
  return *first == *second;
}

ArchiveClasses snapshotArchiveClasses() {
  return recordArchiveClasses().add("KXSLibraryChangeSnapshot",
                                    KXSLibraryChangeSnapshot::initWithCoder);
}

}  // namespace kx
