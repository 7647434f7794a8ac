#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/Date.h"
#include "platform/foundation/Rect.h"
#include "platform/foundation/Value.h"

namespace kx {

// Managed objects: one per row and context, shared by reference, used on the library's queue alone.
// A fault loads its row when it is first read. Changes become part of the library when the
// transaction that made them ends; if it fails they are rolled back. Reading an object whose row is
// gone gives nulls and zeros.

class KXManagedAlbum;
class KXManagedAsset;

struct Coordinate {
  double latitude = 0.0;
  double longitude = 0.0;
  friend bool operator==(const Coordinate&, const Coordinate&) = default;
};

// A stable identifier of a managed object, permanent once its transaction has been saved.
class ObjectID {
 public:
  ObjectID() = default;
  explicit ObjectID(std::string uri) : uri_(std::move(uri)) {}
  // "kxlibrary://<store>/<Entity>/p<row>"
  const std::string& URIRepresentation() const { return uri_; }
  friend bool operator==(const ObjectID&, const ObjectID&) = default;

 private:
  std::string uri_;
};

class KXManagedObject {
 public:
  virtual ~KXManagedObject() = default;
  virtual ObjectID objectID() const = 0;
  virtual bool isDeleted() const = 0;
  // Whether it has changes that no transaction has saved.
  virtual bool hasChanges() const = 0;
  // Takes it out of the library at the end of the transaction.
  virtual void deleteObject() = 0;
  virtual std::string description() const = 0;
};

class KXManagedFace : public KXManagedObject {
 public:
  virtual std::uint16_t identifier() const = 0;
  // Fractions of the image's width and height.
  virtual Rect relativeRect() const = 0;
  virtual std::optional<std::string> albumUUID() const = 0;
};
using KXManagedFacePtr = std::shared_ptr<KXManagedFace>;

// The device album kinds that a sync handles, and the saved-asset type of a synced asset.
inline constexpr int kKXAlbumKindSyncedAlbum = 1550;
inline constexpr int kKXAlbumKindSyncedEvent = 1551;
inline constexpr int kKXAlbumKindSyncedFaceAlbum = 15;
inline constexpr int kKXSavedAssetTypeSynced = 256;
// Pending-item types: at rest (count 0), synced items to come, restored items to come.
inline constexpr int kKXPendingItemsNone = 1;
inline constexpr int kKXPendingItemsSync = 2;
inline constexpr int kKXPendingItemsRestore = 4;

// An album of any kind: synced or device-made, event, face album, or one of the library's own
// progress albums.
class KXGenericAlbum : public KXManagedObject {
 public:
  virtual OptionalString uuid() const = 0;
  virtual void setUuid(OptionalString uuid) = 0;
  virtual OptionalString title() const = 0;
  virtual void setTitle(OptionalString title) = 0;
  virtual std::int32_t kindValue() const = 0;
  virtual void setKindValue(std::int32_t kind) = 0;
  virtual std::int32_t pendingItemsType() const = 0;
  virtual void setPendingItemsType(std::int32_t type) = 0;
  virtual std::uint32_t pendingItemsCount() const = 0;
  virtual void setPendingItemsCount(std::uint32_t count) = 0;
  // Lowers the count, not below zero.
  virtual void reducePendingItemsCountBy(std::uint32_t count) = 0;

  // For log messages.
  virtual std::string localizedTitle() const = 0;
  virtual std::string _kindDescription() const = 0;
  virtual std::string shortObjectIDURI() const = 0;
  virtual std::string className() const = 0;

  // This album as a managed album (one that may be deleted and filled), null when it is none.
  virtual KXManagedAlbum* asManagedAlbum() = 0;
};
using KXGenericAlbumPtr = std::shared_ptr<KXGenericAlbum>;

class KXManagedAlbum : public KXGenericAlbum {
 public:
  inline static constexpr const char* kClassName = "KXManagedAlbum";

  // The asset leaves the album; nothing happens when it is not in it.
  virtual void removeAsset(const std::shared_ptr<KXManagedAsset>& asset) = 0;
  // Adds the asset where the asset order file puts it among the album's assets; an asset that is in
  // the album already stays there once.
  virtual void addAssetUsingTesselAlbumOrder(const std::shared_ptr<KXManagedAsset>& asset) = 0;
  // Re-sorts the album's assets: those with an index of the asset order file by it, the rest by
  // sort token (null last), then by UUID. Writes nothing when the order is right already.
  virtual void sortAssetsUsingTesselAlbumOrder() = 0;
};

class KXManagedAsset : public KXManagedObject {
 public:
  virtual OptionalString uuid() const = 0;
  virtual std::int32_t savedAssetType() const = 0;
  virtual std::optional<Date> modificationDate() const = 0;
  // Null when it has none.
  virtual std::optional<double> sortToken() const = 0;
  virtual void setSortToken(double token) = 0;
  // Whether the stored location is that coordinate; null (the invalid coordinate) matches an asset
  // without location.
  virtual bool isLocatedAtCoordinates(const std::optional<Coordinate>& coordinate) const = 0;
  virtual void setLocation(const std::optional<Coordinate>& location) = 0;
  // In row order. The span is good until the next change of this asset's faces or the end of the
  // block; deleted faces of a running transaction are left out of later calls.
  virtual std::span<const KXManagedFacePtr> faces() = 0;
  virtual void addFace(const Rect& relativeRect, std::uint16_t identifier,
                       OptionalString albumUUID) = 0;
  // Every album, event and face album that holds the asset, in row order; the span as for faces.
  virtual std::span<const KXGenericAlbumPtr> albums() = 0;
  // Absolute device paths of all its files except thumbnails, main file first.
  virtual std::vector<std::string> filePathsWithoutThumbs() = 0;
};
using KXManagedAssetPtr = std::shared_ptr<KXManagedAsset>;

// KXManagedAlbumList: one of the library's three ordered lists, synced and device-made albums
// together. Used on the library's queue, inside a transaction when it is reordered.
class KXManagedAlbumList {
 public:
  virtual ~KXManagedAlbumList() = default;
  // In list order.
  virtual std::span<const KXGenericAlbumPtr> albums() = 0;
  // Puts the list into the given order: the same albums, each once.
  virtual void reorder(std::vector<KXGenericAlbumPtr> newOrder) = 0;
};

}  // namespace kx
