#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string_view>
#include <vector>

#include "platform/library/KXPhotoLibrary.h"
#include "testing/InMemoryStore.h"

namespace kx {

class InMemoryAlbum;
class InMemoryAlbumList;
class InMemoryAsset;
class InMemoryFace;

// What all contexts of one in-memory library share. Used on the library's queue; the counters and
// the fault are to be set and read while nothing runs.
struct InMemoryLibraryState {
  using Fault = std::function<ErrorPtr(std::string_view operation)>;

  InMemoryStore store;
  // Grows whenever saved rows change, so that what was derived from them is made anew.
  std::uint64_t revision = 1;
  // Asked before fetchAssets, countAssets, originalFileSizes, sidecarFileSizes, fetchEmptyAlbums,
  // insertAlbum and commit; the error that it returns ends the operation.
  Fault fault;
  // The asset's index in the album that the asset order file gives, or null.
  std::function<std::optional<std::uint64_t>(std::string_view album, std::string_view asset)>
      orderIndex;
  std::size_t rowsWritten = 0;
  std::size_t listSorts = 0;

  bool fails(std::string_view operation, ErrorPtr* error) const;
  // The order inside an album: by index of the asset order file, then by sort token (null last),
  // then by UUID.
  bool isOrderedBefore(const InMemoryAlbumRow& album, const InMemoryAssetRow& a,
                       const InMemoryAssetRow& b) const;
};

// One view of the library: objects by identity, and changes that no transaction has saved, laid
// over the saved rows. Used on the library's queue alone; its objects must not outlive it.
class InMemoryContext final : public KXManagedObjectContext {
 public:
  explicit InMemoryContext(std::shared_ptr<InMemoryLibraryState> state);
  ~InMemoryContext() override;

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

  // Changes that no transaction has saved. Row and copy of it as it was before the first change.
  template <typename Row>
  struct Changed {
    Row before;
    Row now;
  };
  struct Changes {
    std::map<std::int64_t, Changed<InMemoryAlbumRow>> albums;
    std::map<std::int64_t, Changed<InMemoryAssetRow>> assets;
    std::map<std::int64_t, InMemoryFaceRow> newFaces;
    std::set<std::int64_t> inserted;
    std::set<std::int64_t> deleted;
    std::array<std::optional<std::vector<std::int64_t>>, InMemoryStore::kLists> lists;
  };
  const Changes& changes() const { return changes_; }
  void setChanges(Changes changes);
  // Writes the changes into the store; false and nothing written when there are none.
  bool commit();

  // The objects of rows, one per row; null when there is no such row.
  KXGenericAlbumPtr albumObject(std::int64_t row);
  KXManagedAssetPtr assetObject(std::int64_t row);
  KXManagedFacePtr faceObject(std::int64_t row);

  // Rows as this context sees them. Empty rows for those that are gone.
  const InMemoryAlbumRow& album(std::int64_t row) const;
  const InMemoryAssetRow& asset(std::int64_t row) const;
  const InMemoryFaceRow& face(std::int64_t row) const;
  InMemoryAlbumRow& changeAlbum(std::int64_t row);
  InMemoryAssetRow& changeAsset(std::int64_t row);
  bool exists(std::int64_t row) const;
  bool isDeleted(std::int64_t row) const { return changes_.deleted.contains(row); }
  bool hasChanges(std::int64_t row) const;
  void deleteRow(std::int64_t row) { changes_.deleted.insert(row); }

  KXGenericAlbumPtr insertAlbum(SeedList list, std::int32_t kind);
  void insertFace(std::int64_t asset, InMemoryFaceRow face);
  std::vector<std::int64_t> list(SeedList which) const;
  void setList(SeedList which, std::vector<std::int64_t> rows);
  std::vector<std::int64_t> albumRows() const;
  std::int64_t albumWithUUID(std::string_view uuid) const;  // 0 when absent
  std::vector<std::int64_t> albumMembers(std::int64_t row) const;
  void setAlbumMembers(std::int64_t row, std::vector<std::int64_t> members);
  // The order inside an album.
  bool isOrderedBefore(std::int64_t album, std::int64_t a, std::int64_t b) const;
  std::uint64_t revision() const { return state_->revision + localRevision_; }
  void touch() { ++localRevision_; }

 private:
  bool matches(const InMemoryAssetRow& row, const AssetPredicate& predicate) const;
  void commitAlbum(std::int64_t row, const Changed<InMemoryAlbumRow>& change);
  void commitAsset(std::int64_t row, const Changed<InMemoryAssetRow>& change);

  std::shared_ptr<InMemoryLibraryState> state_;
  Changes changes_;
  std::uint64_t localRevision_ = 0;
  std::map<std::int64_t, std::shared_ptr<InMemoryAlbum>> albumObjects_;
  std::map<std::int64_t, std::shared_ptr<InMemoryAsset>> assetObjects_;
  std::map<std::int64_t, std::shared_ptr<InMemoryFace>> faceObjects_;
};

}  // namespace kx
