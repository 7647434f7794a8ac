#include <algorithm>
#include <future>
#include <memory>

#include "device/DeviceErrors.h"
#include "device/LibraryContext.h"

namespace kx {
namespace {

// As a list that SQLite's json_each takes apart.
std::string jsonList(const std::vector<int>& numbers) {
  std::string text = "[";
  for (const int number : numbers) {
    if (text.size() > 1) text += ',';
    text += std::to_string(number);
  }
  return text + "]";
}

bool matches(const AssetPredicate& predicate, std::int32_t type) {
  return (type == predicate.savedAssetType) ==
         (predicate.comparison == AssetPredicate::Comparison::kSavedAssetTypeEquals);
}

bool rowIsBefore(const KXGenericAlbumPtr& a, const KXGenericAlbumPtr& b) {
  return static_cast<const StoredAlbum&>(*a).rowId() < static_cast<const StoredAlbum&>(*b).rowId();
}

// Runs a fetch; a failure becomes an error value and is noted.
template <typename Result, typename Fetch>
std::optional<Result> fetched(LibraryStore& store, ErrorPtr* error, const Fetch& fetch) {
  try {
    return fetch();
  } catch (const SqliteError& failure) {
    const ErrorPtr why = failure.asError();
    store.health().noteFailure("a fetch failed", why);
    setError(error, why);
    return std::nullopt;
  }
}

bool wantsEqual(const AssetPredicate& predicate) {
  return predicate.comparison == AssetPredicate::Comparison::kSavedAssetTypeEquals;
}

// Makes one list of albums after the other, many of them in one piece of memory.
class AlbumLists {
 public:
  void add(const std::shared_ptr<StoredAlbum>& album) {
    if (first_ + count_ == room_) begin();
    piece_.get()[first_ + count_++] = album;
  }
  // Ends a list and tells its length.
  std::uint32_t end(std::shared_ptr<const KXGenericAlbumPtr[]>* list) {
    *list = {piece_, piece_.get() + first_};
    first_ += count_;
    return static_cast<std::uint32_t>(std::exchange(count_, 0));
  }

 private:
  static constexpr std::size_t kPiece = 4096;

  // A new piece, to which the list at hand moves.
  void begin() {
    room_ = std::max(kPiece, 2 * count_);
    const auto piece = std::make_shared<KXGenericAlbumPtr[]>(room_);
    std::move(piece_.get() + first_, piece_.get() + first_ + count_, piece.get());
    piece_ = piece;
    first_ = 0;
  }

  std::shared_ptr<KXGenericAlbumPtr[]> piece_;
  std::size_t room_ = 0;
  std::size_t first_ = 0;  // of the list at hand
  std::size_t count_ = 0;
};

std::vector<std::int64_t> sizes(SqliteStatement& row) {
  std::vector<std::int64_t> found;
  while (row.step()) found.push_back(row.integerAt(0));
  return found;
}

}  // namespace

std::optional<std::vector<KXManagedAssetPtr>> LibraryContext::fetchAssets(
    const AssetFetchRequest& request, ErrorPtr* error) {
  using Assets = std::vector<KXManagedAssetPtr>;
  return fetched<Assets>(*store_, error, [&] {
    Assets assets;
    const bool isAtHand = isReadAhead(request.predicate);
    if (isAtHand) {
      assets = ahead_->assets;
    } else {
      readAssets(request.predicate, &assets);
    }
    if (request.prefetchFaces && !isAtHand) {
      takeFaces(readFaces(store_->database(), nullptr), assets);
    }
    if (request.prefetchAlbums && !(isAtHand && ahead_->albumsEpoch == albumsEpoch_)) {
      takeAlbums(readMemberships(store_->database(), nullptr), assets);
    }
    return assets;
  });
}

void LibraryContext::readAhead(const std::atomic<bool>& wanted) {
  wanted_ = &wanted;
  store_->beginReading();
  try {
    Ahead ahead;
    ahead.dataVersion = store_->dataVersion();
    // Relations are read beside the assets. Both see the same: what is being read is not written.
    std::future<RelationRows> beside;
    if (std::unique_ptr<SqliteDatabase> database = store_->openBeside()) {
      beside = std::async(std::launch::async, [database = std::move(database), &wanted] {
        return RelationRows{readFaces(*database, &wanted), readMemberships(*database, &wanted)};
      });
    }
    readAssets({}, &ahead.assets);
    RelationRows rows = beside.valid() ? beside.get()
                                       : RelationRows{readFaces(store_->database(), &wanted),
                                                      readMemberships(store_->database(), &wanted)};
    takeFaces(std::move(rows.faces), ahead.assets);
    takeAlbums(rows.albums, ahead.assets);
    ahead.albumsEpoch = albumsEpoch_;
    if (wanted) ahead_ = std::move(ahead);
  } catch (const std::exception&) {
    // Whoever needs the rows asks again, and tells of the failure.
  }
  store_->endReading();
  wanted_ = nullptr;
}

bool LibraryContext::isReadAhead(const AssetPredicate& predicate) const {
  const AssetPredicate synced;
  return ahead_ && ahead_->changed.empty() && changedAssets_.empty() && changedFaces_.empty() &&
         memberships_.empty() && predicate.comparison == synced.comparison &&
         predicate.savedAssetType == synced.savedAssetType;
}

void LibraryContext::noteWritten(const RowChanges& rows) {
  if (!ahead_) return;
  ahead_->changed.insert(rows.assets.begin(), rows.assets.end());
  ahead_->changed.insert(rows.deletedAssets.begin(), rows.deletedAssets.end());
  // Too little is left to be of use.
  if (ahead_->changed.size() > ahead_->assets.size() / 2) ahead_.reset();
}

bool LibraryContext::showRowsReadAhead(const std::function<bool(const AssetRow&)>& visit) {
  if (!ahead_ || ahead_->dataVersion != store_->dataVersion()) return false;
  for (const KXManagedAssetPtr& asset : ahead_->assets) {
    const auto& stored = static_cast<const StoredAsset&>(*asset);
    if (!ahead_->changed.contains(stored.pk_) && !visit(stored.saved())) return true;
  }
  for (const RowId pk : ahead_->changed) {
    const std::optional<AssetRow> row = assetRow(store_->database(), pk);
    if (row && row->savedType == AssetPredicate().savedAssetType && !visit(*row)) return true;
  }
  return true;
}

bool LibraryContext::nextRow(SqliteStatement& row) {
  return (wanted_ == nullptr || wanted_->load(std::memory_order_relaxed)) && row.step();
}

void LibraryContext::readAssets(const AssetPredicate& predicate,
                                std::vector<KXManagedAssetPtr>* assets) {
  // The whole table is read in its own order: a detour over the index would cost more.
  const char* const sql =
      wantsEqual(predicate)
          ? "SELECT pk, uuid, saved_type, is_video, incomplete, modification_date, sort_token, "
            "latitude, longitude FROM assets WHERE +saved_type = ? ORDER BY pk"
          : "SELECT pk, uuid, saved_type, is_video, incomplete, modification_date, sort_token, "
            "latitude, longitude FROM assets WHERE +saved_type <> ? ORDER BY pk";
  SqliteStatement row(store_->database(), sql);
  row.integer(predicate.savedAssetType);
  while (nextRow(row)) {
    std::shared_ptr<StoredAsset> object = asset(row.integerAt(0));
    if (!object->loaded_) object->load(readAssetRow(row, 1));
    if (!object->isDeleted() && matches(predicate, object->savedAssetType())) {
      assets->push_back(std::move(object));
    }
  }
  bool late = false;
  for (const auto& [pk, object] : changedAssets_) {
    if (!object->exists() || matches(predicate, object->saved().savedType)) continue;
    if (!matches(predicate, object->savedAssetType())) continue;
    assets->push_back(object);
    late = true;
  }
  if (!late) return;
  std::sort(assets->begin(), assets->end(), [](const auto& a, const auto& b) {
    return static_cast<const StoredAsset&>(*a).pk_ < static_cast<const StoredAsset&>(*b).pk_;
  });
}

void LibraryContext::takeFaces(std::vector<FaceOfAsset> rows,
                               const std::vector<KXManagedAssetPtr>& assets) {
  auto row = rows.begin();
  for (const KXManagedAssetPtr& object : assets) {
    StoredAsset& owner = static_cast<StoredAsset&>(*object);
    while (row != rows.end() && row->asset < owner.pk_) ++row;
    if (owner.facesRead_ || owner.relationsChanged_) continue;
    std::vector<KXManagedFacePtr> found;
    for (; row != rows.end() && row->asset == owner.pk_; ++row) {
      std::shared_ptr<StoredFace> shown = face(row->pk, owner.pk_);
      if (!shown->loaded_) shown->load(std::move(row->face));
      found.push_back(std::move(shown));
    }
    owner.faces_ = std::move(found);
    owner.facesRead_ = true;
  }
}

void LibraryContext::takeAlbums(const std::vector<AlbumOfAsset>& rows,
                                const std::vector<KXManagedAssetPtr>& assets) {
  {
    SqliteStatement row(store_->database(),
                        "SELECT pk, uuid, kind, title, pending_type, pending_count, managed "
                        "FROM albums ORDER BY pk");
    while (row.step()) album(row.integerAt(0), row, 1);
  }
  auto row = rows.begin();
  AlbumLists lists;
  for (const KXManagedAssetPtr& object : assets) {
    StoredAsset& owner = static_cast<StoredAsset&>(*object);
    while (row != rows.end() && row->asset < owner.pk_) ++row;
    if (owner.relationsChanged_) continue;
    for (; row != rows.end() && row->asset == owner.pk_; ++row) {
      const std::shared_ptr<StoredAlbum>& holder = albums_.at(row->album);
      if (!holder->isDeleted()) lists.add(holder);
    }
    owner.albumCount_ = lists.end(&owner.albums_);
    owner.albumsRead_ = true;
    owner.albumsEpoch_ = albumsEpoch_;
  }
}

std::optional<std::uint64_t> LibraryContext::countAssets(const AssetPredicate& predicate,
                                                         ErrorPtr* error) {
  return fetched<std::uint64_t>(*store_, error, [&] {
    SqliteStatement row(store_->database(),
                        wantsEqual(predicate)
                            ? "SELECT count(*) FROM assets WHERE saved_type = ?"
                            : "SELECT count(*) FROM assets WHERE saved_type <> ?");
    row.integer(predicate.savedAssetType);
    std::int64_t count = row.step() ? row.integerAt(0) : 0;
    for (const auto& [pk, object] : changedAssets_) {
      const bool counted = matches(predicate, object->saved().savedType);
      const bool counts = !object->isDeleted() && matches(predicate, object->savedAssetType());
      count += static_cast<int>(counts) - static_cast<int>(counted);
    }
    return static_cast<std::uint64_t>(count);
  });
}

std::optional<std::vector<std::int64_t>> LibraryContext::originalFileSizes(
    const AssetPredicate& predicate, ErrorPtr* error) {
  return fetched<std::vector<std::int64_t>>(*store_, error, [&] {
    SqliteStatement row(
        store_->database(),
        wantsEqual(predicate)
            ? "SELECT t.original_file_size FROM additional_attributes t JOIN assets "
              "a ON a.pk = t.asset WHERE t.original_file_size IS NOT NULL AND "
              "a.saved_type = ? ORDER BY t.asset"
            : "SELECT t.original_file_size FROM additional_attributes t JOIN assets "
              "a ON a.pk = t.asset WHERE t.original_file_size IS NOT NULL AND "
              "a.saved_type <> ? ORDER BY t.asset");
    row.integer(predicate.savedAssetType);
    return sizes(row);
  });
}

std::optional<std::vector<std::int64_t>> LibraryContext::sidecarFileSizes(
    const AssetPredicate& predicate, ErrorPtr* error) {
  return fetched<std::vector<std::int64_t>>(*store_, error, [&] {
    SqliteStatement row(store_->database(),
                        wantsEqual(predicate)
                            ? "SELECT t.compressed_size FROM sidecar_files t JOIN assets a "
                              "ON a.pk = t.asset WHERE t.compressed_size IS NOT NULL AND "
                              "a.saved_type = ? ORDER BY t.pk"
                            : "SELECT t.compressed_size FROM sidecar_files t JOIN assets a "
                              "ON a.pk = t.asset WHERE t.compressed_size IS NOT NULL AND "
                              "a.saved_type <> ? ORDER BY t.pk");
    row.integer(predicate.savedAssetType);
    return sizes(row);
  });
}

std::vector<KXGenericAlbumPtr> LibraryContext::albumsOfKinds(const std::vector<int>& kinds) {
  const auto wanted = [&](const StoredAlbum& album) {
    return !album.isDeleted() &&
           std::find(kinds.begin(), kinds.end(), album.kindValue()) != kinds.end();
  };
  std::vector<KXGenericAlbumPtr> found;
  const std::string list = jsonList(kinds);
  SqliteStatement row(store_->database(),
                      "SELECT pk, uuid, kind, title, pending_type, pending_count, managed "
                      "FROM albums WHERE kind IN (SELECT value FROM json_each(?))");
  row.text(list);
  while (row.step()) {
    const RowId pk = row.integerAt(0);
    const std::shared_ptr<StoredAlbum> object = album(pk, row, 1);
    // Changed ones are looked at below.
    if (!changedAlbums_.contains(pk) && wanted(*object)) found.push_back(object);
  }
  for (const auto& [pk, object] : changedAlbums_) {
    if (object->exists() && wanted(*object)) found.push_back(object);
  }
  std::sort(found.begin(), found.end(), rowIsBefore);
  return found;
}

std::optional<std::vector<KXGenericAlbumPtr>> LibraryContext::fetchEmptyAlbums(
    const std::vector<int>& kinds, ErrorPtr* error) {
  using Albums = std::vector<KXGenericAlbumPtr>;
  return fetched<Albums>(*store_, error, [&] {
    Albums found;
    if (memberships_.empty() && changedAssets_.empty() && changedAlbums_.empty()) {
      const std::string list = jsonList(kinds);
      SqliteStatement row(store_->database(),
                          "SELECT pk, uuid, kind, title, pending_type, pending_count, managed "
                          "FROM albums WHERE kind IN (SELECT value FROM json_each(?)) AND NOT "
                          "EXISTS(SELECT 1 FROM memberships m WHERE m.album = pk) ORDER BY pk");
      row.text(list);
      while (row.step()) found.push_back(album(row.integerAt(0), row, 1));
      return found;
    }
    for (const KXGenericAlbumPtr& candidate : albumsOfKinds(kinds)) {
      if (isEmptyNow(static_cast<const StoredAlbum&>(*candidate).rowId())) {
        found.push_back(candidate);
      }
    }
    return found;
  });
}

// With what is unsaved taken into account.
bool LibraryContext::isEmptyNow(RowId albumRow) {
  const auto alive = [&](RowId assetRow) {
    const auto changed = changedAssets_.find(assetRow);
    return changed == changedAssets_.end() || !changed->second->isDeleted();
  };
  for (const auto& [key, member] : memberships_) {
    if (member && key.second == albumRow && alive(key.first)) return false;
  }
  SqliteStatement row(store_->database(), "SELECT asset FROM memberships WHERE album = ?");
  row.integer(albumRow);
  while (row.step()) {
    const RowId assetRow = row.integerAt(0);
    const auto unsaved = memberships_.find({assetRow, albumRow});
    const bool leaves = unsaved != memberships_.end() && !unsaved->second;
    if (!leaves && alive(assetRow)) return false;
  }
  return true;
}

KXGenericAlbumPtr LibraryContext::albumWithRole(std::string_view role) {
  SqliteStatement row(store_->database(), "SELECT pk FROM albums WHERE role = ?");
  row.text(role);
  return row.step() ? album(row.integerAt(0)) : nullptr;
}

KXGenericAlbumPtr LibraryContext::insertAlbum(std::int32_t kind, ListId list) {
  const std::shared_ptr<StoredAlbum> object = album(store_->newAlbumId());
  AlbumRow row;
  row.kind = kind;
  object->load(std::move(row));
  object->insertedInto_ = list;
  noteChanged(*object);
  return object;
}

KXGenericAlbumPtr LibraryContext::albumWithUUID(std::string_view uuid) {
  SqliteStatement row(store_->database(), "SELECT pk FROM albums WHERE uuid = ? ORDER BY pk");
  row.text(uuid);
  while (row.step()) {
    const std::shared_ptr<StoredAlbum> object = album(row.integerAt(0));
    if (object->exists() && object->uuid() == OptionalString(uuid)) return object;
  }
  for (const auto& [pk, object] : changedAlbums_) {
    if (object->exists() && object->uuid() == OptionalString(uuid)) return object;
  }
  return nullptr;
}

std::shared_ptr<StoredAsset> LibraryContext::assetWithUUID(std::string_view uuid) {
  SqliteStatement row(store_->database(), "SELECT pk FROM assets WHERE uuid = ?");
  row.text(uuid);
  if (row.step()) {
    const std::shared_ptr<StoredAsset> object = asset(row.integerAt(0));
    if (object->exists() && object->uuid() == OptionalString(uuid)) return object;
  }
  for (const auto& [pk, object] : changedAssets_) {
    if (object->exists() && object->uuid() == OptionalString(uuid)) return object;
  }
  return nullptr;
}

std::vector<std::pair<std::string, std::string>> LibraryContext::pathsForAllIncompleteAssets() {
  std::vector<std::pair<std::string, std::string>> found;
  SqliteStatement row(store_->database(),
                      "SELECT uuid, path FROM assets WHERE incomplete = 1 ORDER BY pk");
  while (row.step()) found.emplace_back(row.textAt(0), row.textAt(1));
  return found;
}

std::shared_ptr<KXManagedAlbumList> LibraryContext::list(ListId id) {
  return lists_[static_cast<int>(id) - 1];
}

std::vector<std::shared_ptr<KXManagedObject>> LibraryContext::registeredObjects() {
  std::vector<std::shared_ptr<KXManagedObject>> objects;
  const auto append = [&](const auto& object) { objects.push_back(object); };
  assets_.forEach(append);
  faces_.forEach(append);
  albums_.forEach(append);
  return objects;
}

void LibraryContext::refreshObject(const std::shared_ptr<KXManagedObject>& object,
                                   bool mergeChanges) {
  if (const auto known = std::dynamic_pointer_cast<StoredAsset>(object)) {
    if (known->context_ != this) return;
    if (!mergeChanges) dropChangesOf(*known);
    known->fault();
  } else if (const auto album = std::dynamic_pointer_cast<StoredAlbum>(object)) {
    if (album->context_ != this) return;
    if (!mergeChanges && !album->insertedInto_) {
      album->drop();
      changedAlbums_.erase(album->pk_);
    }
    album->fault();
  } else if (const auto face = std::dynamic_pointer_cast<StoredFace>(object)) {
    if (face->context_ == this && !face->inserted_) face->fault();
  }
}

void LibraryContext::dropChangesOf(StoredAsset& asset) {
  asset.drop();
  changedAssets_.erase(asset.pk_);
  memberships_.erase(memberships_.lower_bound({asset.pk_, 0}),
                     memberships_.lower_bound({asset.pk_ + 1, 0}));
  const auto first = changedFaces_.lower_bound({asset.pk_, 0});
  const auto last = changedFaces_.lower_bound({asset.pk_ + 1, 0});
  for (auto entry = first; entry != last; ++entry) {
    StoredFace& face = *entry->second;
    if (face.inserted_) {
      face.die();
      faces_.erase(face.pk_);
    } else {
      face.life_ = StoredFace::Life::kLive;
    }
  }
  changedFaces_.erase(first, last);
}

}  // namespace kx
