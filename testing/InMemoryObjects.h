#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "testing/InMemoryContext.h"

namespace kx {

// The managed objects of an in-memory library: handles on a row of a context, which they must not
// outlive. Used on the library's queue alone.

// Whether the object's row has been read since it was last made a fault; for tests.
class FaultingObject {
 public:
  virtual ~FaultingObject() = default;
  bool isFault() const { return isFault_; }
  void becomeFault() { isFault_ = true; }

 protected:
  mutable bool isFault_ = true;
};

class InMemoryFace final : public KXManagedFace, public FaultingObject {
 public:
  InMemoryFace(InMemoryContext& context, std::int64_t row) : context_(context), row_(row) {}
  std::int64_t row() const { return row_; }
  ObjectID objectID() const override;
  bool isDeleted() const override { return context_.isDeleted(row_); }
  bool hasChanges() const override { return context_.hasChanges(row_); }
  void deleteObject() override;
  std::string description() const override;
  std::uint16_t identifier() const override { return data().identifier; }
  Rect relativeRect() const override { return data().relativeRect; }
  std::optional<std::string> albumUUID() const override { return data().albumUUID; }

 private:
  const InMemoryFaceRow& data() const;
  InMemoryContext& context_;
  std::int64_t row_;
};

class InMemoryAlbum final : public KXManagedAlbum, public FaultingObject {
 public:
  InMemoryAlbum(InMemoryContext& context, std::int64_t row) : context_(context), row_(row) {}
  std::int64_t row() const { return row_; }
  ObjectID objectID() const override;
  bool isDeleted() const override { return context_.isDeleted(row_); }
  bool hasChanges() const override { return context_.hasChanges(row_); }
  void deleteObject() override;
  std::string description() const override;

  OptionalString uuid() const override;
  void setUuid(OptionalString uuid) override;
  OptionalString title() const override;
  void setTitle(OptionalString title) override;
  std::int32_t kindValue() const override { return data().kind; }
  void setKindValue(std::int32_t kind) override;
  std::int32_t pendingItemsType() const override { return data().pendingItemsType; }
  void setPendingItemsType(std::int32_t type) override;
  std::uint32_t pendingItemsCount() const override { return data().pendingItemsCount; }
  void setPendingItemsCount(std::uint32_t count) override;
  void reducePendingItemsCountBy(std::uint32_t count) override;
  std::string localizedTitle() const override;
  std::string _kindDescription() const override;
  std::string shortObjectIDURI() const override;
  std::string className() const override;
  KXManagedAlbum* asManagedAlbum() override { return data().managed ? this : nullptr; }

  void removeAsset(const KXManagedAssetPtr& asset) override;
  void addAssetUsingTesselAlbumOrder(const KXManagedAssetPtr& asset) override;
  void sortAssetsUsingTesselAlbumOrder() override;

 private:
  const InMemoryAlbumRow& data() const;
  InMemoryContext& context_;
  std::int64_t row_;
};

class InMemoryAsset final : public KXManagedAsset, public FaultingObject {
 public:
  InMemoryAsset(InMemoryContext& context, std::int64_t row) : context_(context), row_(row) {}
  std::int64_t row() const { return row_; }
  ObjectID objectID() const override;
  bool isDeleted() const override { return context_.isDeleted(row_); }
  bool hasChanges() const override { return context_.hasChanges(row_); }
  void deleteObject() override { context_.deleteRow(row_); }
  std::string description() const override;

  OptionalString uuid() const override;
  std::int32_t savedAssetType() const override { return data().savedAssetType; }
  std::optional<Date> modificationDate() const override { return data().modificationDate; }
  std::optional<double> sortToken() const override { return data().sortToken; }
  void setSortToken(double token) override;
  bool isLocatedAtCoordinates(const std::optional<Coordinate>& coordinate) const override;
  void setLocation(const std::optional<Coordinate>& location) override;
  std::span<const KXManagedFacePtr> faces() override;
  void addFace(const Rect& relativeRect, std::uint16_t identifier,
               OptionalString albumUUID) override;
  std::span<const KXGenericAlbumPtr> albums() override;
  std::vector<std::string> filePathsWithoutThumbs() override { return data().files; }
  // Its faces have changed.
  void forgetFaces() { facesRevision_ = 0; }

 private:
  const InMemoryAssetRow& data() const;
  InMemoryContext& context_;
  std::int64_t row_;
  std::vector<KXManagedFacePtr> faces_;
  std::vector<KXGenericAlbumPtr> albums_;
  std::uint64_t facesRevision_ = 0;
  std::uint64_t albumsRevision_ = 0;
};

class InMemoryAlbumList final : public KXManagedAlbumList {
 public:
  InMemoryAlbumList(InMemoryContext& context, InMemoryLibraryState& state, SeedList which)
      : context_(context), state_(state), which_(which) {}
  std::span<const KXGenericAlbumPtr> albums() override;
  void reorder(std::vector<KXGenericAlbumPtr> newOrder) override;

 private:
  InMemoryContext& context_;
  InMemoryLibraryState& state_;
  SeedList which_;
  std::vector<KXGenericAlbumPtr> albums_;
};

}  // namespace kx
