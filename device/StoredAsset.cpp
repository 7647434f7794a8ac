#include "device/StoredAsset.h"

#include <algorithm>

#include "device/LibraryContext.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

const AssetRow kGoneAsset;
const FaceRow kGoneFace;

RowId rowOf(const KXGenericAlbumPtr& album) {
  return static_cast<const StoredAlbum&>(*album).rowId();
}

// Where an album stands, or would stand, among albums in row order.
std::vector<KXGenericAlbumPtr>::iterator placeOf(std::vector<KXGenericAlbumPtr>& albums, RowId pk) {
  return std::lower_bound(albums.begin(), albums.end(), pk,
                          [](const KXGenericAlbumPtr& a, RowId row) { return rowOf(a) < row; });
}

}  // namespace

const FaceRow& StoredFace::saved() const {
  if (life_ == Life::kGone || context_ == nullptr) return kGoneFace;
  if (!loaded_) {
    SqliteStatement row(context_->store().database(),
                        "SELECT identifier, x, y, width, height, album_uuid FROM faces "
                        "WHERE pk = ?");
    row.integer(pk_);
    if (!row.step()) {
      life_ = Life::kGone;
      return kGoneFace;
    }
    load(readFaceRow(row, 0));
  }
  return row_;
}

void StoredFace::load(FaceRow row) const {
  row_ = std::move(row);
  loaded_ = true;
}

void StoredFace::fault() {
  loaded_ = false;
  row_ = FaceRow();
}

ObjectID StoredFace::objectID() const {
  return context_ == nullptr ? ObjectID() : context_->store().objectID("Face", pk_);
}

void StoredFace::deleteObject() {
  if (life_ != Life::kLive || context_ == nullptr) return;
  life_ = Life::kDeleting;
  context_->noteDeleted(*this);
}

std::string StoredFace::description() const {
  return "<KXManagedFace: " + std::to_string(identifier()) + " " + relativeRect().description() +
         ">";
}

void StoredFace::die() {
  life_ = Life::kGone;
  inserted_ = false;
  fault();
}

const AssetRow& StoredAsset::saved() const {
  if (life_ == Life::kGone || context_ == nullptr) return kGoneAsset;
  if (!loaded_) {
    std::optional<AssetRow> row = assetRow(context_->store().database(), pk_);
    if (!row) {
      life_ = Life::kGone;
      return kGoneAsset;
    }
    load(std::move(*row));
  }
  return row_;
}

void StoredAsset::load(AssetRow row) const {
  row_ = std::move(row);
  loaded_ = true;
}

DeviceAssetFields& StoredAsset::edits() {
  if (!edits_) edits_ = std::make_unique<DeviceAssetFields>();
  context_->noteChanged(*this);
  return *edits_;
}

ObjectID StoredAsset::objectID() const {
  return context_ == nullptr ? ObjectID() : context_->store().objectID("Asset", pk_);
}

bool StoredAsset::hasChanges() const {
  return life_ == Life::kDeleting || edits_ != nullptr || relationsChanged_;
}

void StoredAsset::deleteObject() {
  if (!exists()) return;  // the row is read for what is told of it later
  life_ = Life::kDeleting;
  context_->noteChanged(*this);
}

std::string StoredAsset::description() const {
  return "<KXManagedAsset: " + describe(uuid()) + ">";
}

OptionalString StoredAsset::uuid() const {
  if (edits_ && edits_->uuid) return std::string_view(*edits_->uuid);
  const AssetRow& row = saved();
  if (life_ == Life::kGone || context_ == nullptr) return std::nullopt;
  return std::string_view(row.uuid);
}

std::int32_t StoredAsset::savedAssetType() const {
  return edits_ && edits_->savedAssetType ? *edits_->savedAssetType : saved().savedType;
}

std::optional<Date> StoredAsset::modificationDate() const {
  if (edits_ && edits_->modificationDate) return *edits_->modificationDate;
  const std::optional<double>& seconds = saved().modificationDate;
  if (!seconds) return std::nullopt;
  return Date{*seconds};
}

std::optional<double> StoredAsset::sortToken() const {
  return edits_ && edits_->sortToken ? *edits_->sortToken : saved().sortToken;
}

void StoredAsset::setSortToken(double token) {
  if (!live() || sortToken() == std::optional<double>(token)) return;
  edits().sortToken = token;
}

std::optional<Coordinate> StoredAsset::location() const {
  return edits_ && edits_->location ? *edits_->location : saved().location;
}

bool StoredAsset::isLocatedAtCoordinates(const std::optional<Coordinate>& coordinate) const {
  return location() == coordinate;
}

void StoredAsset::setLocation(const std::optional<Coordinate>& wanted) {
  if (!live() || location() == wanted) return;
  edits().location = wanted;
}

void StoredAsset::setFields(const DeviceAssetFields& fields) {
  if (!live()) return;
  DeviceAssetFields& unsaved = edits();
  const auto take = [](auto& to, const auto& from) {
    if (from) to = from;
  };
  take(unsaved.uuid, fields.uuid);
  take(unsaved.path, fields.path);
  take(unsaved.savedAssetType, fields.savedAssetType);
  take(unsaved.isVideo, fields.isVideo);
  take(unsaved.incomplete, fields.incomplete);
  take(unsaved.creationDate, fields.creationDate);
  take(unsaved.modificationDate, fields.modificationDate);
  take(unsaved.sortToken, fields.sortToken);
  take(unsaved.location, fields.location);
  take(unsaved.originalFileName, fields.originalFileName);
  if (!fields.faces) return;
  const std::span<const KXManagedFacePtr> present = faces();
  const std::vector<KXManagedFacePtr> old(present.begin(), present.end());
  for (const KXManagedFacePtr& face : old) face->deleteObject();
  for (const DeviceFace& face : *fields.faces) {
    addFace(face.relativeRect, face.identifier,
            face.albumUUID ? OptionalString(*face.albumUUID) : std::nullopt);
  }
}

std::span<const KXManagedFacePtr> StoredAsset::faces() {
  if (context_ == nullptr || life_ == Life::kGone) return {};
  if (!facesRead_) {
    faces_.clear();
    SqliteStatement row(context_->store().database(),
                        "SELECT pk, identifier, x, y, width, height, album_uuid FROM faces "
                        "WHERE asset = ? ORDER BY pk");
    row.integer(pk_);
    while (row.step()) {
      const std::shared_ptr<StoredFace> face = context_->face(row.integerAt(0), pk_);
      if (!face->loaded_) face->load(readFaceRow(row, 1));
      faces_.push_back(face);
    }
    for (const auto& face : context_->insertedFaces(pk_)) faces_.push_back(face);
    facesRead_ = true;
  }
  std::erase_if(faces_, [](const KXManagedFacePtr& face) { return face->isDeleted(); });
  return faces_;
}

void StoredAsset::addFace(const Rect& relativeRect, std::uint16_t identifier,
                          OptionalString albumUUID) {
  if (!live()) return;
  FaceRow row;
  row.identifier = identifier;
  row.relativeRect = relativeRect;
  if (albumUUID) row.albumUUID = std::string(*albumUUID);
  faces();  // read before the new one is there
  faces_.push_back(context_->insertFace(pk_, std::move(row)));
  relationsChanged_ = true;
  context_->noteChanged(*this);
}

void StoredAsset::readAlbums() {
  std::vector<KXGenericAlbumPtr> found;
  {
    SqliteStatement row(context_->store().database(),
                        "SELECT album FROM memberships WHERE asset = ? ORDER BY album");
    row.integer(pk_);
    while (row.step()) found.push_back(context_->album(row.integerAt(0)));
  }
  for (const auto& [album, member] : context_->unsavedMemberships(pk_)) {
    const auto place = placeOf(found, album);
    const bool present = place != found.end() && rowOf(*place) == album;
    if (member && !present) found.insert(place, context_->album(album));
    if (!member && present) found.erase(place);
  }
  std::erase_if(found, [](const KXGenericAlbumPtr& album) { return album->isDeleted(); });
  setAlbums(found);
  albumsRead_ = true;
  albumsEpoch_ = context_->albumsEpoch();
}

void StoredAsset::setAlbums(std::span<const KXGenericAlbumPtr> albums) {
  const auto own = std::make_shared<KXGenericAlbumPtr[]>(albums.size());
  std::copy(albums.begin(), albums.end(), own.get());
  albums_ = own;
  albumCount_ = static_cast<std::uint32_t>(albums.size());
}

std::span<const KXGenericAlbumPtr> StoredAsset::albums() {
  if (context_ == nullptr || life_ == Life::kGone) return {};
  if (!albumsRead_ || albumsEpoch_ != context_->albumsEpoch()) readAlbums();
  return {albums_.get(), albumCount_};
}

bool StoredAsset::isIn(const StoredAlbum& album) {
  const std::span<const KXGenericAlbumPtr> all = albums();
  return std::any_of(all.begin(), all.end(),
                     [&](const KXGenericAlbumPtr& a) { return rowOf(a) == album.rowId(); });
}

void StoredAsset::join(StoredAlbum& album) {
  if (!live() || isIn(album)) return;
  context_->setMembership(album.rowId(), pk_, true);
  std::vector<KXGenericAlbumPtr> now(albums_.get(), albums_.get() + albumCount_);
  now.insert(placeOf(now, album.rowId()), album.shared_from_this());
  setAlbums(now);
  relationsChanged_ = true;
  context_->noteChanged(*this);
}

void StoredAsset::leave(StoredAlbum& album) {
  if (!live() || !isIn(album)) return;
  context_->setMembership(album.rowId(), pk_, false);
  std::vector<KXGenericAlbumPtr> now(albums_.get(), albums_.get() + albumCount_);
  now.erase(placeOf(now, album.rowId()));
  setAlbums(now);
  relationsChanged_ = true;
  context_->noteChanged(*this);
}

std::vector<std::string> StoredAsset::filePathsWithoutThumbs() {
  std::vector<std::string> paths;
  if (context_ == nullptr || life_ == Life::kGone) return paths;
  SqliteDatabase& database = context_->store().database();
  {
    SqliteStatement row(database, "SELECT path FROM asset_files WHERE asset = ? ORDER BY ordinal");
    row.integer(pk_);
    while (row.step()) paths.push_back(row.textAt(0));
  }
  if (!paths.empty()) return paths;
  if (edits_ && edits_->path) return {*edits_->path};
  SqliteStatement row(database, "SELECT path FROM assets WHERE pk = ?");
  row.integer(pk_);
  if (row.step()) paths.push_back(row.textAt(0));
  return paths;
}

void StoredAsset::forgetRelations() {
  facesRead_ = false;
  albumsRead_ = false;
  faces_ = {};
  albums_ = nullptr;
  albumCount_ = 0;
}

void StoredAsset::fault() {
  loaded_ = false;
  row_ = AssetRow();
  forgetRelations();
}

void StoredAsset::settle() {
  if (edits_) loaded_ = false;
  edits_.reset();
  relationsChanged_ = false;
}

void StoredAsset::drop() {
  if (life_ == Life::kDeleting) life_ = Life::kLive;
  edits_.reset();
  if (relationsChanged_) forgetRelations();
  relationsChanged_ = false;
}

void StoredAsset::die() {
  life_ = Life::kGone;
  edits_.reset();
  relationsChanged_ = false;
  fault();
}

}  // namespace kx
