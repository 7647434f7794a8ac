#pragma once

#include <memory>
#include <optional>
#include <string>

#include "device/LibraryRows.h"
#include "platform/library/KXManagedObjects.h"

namespace kx {

class LibraryContext;

// An album of one context. Used on the library's queue alone; after its context has gone it reads
// as an album whose row is gone.
class StoredAlbum : public KXManagedAlbum, public std::enable_shared_from_this<StoredAlbum> {
 public:
  StoredAlbum(LibraryContext* context, RowId pk) : context_(context), pk_(pk) {}

  RowId rowId() const { return pk_; }
  ObjectID objectID() const override;
  bool isDeleted() const override;
  bool hasChanges() const override;
  void deleteObject() override;
  std::string description() const override;

  OptionalString uuid() const override;
  void setUuid(OptionalString uuid) override;
  OptionalString title() const override;
  void setTitle(OptionalString title) override;
  std::int32_t kindValue() const override;
  void setKindValue(std::int32_t kind) override;
  std::int32_t pendingItemsType() const override;
  void setPendingItemsType(std::int32_t type) override;
  std::uint32_t pendingItemsCount() const override;
  void setPendingItemsCount(std::uint32_t count) override;
  void reducePendingItemsCountBy(std::uint32_t count) override;
  std::string localizedTitle() const override;
  std::string _kindDescription() const override;
  std::string shortObjectIDURI() const override;
  std::string className() const override;
  KXManagedAlbum* asManagedAlbum() override;

  void removeAsset(const KXManagedAssetPtr& asset) override;
  void addAssetUsingTesselAlbumOrder(const KXManagedAssetPtr& asset) override;
  void sortAssetsUsingTesselAlbumOrder() override;

 private:
  friend class LibraryContext;
  friend class StoredAsset;
  enum class Life : std::uint8_t { kLive, kDeleting, kGone };
  struct Edits {
    std::optional<std::optional<std::string>> uuid, title;
    std::optional<std::int32_t> kind, pendingType;
    std::optional<std::uint32_t> pendingCount;
    bool empty() const { return !uuid && !title && !kind && !pendingType && !pendingCount; }
  };

  // The saved row, read when needed; a row of zeros when it is gone.
  const AlbumRow& saved() const;
  // The row as a save would leave it.
  AlbumRow edited() const;
  template <typename T, typename V>
  void edit(std::optional<T> Edits::*field, const T& saved, V value);
  bool live() const { return life_ == Life::kLive && context_ != nullptr; }
  // Looks at the row, too.
  bool exists() const {
    saved();
    return live();
  }
  void load(AlbumRow row) const { row_ = std::make_unique<AlbumRow>(std::move(row)); }
  void fault();
  // After a save: what was edited is the row.
  void settle();
  // Back to what was saved; a new album is gone.
  void drop();
  void die();

  LibraryContext* context_;
  const RowId pk_;
  mutable std::unique_ptr<AlbumRow> row_;
  std::unique_ptr<Edits> edits_;
  mutable Life life_ = Life::kLive;
  std::optional<ListId> insertedInto_;  // set until it is saved
  // To be put in order with the next save, which writes only where the order is wrong.
  bool sortWanted_ = false;
};

}  // namespace kx
