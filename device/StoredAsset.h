#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "device/DeviceAdmin.h"
#include "device/LibraryRows.h"
#include "platform/library/KXManagedObjects.h"

namespace kx {

class LibraryContext;
class StoredAlbum;
class StoredAsset;

// A face of one context; the rules of StoredAlbum hold.
class StoredFace : public KXManagedFace, public std::enable_shared_from_this<StoredFace> {
 public:
  StoredFace(LibraryContext* context, RowId pk, RowId asset)
      : context_(context), pk_(pk), asset_(asset) {}

  ObjectID objectID() const override;
  bool isDeleted() const override { return life_ != Life::kLive; }
  bool hasChanges() const override { return life_ == Life::kDeleting || inserted_; }
  void deleteObject() override;
  std::string description() const override;
  std::uint16_t identifier() const override { return saved().identifier; }
  Rect relativeRect() const override { return saved().relativeRect; }
  std::optional<std::string> albumUUID() const override { return saved().albumUUID; }

 private:
  friend class LibraryContext;
  friend class StoredAsset;
  enum class Life : std::uint8_t { kLive, kDeleting, kGone };

  const FaceRow& saved() const;
  void load(FaceRow row) const;
  void fault();
  void die();

  LibraryContext* context_;
  const RowId pk_;
  const RowId asset_;
  mutable Life life_ = Life::kLive;
  mutable bool loaded_ = false;
  bool inserted_ = false;
  mutable FaceRow row_;
};

// An asset of one context; the rules of StoredAlbum hold.
class StoredAsset : public KXManagedAsset, public std::enable_shared_from_this<StoredAsset> {
 public:
  StoredAsset(LibraryContext* context, RowId pk) : context_(context), pk_(pk) {}

  ObjectID objectID() const override;
  bool isDeleted() const override { return life_ != Life::kLive; }
  bool hasChanges() const override;
  void deleteObject() override;
  std::string description() const override;

  OptionalString uuid() const override;
  std::int32_t savedAssetType() const override;
  std::optional<Date> modificationDate() const override;
  std::optional<double> sortToken() const override;
  void setSortToken(double token) override;
  bool isLocatedAtCoordinates(const std::optional<Coordinate>& coordinate) const override;
  void setLocation(const std::optional<Coordinate>& location) override;
  std::span<const KXManagedFacePtr> faces() override;
  void addFace(const Rect& relativeRect, std::uint16_t identifier,
               OptionalString albumUUID) override;
  std::span<const KXGenericAlbumPtr> albums() override;
  std::vector<std::string> filePathsWithoutThumbs() override;

  // Any field at once.
  void setFields(const DeviceAssetFields& fields);
  // Membership, from the album's side.
  void join(StoredAlbum& album);
  void leave(StoredAlbum& album);

 private:
  friend class LibraryContext;
  friend class StoredFace;
  enum class Life : std::uint8_t { kLive, kDeleting, kGone };

  const AssetRow& saved() const;
  std::optional<Coordinate> location() const;
  DeviceAssetFields& edits();
  bool live() const { return life_ == Life::kLive && context_ != nullptr; }
  // Looks at the row, too.
  bool exists() const {
    saved();
    return live();
  }
  void load(AssetRow row) const;
  void readAlbums();
  void setAlbums(std::span<const KXGenericAlbumPtr> albums);
  bool isIn(const StoredAlbum& album);
  void forgetRelations();
  void fault();
  void settle();
  void drop();
  void die();

  LibraryContext* context_;
  const RowId pk_;
  mutable bool loaded_ = false;
  mutable Life life_ = Life::kLive;
  bool facesRead_ = false;
  bool albumsRead_ = false;
  bool relationsChanged_ = false;  // faces or memberships are unsaved
  std::uint32_t albumsEpoch_ = 0;
  mutable AssetRow row_;
  std::unique_ptr<DeviceAssetFields> edits_;
  std::vector<KXManagedFacePtr> faces_;
  // In row order; with those of others in one piece of memory when they were read together.
  std::shared_ptr<const KXGenericAlbumPtr[]> albums_;
  std::uint32_t albumCount_ = 0;
};

}  // namespace kx
