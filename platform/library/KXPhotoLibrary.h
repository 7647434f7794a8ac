#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/dispatch/Dispatch.h"
#include "platform/foundation/Error.h"
#include "platform/library/KXManagedObjects.h"

namespace kx {

// Which synced assets a fetch wants.
struct AssetPredicate {
  enum class Comparison { kSavedAssetTypeEquals, kSavedAssetTypeDiffers };
  Comparison comparison = Comparison::kSavedAssetTypeEquals;
  int savedAssetType = kKXSavedAssetTypeSynced;
};

struct AssetFetchRequest {
  AssetPredicate predicate;
  // Relations to load together with the assets, in a fixed number of statements.
  bool prefetchFaces = false;
  bool prefetchAlbums = false;
  // When true only "uuid" is asked for eagerly; an implementation may load more.
  bool fetchOnlyUUID = false;
};

// The object store as one library object sees it. Used on the library's queue alone.
class KXManagedObjectContext {
 public:
  virtual ~KXManagedObjectContext() = default;

  // Results in row order; nullopt and an error on failure.
  virtual std::optional<std::vector<KXManagedAssetPtr>> fetchAssets(
      const AssetFetchRequest& request, ErrorPtr* error) = 0;
  virtual std::optional<std::uint64_t> countAssets(const AssetPredicate& predicate,
                                                   ErrorPtr* error) = 0;
  // "originalFilesize" of the additional attributes of the assets, one per row that has it.
  virtual std::optional<std::vector<std::int64_t>> originalFileSizes(
      const AssetPredicate& predicate, ErrorPtr* error) = 0;
  // "compressedSize" of the sidecar files of the assets, one per row that has it.
  virtual std::optional<std::vector<std::int64_t>> sidecarFileSizes(const AssetPredicate& predicate,
                                                                    ErrorPtr* error) = 0;
  // Albums of any of the kinds that hold no asset, in row order.
  virtual std::optional<std::vector<KXGenericAlbumPtr>> fetchEmptyAlbums(
      const std::vector<int>& kinds, ErrorPtr* error) = 0;

  // Every object that the context holds, in row order per entity.
  virtual std::vector<std::shared_ptr<KXManagedObject>> registeredObjects() = 0;
  // Turns the object into a fault. With mergeChanges its unsaved changes are kept and laid over the
  // row when it is read again; without, they are dropped.
  virtual void refreshObject(const std::shared_ptr<KXManagedObject>& object, bool mergeChanges) = 0;
};

// One open connection of the process to the device's photo library, with a context of its own. All
// blocks of all library objects run one at a time in the order submitted on the library's own
// queue. The object may be released anywhere; blocks under way keep it alive.
class KXPhotoLibrary : public std::enable_shared_from_this<KXPhotoLibrary> {
 public:
  virtual ~KXPhotoLibrary() = default;

  // Runs the block asynchronously as one write transaction, counted in the group (which may be
  // null) until done. A failing commit rolls everything back: the library and its objects are as
  // before; the library logs and counts the failure. An exception from the block rolls back
  // likewise; the library logs it and leaves the group all the same, so a caller that must know
  // about exceptions catches and keeps them in its block, then throws on so that the transaction is
  // rolled back.
  virtual void withDispatchGroupPerformTransaction(const DispatchGroupPtr& group, Block block) = 0;
  // The same without a transaction, for reading. Changes made in it stay unsaved in the context.
  // An exception from the block is logged; changes it made are dropped.
  virtual void withDispatchGroupPerformBlock(const DispatchGroupPtr& group, Block block) = 0;
  virtual void performBlock(Block block) = 0;

  // Only inside a block of this library.
  virtual KXManagedObjectContext& managedObjectContext() = 0;
  virtual KXGenericAlbumPtr syncProgressAlbum() = 0;
  virtual KXGenericAlbumPtr otaRestoreProgressAlbum() = 0;

  // KXGenericAlbum class operations. Only inside a block of this library; the inserting ones inside
  // a transaction. Factories may give null.
  virtual KXGenericAlbumPtr shoeboxAlbum() = 0;  // the device's own camera album
  virtual KXGenericAlbumPtr insertNewAlbum() = 0;
  virtual KXGenericAlbumPtr insertNewFaceAlbum() = 0;
  virtual KXGenericAlbumPtr insertNewSyncedEvent() = 0;
  // Every album of any of the kinds, in row order (albumsMatchingPredicate).
  virtual std::vector<KXGenericAlbumPtr> albumsOfKinds(const std::vector<int>& kinds) = 0;

  // KXManagedAlbum and KXManagedAsset class operations; null when absent.
  virtual KXGenericAlbumPtr albumWithUUID(std::string_view uuid) = 0;
  virtual KXManagedAssetPtr assetWithUUID(std::string_view uuid) = 0;
  // UUID and main file path of every asset whose files are not all present, in row order.
  virtual std::vector<std::pair<std::string, std::string>> pathsForAllIncompleteAssets() = 0;

  // KXManagedAlbumList class operations.
  virtual std::shared_ptr<KXManagedAlbumList> albumList() = 0;
  virtual std::shared_ptr<KXManagedAlbumList> eventList() = 0;
  virtual std::shared_ptr<KXManagedAlbumList> facesAlbumList() = 0;

  virtual std::string description() const = 0;
};
using KXPhotoLibraryPtr = std::shared_ptr<KXPhotoLibrary>;

// What the library framework offers without an open library (its class operations). Any thread.
// All paths are absolute device paths without a trailing slash.
class KXPhotoLibraryFramework {
 public:
  virtual ~KXPhotoLibraryFramework() = default;

  // Opens the library for this process; never null (a failure raises std::runtime_error).
  virtual KXPhotoLibraryPtr newPhotoLibrary() = 0;

  virtual std::string dcimDirectory() = 0;
  virtual std::string photoDataDirectory() = 0;
  virtual std::string photoDataCachesDirectory() = 0;
  virtual std::string cascadesDataDirectory() = 0;
  virtual std::string tesselSyncedAssetsDirectory() = 0;
  virtual std::string tesselSyncedFaceAlbumThumbnailsDirectory() = 0;
  virtual std::string syncInfoPath() = 0;
  // KXManagedAlbum: where the asset order file lies, and dropping the cached copy of it.
  virtual std::string pathToAssetAlbumOrderStructure() = 0;
  virtual void clearAssetOrderByAbumUUIDs() = 0;
};

// KXLocationUtils canUseCoordinate: refuses null (the invalid coordinate), exactly (0, 0),
// latitudes beyond 90, longitudes beyond 180, and numbers that are not finite.
bool canUseCoordinate(const std::optional<Coordinate>& coordinate);
// "<latitude,longitude>"
std::string describeLocation(const Coordinate& coordinate);

// KXUUIDString UUIDString: a new random (version 4) UUID as canonical upper-case text.
std::string UUIDString();

}  // namespace kx
