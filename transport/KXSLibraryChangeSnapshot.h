#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/OrderedMap.h"
#include "platform/foundation/Value.h"
#include "records/KXSAlbum.h"
#include "records/KXSAsset.h"
#include "records/KXSEvent.h"

namespace kx {

using KXSItemMap = OrderedMap<KXSItemPtr>;
using KXSItemMapPtr = std::shared_ptr<KXSItemMap>;
using KXSAssetMap = OrderedMap<KXSAssetPtr>;
using KXSAssetMapPtr = std::shared_ptr<KXSAssetMap>;
using KXSItemList = std::vector<KXSItemPtr>;
using KXSItemListPtr = std::shared_ptr<KXSItemList>;

class KXSLibraryChangeSnapshot;
using KXSLibraryChangeSnapshotPtr = std::shared_ptr<KXSLibraryChangeSnapshot>;

// One snapshot of a host library. Maps go from canonical identifier text to item, in the order of
// the file, and keep the snapshot's bytes alive. Shared by reference; read from any thread, set on
// one thread at a time. Collections may be null: after decoding `updates` is, after an archive the
// three indexed forms are.
class KXSLibraryChangeSnapshot final : public Archivable {
 public:
  // Empty texts and collections.
  static KXSLibraryChangeSnapshotPtr librarySnapshot() { return init(); }
  static KXSLibraryChangeSnapshotPtr init();
  // Reads the kind, the identifier, updates and deletes; nothing else is archived.
  static KXSLibraryChangeSnapshotPtr initWithCoder(KeyedUnarchiver& coder);

  std::string description() const;
  std::string_view archiveClassName() const override { return "KXSLibraryChangeSnapshot"; }
  void encodeWithCoder(KeyedArchiver& coder) const override;

  // Whether updates or deletes hold an entry. A decoded snapshot has no updates: see there.
  bool hasChangedObjects() const;
  // The fields that the value under the key is computed from: "updates" and "deletes" for
  // "hasChangedObjects", none for any other key.
  static std::vector<std::string> keyPathsForValuesAffectingValueForKey(std::string_view key);

  // Kind, identifier, albums and events in order, assets by their equivalence. Logs the first
  // difference. Linear; never raises.
  bool isEqualToSnapshot(const KXSLibraryChangeSnapshot* other) const;
  bool isEqualToSnapshot(const KXSLibraryChangeSnapshotPtr& other) const {
    return isEqualToSnapshot(other.get());
  }

  // What isEqualToSnapshot answers for another snapshot decoded from the same bytes, without
  // decoding them again. Not always yes: an asset without a location is equivalent to no other.
  bool isEqualToTwin() const;

  // Null-tolerant comparisons: both null, or the first is not null and equal to the second.
  static bool stringEqualsString(OptionalString first, OptionalString second);
  static bool numberEqualsNumber(const std::optional<Number>& first,
                                 const std::optional<Number>& second);

  // Nullable dictionary from identifier to item.
  const KXSItemMapPtr& updates() const { return updates_; }
  void setUpdates(KXSItemMapPtr updates) { updates_ = std::move(updates); }
  const KXSItemMapPtr& deletes() const { return deletes_; }
  void setDeletes(KXSItemMapPtr deletes) { deletes_ = std::move(deletes); }
  // Identifier of the host library. TypeError when the file holds no string.
  OptionalString libraryUUID() const { return libraryUUID_.asString(kKXSTransportLibraryUUIDKey); }
  void setLibraryUUID(OptionalString uuid) { libraryUUID_ = Value::optionalString(uuid); }
  void setLibraryUUIDValue(Value uuid) { libraryUUID_ = std::move(uuid); }
  // Kind of the host library. TypeError when the file holds no string.
  OptionalString libraryKind() const { return libraryKind_.asString(kKXSTransportLibraryKindKey); }
  void setLibraryKind(OptionalString kind) { libraryKind_ = Value::optionalString(kind); }
  void setLibraryKindValue(Value kind) { libraryKind_ = std::move(kind); }
  bool isFolderSync() const { return isFolderSync_; }
  void setIsFolderSync(bool isFolderSync) { isFolderSync_ = isFolderSync; }
  // Albums and events in host order, by name for folder syncs.
  const KXSItemListPtr& orderedAlbums() const { return orderedAlbums_; }
  void setOrderedAlbums(KXSItemListPtr albums) { orderedAlbums_ = std::move(albums); }
  const KXSItemMapPtr& albumsAndEventsByUUID() const { return albumsAndEventsByUUID_; }
  void setAlbumsAndEventsByUUID(KXSItemMapPtr items) { albumsAndEventsByUUID_ = std::move(items); }
  const KXSAssetMapPtr& assetsByUUID() const { return assetsByUUID_; }
  void setAssetsByUUID(KXSAssetMapPtr assets) { assetsByUUID_ = std::move(assets); }

 private:
  bool hasEqualAlbums(const KXSLibraryChangeSnapshot& other) const;
  bool hasEquivalentAssets(const KXSLibraryChangeSnapshot& other) const;

  KXSItemMapPtr updates_;
  KXSItemMapPtr deletes_;
  Value libraryUUID_;
  Value libraryKind_;
  bool isFolderSync_ = false;
  KXSItemListPtr orderedAlbums_;
  KXSItemMapPtr albumsAndEventsByUUID_;
  KXSAssetMapPtr assetsByUUID_;
};

// The record classes and the snapshot: what an archived snapshot may hold.
ArchiveClasses snapshotArchiveClasses();

}  // namespace kx
