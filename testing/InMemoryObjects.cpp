#include "testing/InMemoryObjects.h"

#include <algorithm>

#include "platform/foundation/Exceptions.h"

namespace kx {
namespace {

constexpr const char* kStoreURI = "kxlibrary://memory/";

ObjectID idOf(const char* entity, std::int64_t row) {
  return ObjectID(std::string(kStoreURI) + entity + "/p" + std::to_string(row));
}

std::string describeRow(const char* name, const std::optional<std::string>& uuid,
                        const std::optional<std::string>& title) {
  std::string text = std::string("<") + name + ": " + uuid.value_or("(null)");
  if (title) text += " \"" + *title + "\"";
  return text + ">";
}

std::optional<std::string> copyOf(OptionalString text) {
  return text ? std::optional<std::string>(*text) : std::nullopt;
}

}  // namespace

const InMemoryFaceRow& InMemoryFace::data() const {
  isFault_ = false;
  return context_.face(row_);
}

ObjectID InMemoryFace::objectID() const { return idOf("Face", row_); }

void InMemoryFace::deleteObject() {
  const std::int64_t owner = data().asset;
  context_.deleteRow(row_);
  if (const KXManagedAssetPtr asset = context_.assetObject(owner)) {
    static_cast<InMemoryAsset&>(*asset).forgetFaces();
  }
}

std::string InMemoryFace::description() const {
  return "<KXManagedFace: " + std::to_string(identifier()) + ">";
}

const InMemoryAlbumRow& InMemoryAlbum::data() const {
  isFault_ = false;
  return context_.album(row_);
}

ObjectID InMemoryAlbum::objectID() const { return idOf("Album", row_); }

void InMemoryAlbum::deleteObject() {
  context_.deleteRow(row_);
  context_.touch();
}

std::string InMemoryAlbum::description() const {
  return describeRow(className().c_str(), data().uuid, data().title);
}

OptionalString InMemoryAlbum::uuid() const { return data().uuid; }

void InMemoryAlbum::setUuid(OptionalString uuid) {
  if (data().uuid != uuid) context_.changeAlbum(row_).uuid = copyOf(uuid);
}

OptionalString InMemoryAlbum::title() const { return data().title; }

void InMemoryAlbum::setTitle(OptionalString title) {
  if (data().title != title) context_.changeAlbum(row_).title = copyOf(title);
}

void InMemoryAlbum::setKindValue(std::int32_t kind) {
  if (data().kind != kind) context_.changeAlbum(row_).kind = kind;
}

void InMemoryAlbum::setPendingItemsType(std::int32_t type) {
  if (data().pendingItemsType != type) context_.changeAlbum(row_).pendingItemsType = type;
}

void InMemoryAlbum::setPendingItemsCount(std::uint32_t count) {
  if (data().pendingItemsCount != count) context_.changeAlbum(row_).pendingItemsCount = count;
}

void InMemoryAlbum::reducePendingItemsCountBy(std::uint32_t count) {
  setPendingItemsCount(data().pendingItemsCount - std::min(count, data().pendingItemsCount));
}

std::string InMemoryAlbum::localizedTitle() const { return data().title.value_or(""); }

std::string InMemoryAlbum::_kindDescription() const {
  return "kind " + std::to_string(data().kind);
}

std::string InMemoryAlbum::shortObjectIDURI() const { return "Album/p" + std::to_string(row_); }

std::string InMemoryAlbum::className() const {
  return data().managed ? kClassName : "KXGenericAlbum";
}

void InMemoryAlbum::removeAsset(const KXManagedAssetPtr& asset) {
  const std::int64_t row = static_cast<const InMemoryAsset&>(*asset).row();
  std::vector<std::int64_t> members = data().assets;
  if (std::erase(members, row) == 0) return;
  context_.setAlbumMembers(row_, std::move(members));
  context_.changeAsset(row).albums.erase(row_);
}

void InMemoryAlbum::addAssetUsingTesselAlbumOrder(const KXManagedAssetPtr& asset) {
  const std::int64_t row = static_cast<const InMemoryAsset&>(*asset).row();
  std::vector<std::int64_t> members = data().assets;
  if (std::find(members.begin(), members.end(), row) != members.end()) return;
  const auto place = std::find_if(members.begin(), members.end(), [this, row](std::int64_t other) {
    return context_.isOrderedBefore(row_, row, other);
  });
  members.insert(place, row);
  context_.setAlbumMembers(row_, std::move(members));
  context_.changeAsset(row).albums.insert(row_);
}

void InMemoryAlbum::sortAssetsUsingTesselAlbumOrder() {
  std::vector<std::int64_t> members = data().assets;
  std::stable_sort(members.begin(), members.end(), [this](std::int64_t a, std::int64_t b) {
    return context_.isOrderedBefore(row_, a, b);
  });
  if (members != data().assets) context_.setAlbumMembers(row_, std::move(members));
}

const InMemoryAssetRow& InMemoryAsset::data() const {
  isFault_ = false;
  return context_.asset(row_);
}

ObjectID InMemoryAsset::objectID() const { return idOf("Asset", row_); }

std::string InMemoryAsset::description() const {
  return describeRow("KXManagedAsset", data().uuid, std::nullopt);
}

OptionalString InMemoryAsset::uuid() const { return data().uuid; }

void InMemoryAsset::setSortToken(double token) {
  if (data().sortToken != token) context_.changeAsset(row_).sortToken = token;
}

bool InMemoryAsset::isLocatedAtCoordinates(const std::optional<Coordinate>& coordinate) const {
  return data().location == coordinate;
}

void InMemoryAsset::setLocation(const std::optional<Coordinate>& location) {
  if (data().location != location) context_.changeAsset(row_).location = location;
}

std::span<const KXManagedFacePtr> InMemoryAsset::faces() {
  if (facesRevision_ != context_.revision()) {
    faces_.clear();
    for (const std::int64_t face : data().faces) {
      if (!context_.isDeleted(face)) faces_.push_back(context_.faceObject(face));
    }
    facesRevision_ = context_.revision();
  }
  return faces_;
}

void InMemoryAsset::addFace(const Rect& relativeRect, std::uint16_t identifier,
                            OptionalString albumUUID) {
  context_.insertFace(row_, InMemoryFaceRow{identifier, relativeRect, copyOf(albumUUID), row_});
  forgetFaces();
}

std::span<const KXGenericAlbumPtr> InMemoryAsset::albums() {
  if (albumsRevision_ != context_.revision()) {
    albums_.clear();
    for (const std::int64_t album : data().albums) {
      if (!context_.isDeleted(album)) albums_.push_back(context_.albumObject(album));
    }
    albumsRevision_ = context_.revision();
  }
  return albums_;
}

std::span<const KXGenericAlbumPtr> InMemoryAlbumList::albums() {
  albums_.clear();
  for (const std::int64_t row : context_.list(which_)) albums_.push_back(context_.albumObject(row));
  return albums_;
}

void InMemoryAlbumList::reorder(std::vector<KXGenericAlbumPtr> newOrder) {
  std::vector<std::int64_t> rows;
  for (const KXGenericAlbumPtr& album : newOrder) {
    rows.push_back(static_cast<const InMemoryAlbum&>(*album).row());
  }
  const std::vector<std::int64_t> present = context_.list(which_);
  if (!std::is_permutation(rows.begin(), rows.end(), present.begin(), present.end())) {
    throw InternalInconsistency("an album list is reordered into another set of albums");
  }
  ++state_.listSorts;
  if (rows != present) context_.setList(which_, std::move(rows));
}

}  // namespace kx
