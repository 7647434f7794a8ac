#include "device/StoredAlbum.h"

#include <algorithm>

#include "device/LibraryContext.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

const AlbumRow kGoneAlbum = [] {
  AlbumRow row;
  row.pendingType = 0;
  return row;
}();

std::optional<std::string> owned(OptionalString text) {
  if (!text) return std::nullopt;
  return std::string(*text);
}

OptionalString viewed(const std::optional<std::string>& text) {
  if (!text) return std::nullopt;
  return std::string_view(*text);
}

}  // namespace

const AlbumRow& StoredAlbum::saved() const {
  if (life_ == Life::kGone || context_ == nullptr) return kGoneAlbum;
  if (!row_) {
    SqliteStatement row(context_->store().database(),
                        "SELECT uuid, kind, title, pending_type, pending_count, managed "
                        "FROM albums WHERE pk = ?");
    row.integer(pk_);
    if (!row.step()) {
      life_ = Life::kGone;
      return kGoneAlbum;
    }
    load(readAlbumRow(row, 0));
  }
  return *row_;
}

AlbumRow StoredAlbum::edited() const {
  AlbumRow row = saved();
  if (!edits_) return row;
  if (edits_->uuid) row.uuid = *edits_->uuid;
  if (edits_->title) row.title = *edits_->title;
  if (edits_->kind) row.kind = *edits_->kind;
  if (edits_->pendingType) row.pendingType = *edits_->pendingType;
  if (edits_->pendingCount) row.pendingCount = *edits_->pendingCount;
  return row;
}

template <typename T, typename V>
void StoredAlbum::edit(std::optional<T> Edits::*field, const T& saved, V value) {
  if (!live()) return;
  T wanted = std::move(value);
  if (wanted == saved) {
    if (edits_) (edits_.get()->*field).reset();
    return;
  }
  if (!edits_) edits_ = std::make_unique<Edits>();
  (edits_.get()->*field) = std::move(wanted);
  context_->noteChanged(*this);
}

ObjectID StoredAlbum::objectID() const {
  return context_ == nullptr ? ObjectID() : context_->store().objectID("Album", pk_);
}

bool StoredAlbum::isDeleted() const { return life_ != Life::kLive; }

bool StoredAlbum::hasChanges() const {
  return life_ == Life::kDeleting || insertedInto_.has_value() || (edits_ && !edits_->empty());
}

void StoredAlbum::deleteObject() {
  if (!exists()) return;  // the row is read for what is told of it later
  life_ = Life::kDeleting;
  context_->noteDeleted(*this);
}

std::string StoredAlbum::description() const {
  return "<" + className() + ": " + describe(uuid()) + " \"" + describe(title()) + "\" " +
         shortObjectIDURI() + ">";
}

OptionalString StoredAlbum::uuid() const {
  return viewed(edits_ && edits_->uuid ? *edits_->uuid : saved().uuid);
}

void StoredAlbum::setUuid(OptionalString uuid) { edit(&Edits::uuid, saved().uuid, owned(uuid)); }

OptionalString StoredAlbum::title() const {
  return viewed(edits_ && edits_->title ? *edits_->title : saved().title);
}

void StoredAlbum::setTitle(OptionalString title) {
  edit(&Edits::title, saved().title, owned(title));
}

std::int32_t StoredAlbum::kindValue() const {
  return edits_ && edits_->kind ? *edits_->kind : saved().kind;
}

void StoredAlbum::setKindValue(std::int32_t kind) { edit(&Edits::kind, saved().kind, kind); }

std::int32_t StoredAlbum::pendingItemsType() const {
  return edits_ && edits_->pendingType ? *edits_->pendingType : saved().pendingType;
}

void StoredAlbum::setPendingItemsType(std::int32_t type) {
  edit(&Edits::pendingType, saved().pendingType, type);
}

std::uint32_t StoredAlbum::pendingItemsCount() const {
  return edits_ && edits_->pendingCount ? *edits_->pendingCount : saved().pendingCount;
}

void StoredAlbum::setPendingItemsCount(std::uint32_t count) {
  edit(&Edits::pendingCount, saved().pendingCount, count);
}

void StoredAlbum::reducePendingItemsCountBy(std::uint32_t count) {
  const std::uint32_t present = pendingItemsCount();
  setPendingItemsCount(present - std::min(present, count));
}

std::string StoredAlbum::localizedTitle() const { return describe(title()); }

std::string StoredAlbum::_kindDescription() const {
  switch (kindValue()) {
    case kKXAlbumKindSyncedAlbum:
      return "SyncedAlbum";
    case kKXAlbumKindSyncedEvent:
      return "SyncedEvent";
    case kKXAlbumKindSyncedFaceAlbum:
      return "SyncedFaceAlbum";
    default:
      return "Album kind " + std::to_string(kindValue());
  }
}

std::string StoredAlbum::shortObjectIDURI() const { return "Album/p" + std::to_string(pk_); }

std::string StoredAlbum::className() const {
  return saved().managed ? KXManagedAlbum::kClassName : "KXGenericAlbum";
}

KXManagedAlbum* StoredAlbum::asManagedAlbum() { return saved().managed ? this : nullptr; }

void StoredAlbum::removeAsset(const KXManagedAssetPtr& asset) {
  const auto stored = std::dynamic_pointer_cast<StoredAsset>(asset);
  if (live() && stored) stored->leave(*this);
}

void StoredAlbum::addAssetUsingTesselAlbumOrder(const KXManagedAssetPtr& asset) {
  const auto stored = std::dynamic_pointer_cast<StoredAsset>(asset);
  if (live() && stored) stored->join(*this);
}

void StoredAlbum::sortAssetsUsingTesselAlbumOrder() {
  if (!live() || sortWanted_) return;
  sortWanted_ = true;
  context_->noteChanged(*this);
}

void StoredAlbum::fault() {
  if (!insertedInto_) row_.reset();
}

void StoredAlbum::settle() {
  if (life_ == Life::kDeleting) {
    die();
    return;
  }
  load(edited());
  edits_.reset();
  insertedInto_.reset();
  sortWanted_ = false;
}

void StoredAlbum::drop() {
  if (insertedInto_) {
    die();
    return;
  }
  if (life_ == Life::kDeleting) life_ = Life::kLive;
  edits_.reset();
  sortWanted_ = false;
}

void StoredAlbum::die() {
  life_ = Life::kGone;
  row_.reset();
  edits_.reset();
  insertedInto_.reset();
  sortWanted_ = false;
}

}  // namespace kx
