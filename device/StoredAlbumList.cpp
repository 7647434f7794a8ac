#include "device/StoredAlbumList.h"

#include <algorithm>

#include "device/LibraryContext.h"
#include "platform/foundation/Exceptions.h"

namespace kx {

std::span<const KXGenericAlbumPtr> StoredAlbumList::albums() {
  if (context_ == nullptr) return {};
  if (!read_) {
    albums_.clear();
    SqliteStatement row(context_->store().database(),
                        "SELECT e.album, a.uuid, a.kind, a.title, a.pending_type, "
                        "a.pending_count, a.managed FROM list_entries e JOIN albums a "
                        "ON a.pk = e.album WHERE e.list = ? ORDER BY e.position, e.album");
    row.integer(static_cast<int>(id_));
    while (row.step()) albums_.push_back(context_->album(row.integerAt(0), row, 1));
    read_ = true;
  }
  // New albums come last, in the order made; the list knows those up to the newest it has seen.
  for (const RowId inserted : context_->insertedAlbums(id_, newestSeen_)) {
    albums_.push_back(context_->album(inserted));
    newestSeen_ = inserted;
  }
  std::erase_if(albums_, [](const KXGenericAlbumPtr& album) { return album->isDeleted(); });
  return albums_;
}

void StoredAlbumList::reorder(std::vector<KXGenericAlbumPtr> newOrder) {
  if (context_ == nullptr) return;
  const std::span<const KXGenericAlbumPtr> present = albums();
  std::vector<KXGenericAlbumPtr> wanted = newOrder;
  std::vector<KXGenericAlbumPtr> known(present.begin(), present.end());
  std::sort(wanted.begin(), wanted.end());
  std::sort(known.begin(), known.end());
  if (wanted != known) {
    throw InternalInconsistency("a list is reordered with other albums than its own");
  }
  if (std::equal(newOrder.begin(), newOrder.end(), present.begin(), present.end())) return;
  albums_ = std::move(newOrder);
  reordered_ = true;
  context_->store().countListSort();
}

std::vector<RowId> StoredAlbumList::order() const {
  std::vector<RowId> order;
  order.reserve(albums_.size());
  for (const KXGenericAlbumPtr& album : albums_) {
    if (!album->isDeleted()) order.push_back(static_cast<const StoredAlbum&>(*album).rowId());
  }
  return order;
}

}  // namespace kx
