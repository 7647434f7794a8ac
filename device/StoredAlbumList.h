#pragma once

#include <memory>
#include <span>
#include <vector>

#include "device/LibraryRows.h"
#include "platform/library/KXManagedObjects.h"

namespace kx {

class LibraryContext;

// One of the three ordered lists in one context; the rules of StoredAlbum hold.
class StoredAlbumList : public KXManagedAlbumList {
 public:
  StoredAlbumList(LibraryContext* context, ListId id) : context_(context), id_(id) {}

  std::span<const KXGenericAlbumPtr> albums() override;
  void reorder(std::vector<KXGenericAlbumPtr> newOrder) override;

 private:
  friend class LibraryContext;
  bool hasChanges() const { return reordered_; }
  std::vector<RowId> order() const;
  // To be read again when next needed.
  void fault() {
    read_ = false;
    reordered_ = false;
    newestSeen_ = 0;
    albums_ = {};
  }

  LibraryContext* context_;
  const ListId id_;
  bool read_ = false;
  bool reordered_ = false;
  RowId newestSeen_ = 0;
  std::vector<KXGenericAlbumPtr> albums_;
};

}  // namespace kx
