#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_set>
#include <utility>
#include <vector>

#include "device/LibraryStore.h"
#include "device/RowRegistry.h"
#include "device/StoredAlbum.h"
#include "device/StoredAlbumList.h"
#include "device/StoredAsset.h"
#include "platform/foundation/RecordBlocks.h"
#include "platform/library/KXPhotoLibrary.h"

namespace kx {

// One library object's view of the store: one object per row that was touched, and the changes that
// no transaction has saved yet. Made and used on the library's queue; objects that outlive it read
// as gone.
class LibraryContext : public KXManagedObjectContext {
 public:
  explicit LibraryContext(std::shared_ptr<LibraryStore> store);
  ~LibraryContext() override;
  LibraryContext(const LibraryContext&) = delete;
  LibraryContext& operator=(const LibraryContext&) = delete;

  std::optional<std::vector<KXManagedAssetPtr>> fetchAssets(const AssetFetchRequest& request,
                                                            ErrorPtr* error) override;
  std::optional<std::uint64_t> countAssets(const AssetPredicate& predicate,
                                           ErrorPtr* error) override;
  std::optional<std::vector<std::int64_t>> originalFileSizes(const AssetPredicate& predicate,
                                                             ErrorPtr* error) override;
  std::optional<std::vector<std::int64_t>> sidecarFileSizes(const AssetPredicate& predicate,
                                                            ErrorPtr* error) override;
  std::optional<std::vector<KXGenericAlbumPtr>> fetchEmptyAlbums(const std::vector<int>& kinds,
                                                                 ErrorPtr* error) override;
  std::vector<std::shared_ptr<KXManagedObject>> registeredObjects() override;
  void refreshObject(const std::shared_ptr<KXManagedObject>& object, bool mergeChanges) override;

  // Reads the synced assets with faces and albums, so that a fetch of them finds all at hand as
  // long as no transaction changes assets. Gives up when `wanted` becomes false; a failure is left
  // to the fetch itself. Faces and albums are read on a thread of its own, which ends before this
  // returns.
  void readAhead(const std::atomic<bool>& wanted);

  // Shows the row of every synced asset, as long as the visitor wants more of them, if all were
  // read ahead and no other program has changed the library since: as it was read, or when a
  // transaction has changed it, as the table has it now. Otherwise false, and none is shown. Throws
  // SqliteError.
  bool showRowsReadAhead(const std::function<bool(const AssetRow&)>& visit);

  // What KXPhotoLibrary's class operations need.
  KXGenericAlbumPtr albumWithRole(std::string_view role);
  KXGenericAlbumPtr insertAlbum(std::int32_t kind, ListId list);
  std::vector<KXGenericAlbumPtr> albumsOfKinds(const std::vector<int>& kinds);
  KXGenericAlbumPtr albumWithUUID(std::string_view uuid);
  std::shared_ptr<StoredAsset> assetWithUUID(std::string_view uuid);
  std::vector<std::pair<std::string, std::string>> pathsForAllIncompleteAssets();
  std::shared_ptr<KXManagedAlbumList> list(ListId id);

  // The unit of work.
  bool hasChanges() const;
  // Writes what has changed as one transaction. After an error everything is as it was saved last.
  ErrorPtr save();
  void dropChanges();
  // Of an asset as it was saved last, if it is at hand.
  std::optional<LibraryWriter::AssetAtHand> savedAtHand(RowId pk) const;
  // A transaction, its own or another's, has changed these rows.
  void noteWritten(const RowChanges& rows);
  // Another's transaction has changed these rows. Unsaved changes stay.
  void refreshRows(const RowChanges& rows);

  // For the objects of this context.
  LibraryStore& store() { return *store_; }
  std::shared_ptr<StoredAlbum> album(RowId pk);
  // The same with its row at hand (columns as for readAlbumRow).
  std::shared_ptr<StoredAlbum> album(RowId pk, const SqliteStatement& row, int first);
  std::shared_ptr<StoredAsset> asset(RowId pk);
  std::shared_ptr<StoredFace> face(RowId pk, RowId asset);
  std::shared_ptr<StoredFace> insertFace(RowId asset, FaceRow row);
  std::vector<std::shared_ptr<StoredFace>> insertedFaces(RowId asset) const;
  void noteChanged(StoredAlbum& changed);
  void noteChanged(StoredAsset& changed);
  void noteDeleted(StoredAlbum& deleted);
  void noteDeleted(StoredFace& deleted);
  // Whether the asset is in the album once everything is saved.
  void setMembership(RowId album, RowId asset, bool member);
  // Unsaved memberships of one asset, by album.
  std::vector<std::pair<RowId, bool>> unsavedMemberships(RowId asset) const;
  // Albums of the list that are new and unsaved, after the given row.
  std::vector<RowId> insertedAlbums(ListId list, RowId after) const;
  // Grows when albums go: relations read before are stale then.
  std::uint32_t albumsEpoch() const { return albumsEpoch_; }

 private:
  using Members = std::map<std::pair<RowId, RowId>, bool>;  // (asset, album)

  // The synced assets, their faces and albums, as they were read ahead.
  struct Ahead {
    std::vector<KXManagedAssetPtr> assets;
    std::unordered_set<RowId> changed;  // assets that are new, changed or gone since
    std::int64_t dataVersion = 0;       // the database's
    std::uint32_t albumsEpoch = 0;
  };

  bool isReadAhead(const AssetPredicate& predicate) const;
  void readAssets(const AssetPredicate& predicate, std::vector<KXManagedAssetPtr>* assets);
  // Gives these assets, in row order, their faces and albums of the rows.
  void takeFaces(std::vector<FaceOfAsset> rows, const std::vector<KXManagedAssetPtr>& assets);
  void takeAlbums(const std::vector<AlbumOfAsset>& rows,
                  const std::vector<KXManagedAssetPtr>& assets);
  // The next row of a long reading; none when the reading is not wanted any more.
  bool nextRow(SqliteStatement& row);
  bool isEmptyNow(RowId album);
  void flush(LibraryWriter& writer);
  // An asset as a flush has written it, if it is at hand.
  std::optional<LibraryWriter::AssetAtHand> assetAtHand(RowId pk) const;
  void flushAlbums(LibraryWriter& writer);
  void flushAssets(LibraryWriter& writer);
  void flushMemberships(LibraryWriter& writer);
  void flushLists(LibraryWriter& writer);
  void settle();
  // The row of an asset of this context is gone.
  void forget(StoredAsset& gone);
  void dropChangesOf(StoredAsset& asset);

  const std::shared_ptr<LibraryStore> store_;
  RecordBlocks blocks_;  // of assets and faces
  RowRegistry<StoredAsset> assets_;
  RowRegistry<StoredFace> faces_;
  RowRegistry<StoredAlbum> albums_;
  std::map<RowId, std::shared_ptr<StoredAsset>> changedAssets_;  // deleted ones too
  std::map<RowId, std::shared_ptr<StoredAlbum>> changedAlbums_;  // inserted and deleted ones too
  // Inserted and deleted ones, by (asset, face).
  std::map<std::pair<RowId, RowId>, std::shared_ptr<StoredFace>> changedFaces_;
  Members memberships_;
  std::shared_ptr<StoredAlbumList> lists_[kListCount];
  std::uint32_t albumsEpoch_ = 0;
  std::optional<Ahead> ahead_;
  const std::atomic<bool>* wanted_ = nullptr;  // of the reading ahead that is under way
};

}  // namespace kx
