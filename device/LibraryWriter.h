#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "device/AssetOrder.h"
#include "device/DeviceAdmin.h"
#include "device/LibraryRows.h"
#include "device/MemberPositions.h"
#include "device/ReferenceDevice.h"
#include "device/Sqlite.h"

namespace kx {

// A failure of the device with its error value.
class DeviceFailure : public std::runtime_error {
 public:
  explicit DeviceFailure(ErrorPtr error)
      : std::runtime_error(error->description()), error_(std::move(error)) {}
  const ErrorPtr& error() const { return error_; }

 private:
  ErrorPtr error_;
};

// Writes rows inside one transaction and notes what it changes. Made by LibraryStore::write, used
// on the library's queue. Failures raise SqliteError or DeviceFailure.
class LibraryWriter {
 public:
  // `positions`: what earlier transactions learned; to be cleared when this one is rolled back.
  LibraryWriter(SqliteDatabase& database, AssetOrder& order, KnownAlbumPositions& positions)
      : database_(database), order_(order), knownPositions_(positions) {}

  // What the order inside an album depends on, as this transaction has it by now. Spares a look
  // into the table for each asset of which it is at hand.
  struct AssetAtHand {
    std::string_view uuid;
    std::optional<double> sortToken;
  };
  using AtHand = std::function<std::optional<AssetAtHand>(RowId asset)>;
  void setAtHand(AtHand atHand) { atHand_ = std::move(atHand); }

  void insertAlbum(RowId pk, const AlbumRow& album, std::optional<ListId> list);
  void updateAlbum(RowId pk, const AlbumRow& before, const AlbumRow& after);
  void deleteAlbum(RowId pk, const AlbumRow& album);
  // Not below zero. Unknown albums are passed over.
  void lowerPendingCount(RowId album, std::uint32_t by);

  RowId insertAsset(const WholeAssetRow& asset);
  // Everything of the row but its number; faces, memberships and sizes go.
  void replaceAsset(RowId pk, const WholeAssetRow& asset);
  void updateAsset(RowId pk, const DeviceAssetFields& fields);
  void deleteAsset(RowId pk);
  void setOriginalFileSize(RowId asset, std::int64_t bytes);
  void insertSidecar(RowId asset, std::int64_t compressedBytes);
  void insertAssetFile(RowId asset, std::int64_t ordinal, const std::string& path);

  void insertFace(RowId pk, RowId asset, const FaceRow& face);
  void deleteFace(RowId pk, RowId asset);

  // At the place that the asset order file gives; once, however often.
  void addMembership(RowId album, RowId asset, std::string_view assetUUID);
  // At the end of an album whose order is its owner's.
  void appendMembership(RowId album, RowId asset, std::int64_t position);
  void removeMembership(RowId album, RowId asset);
  void sortAlbum(RowId album);

  void setListOrder(ListId list, const std::vector<RowId>& order);
  // Puts an album that stands in the list at that place.
  void moveInList(ListId list, RowId album, std::size_t index);

  // Files that nobody names any more once this is committed.
  void releaseFile(std::string path) { releasedFiles_.push_back(std::move(path)); }

  SqliteDatabase& database() { return database_; }
  RowChanges& rows() { return rows_; }
  LibraryChanges& changes() { return changes_; }
  std::vector<std::string>& releasedFiles() { return releasedFiles_; }

 private:
  struct AlbumOrderState {
    std::shared_ptr<const AssetOrder::Album> order;
    bool tagged = false;                   // the row says that positions are those of `order`
    MemberPositions* positions = nullptr;  // null: not read yet, or not those of `order`
  };
  AlbumOrderState& orderState(RowId album);
  // Calls visit(uuid, sortToken); not for an asset that is not there.
  template <typename Visit>
  void withAsset(RowId asset, const Visit& visit);
  bool isInOrder(const std::vector<MemberPositions::Member>& members);
  std::vector<MemberPositions::Member> membersOf(RowId album, const AssetOrder::Album& order);
  MemberPositions& learnPositions(RowId album, AlbumOrderState& state);
  void putInOrder(RowId album, AlbumOrderState& state);
  std::int64_t placeOf(RowId album, AlbumOrderState& state, std::int64_t index);
  void writeMoves(RowId album, const std::vector<MemberPositions::Move>& moves);
  void writeTag(RowId album, AlbumOrderState& state);
  void forgetPositions(RowId album);
  // The asset has another identifier: its albums' positions are not those of the order any more.
  void forgetPlaces(RowId asset);
  std::vector<RowId> listMembers(ListId list);

  SqliteDatabase& database_;
  AssetOrder& order_;
  KnownAlbumPositions& knownPositions_;
  std::map<RowId, AlbumOrderState> orderStates_;
  RowChanges rows_;
  LibraryChanges changes_;
  std::vector<std::string> releasedFiles_;
  AtHand atHand_;
};

}  // namespace kx
