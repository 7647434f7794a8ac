#include "device/LibraryContext.h"

#include <algorithm>

#include "device/DeviceErrors.h"

namespace kx {

LibraryContext::LibraryContext(std::shared_ptr<LibraryStore> store) : store_(std::move(store)) {
  for (int i = 0; i < kListCount; ++i) {
    lists_[i] = std::make_shared<StoredAlbumList>(this, static_cast<ListId>(i + 1));
  }
  store_->open(this);
}

LibraryContext::~LibraryContext() {
  store_->close(this);
  // Each object is looked at once: most go at that.
  const auto letGo = [](auto& object) {
    object->context_ = nullptr;
    object = nullptr;
  };
  assets_.forEach(letGo);
  faces_.forEach(letGo);
  albums_.forEach(letGo);
  for (const auto& list : lists_) list->context_ = nullptr;
}

std::shared_ptr<StoredAlbum> LibraryContext::album(RowId pk) {
  std::shared_ptr<StoredAlbum>& entry = albums_.at(pk);
  if (!entry) entry = std::make_shared<StoredAlbum>(this, pk);
  return entry;
}

std::shared_ptr<StoredAlbum> LibraryContext::album(RowId pk, const SqliteStatement& row,
                                                   int first) {
  std::shared_ptr<StoredAlbum> object = album(pk);
  if (!object->row_) object->load(readAlbumRow(row, first));
  return object;
}

std::shared_ptr<StoredAsset> LibraryContext::asset(RowId pk) {
  std::shared_ptr<StoredAsset>& entry = assets_.at(pk);
  if (!entry) entry = blocks_.make<StoredAsset>(this, pk);
  return entry;
}

std::shared_ptr<StoredFace> LibraryContext::face(RowId pk, RowId asset) {
  std::shared_ptr<StoredFace>& entry = faces_.at(pk);
  if (!entry) entry = blocks_.make<StoredFace>(this, pk, asset);
  return entry;
}

std::shared_ptr<StoredFace> LibraryContext::insertFace(RowId asset, FaceRow row) {
  const std::shared_ptr<StoredFace> object = face(store_->newFaceId(), asset);
  object->load(std::move(row));
  object->inserted_ = true;
  changedFaces_[{asset, object->pk_}] = object;
  return object;
}

std::vector<std::shared_ptr<StoredFace>> LibraryContext::insertedFaces(RowId asset) const {
  std::vector<std::shared_ptr<StoredFace>> found;
  for (auto entry = changedFaces_.lower_bound({asset, 0});
       entry != changedFaces_.end() && entry->first.first == asset; ++entry) {
    if (entry->second->inserted_) found.push_back(entry->second);
  }
  return found;
}

void LibraryContext::noteChanged(StoredAlbum& changed) {
  changedAlbums_.try_emplace(changed.pk_, changed.shared_from_this());
}

void LibraryContext::noteChanged(StoredAsset& changed) {
  changedAssets_.try_emplace(changed.pk_, changed.shared_from_this());
}

void LibraryContext::noteDeleted(StoredAlbum& deleted) {
  noteChanged(deleted);
  ++albumsEpoch_;
}

void LibraryContext::noteDeleted(StoredFace& deleted) {
  changedFaces_.try_emplace({deleted.asset_, deleted.pk_}, deleted.shared_from_this());
  const std::shared_ptr<StoredAsset> owner = asset(deleted.asset_);
  owner->relationsChanged_ = true;
  noteChanged(*owner);
}

void LibraryContext::setMembership(RowId album, RowId asset, bool member) {
  const auto [entry, isNew] = memberships_.try_emplace({asset, album}, member);
  if (!isNew && entry->second != member) memberships_.erase(entry);
}

std::vector<std::pair<RowId, bool>> LibraryContext::unsavedMemberships(RowId asset) const {
  std::vector<std::pair<RowId, bool>> found;
  for (auto entry = memberships_.lower_bound({asset, 0});
       entry != memberships_.end() && entry->first.first == asset; ++entry) {
    found.emplace_back(entry->first.second, entry->second);
  }
  return found;
}

std::vector<RowId> LibraryContext::insertedAlbums(ListId list, RowId after) const {
  std::vector<RowId> found;
  for (auto entry = changedAlbums_.upper_bound(after); entry != changedAlbums_.end(); ++entry) {
    const StoredAlbum& album = *entry->second;
    if (album.insertedInto_ == list && !album.isDeleted()) found.push_back(entry->first);
  }
  return found;
}

bool LibraryContext::hasChanges() const {
  const auto changed = [](const auto& entry) { return entry.second->hasChanges(); };
  return !memberships_.empty() || !changedFaces_.empty() ||
         std::any_of(changedAlbums_.begin(), changedAlbums_.end(),
                     [&](const auto& e) { return changed(e) || e.second->sortWanted_; }) ||
         std::any_of(changedAssets_.begin(), changedAssets_.end(), changed) ||
         std::any_of(std::begin(lists_), std::end(lists_),
                     [](const auto& list) { return list->hasChanges(); });
}

ErrorPtr LibraryContext::save() {
  ErrorPtr failure;
  if (hasChanges()) {
    failure = store_->write([this](LibraryWriter& writer) { flush(writer); }, this);
  }
  if (failure) {
    dropChanges();
  } else {
    settle();
  }
  return failure;
}

std::optional<LibraryWriter::AssetAtHand> LibraryContext::savedAtHand(RowId pk) const {
  const StoredAsset* const known = assets_.peek(pk);
  if (known == nullptr || !known->loaded_ || known->life_ == StoredAsset::Life::kGone) {
    return std::nullopt;
  }
  return LibraryWriter::AssetAtHand{known->row_.uuid, known->row_.sortToken};
}

std::optional<LibraryWriter::AssetAtHand> LibraryContext::assetAtHand(RowId pk) const {
  const StoredAsset* const known = assets_.peek(pk);
  if (known == nullptr || !known->loaded_ || known->isDeleted()) return std::nullopt;
  const OptionalString uuid = known->uuid();
  if (!uuid) return std::nullopt;
  return LibraryWriter::AssetAtHand{*uuid, known->sortToken()};
}

void LibraryContext::flush(LibraryWriter& writer) {
  flushAlbums(writer);
  flushAssets(writer);
  writer.setAtHand([this](RowId pk) { return assetAtHand(pk); });
  flushMemberships(writer);
  for (const auto& [pk, album] : changedAlbums_) {
    if (album->life_ == StoredAlbum::Life::kDeleting && !album->insertedInto_) {
      writer.deleteAlbum(pk, album->saved());
    } else if (album->life_ == StoredAlbum::Life::kLive && album->sortWanted_) {
      writer.sortAlbum(pk);
    }
  }
  flushLists(writer);
}

void LibraryContext::flushAlbums(LibraryWriter& writer) {
  for (const auto& [pk, album] : changedAlbums_) {
    if (album->life_ != StoredAlbum::Life::kLive) continue;
    if (album->insertedInto_) {
      writer.insertAlbum(pk, album->edited(), album->insertedInto_);
    } else {
      writer.updateAlbum(pk, album->saved(), album->edited());
    }
  }
}

void LibraryContext::flushAssets(LibraryWriter& writer) {
  for (const auto& [pk, asset] : changedAssets_) {
    const AssetRow& saved = asset->saved();
    if (asset->life_ == StoredAsset::Life::kDeleting) {
      if (saved.savedType == kKXSavedAssetTypeSynced) {
        for (std::string& path : asset->filePathsWithoutThumbs()) {
          writer.releaseFile(std::move(path));
        }
        writer.changes().deletedAssets.insert(saved.uuid);
      }
      writer.deleteAsset(pk);
    } else if (asset->life_ == StoredAsset::Life::kLive && asset->hasChanges()) {
      if (asset->edits_) writer.updateAsset(pk, *asset->edits_);
      writer.changes().updatedAssets.insert(saved.uuid);
    }
  }
  for (const auto& [key, face] : changedFaces_) {
    const auto owner = changedAssets_.find(face->asset_);
    if (owner != changedAssets_.end() && owner->second->isDeleted()) continue;
    if (face->life_ == StoredFace::Life::kDeleting) {
      if (!face->inserted_) writer.deleteFace(face->pk_, face->asset_);
    } else if (face->life_ == StoredFace::Life::kLive && face->inserted_) {
      writer.insertFace(face->pk_, face->asset_, face->saved());
    }
  }
}

void LibraryContext::flushMemberships(LibraryWriter& writer) {
  for (const auto& [key, member] : memberships_) {
    const auto& [assetRow, albumRow] = key;
    const std::shared_ptr<StoredAsset> owner = asset(assetRow);
    const std::shared_ptr<StoredAlbum> container = album(albumRow);
    if (!owner->exists() || !container->exists()) continue;
    if (member) {
      writer.addMembership(albumRow, assetRow, *owner->uuid());
    } else {
      writer.removeMembership(albumRow, assetRow);
    }
  }
}

void LibraryContext::flushLists(LibraryWriter& writer) {
  for (const auto& list : lists_) {
    if (list->hasChanges()) writer.setListOrder(list->id_, list->order());
  }
}

void LibraryContext::settle() {
  bool albumsGone = false;
  for (const auto& [pk, album] : changedAlbums_) {
    album->settle();
    if (album->isDeleted()) {
      albumsGone = true;
      albums_.erase(pk);
    }
  }
  for (const auto& [pk, asset] : changedAssets_) {
    if (asset->isDeleted()) {
      forget(*asset);
    } else {
      asset->settle();
    }
  }
  for (const auto& [key, face] : changedFaces_) {
    if (face->life_ == StoredFace::Life::kLive && assets_.find(face->asset_)) {
      face->inserted_ = false;
      continue;
    }
    face->die();
    faces_.erase(face->pk_);
  }
  if (albumsGone) ++albumsEpoch_;
  for (const auto& list : lists_) list->fault();
  changedAlbums_.clear();
  changedAssets_.clear();
  changedFaces_.clear();
  memberships_.clear();
}

void LibraryContext::forget(StoredAsset& gone) {
  for (const KXManagedFacePtr& face : gone.faces_) {
    StoredFace& stored = static_cast<StoredFace&>(*face);
    stored.die();
    faces_.erase(stored.pk_);
  }
  gone.die();
  assets_.erase(gone.pk_);
}

void LibraryContext::dropChanges() {
  for (const auto& [pk, album] : changedAlbums_) {
    album->drop();
    if (album->isDeleted()) albums_.erase(pk);
  }
  for (const auto& [pk, asset] : changedAssets_) asset->drop();
  for (const auto& [key, face] : changedFaces_) {
    if (face->inserted_) {
      face->die();
      faces_.erase(face->pk_);
    } else {
      face->life_ = StoredFace::Life::kLive;
    }
    if (const auto owner = assets_.find(face->asset_)) owner->forgetRelations();
  }
  ++albumsEpoch_;
  for (const auto& list : lists_) list->fault();
  changedAlbums_.clear();
  changedAssets_.clear();
  changedFaces_.clear();
  memberships_.clear();
}

void LibraryContext::refreshRows(const RowChanges& rows) {
  for (const RowId pk : rows.assets) {
    const std::shared_ptr<StoredAsset> known = assets_.find(pk);
    if (!known) continue;
    for (const KXManagedFacePtr& face : known->faces_) {
      StoredFace& stored = static_cast<StoredFace&>(*face);
      if (!stored.inserted_) stored.fault();
    }
    known->fault();
  }
  for (const RowId pk : rows.deletedAssets) {
    const std::shared_ptr<StoredAsset> known = assets_.find(pk);
    if (!known) continue;
    changedAssets_.erase(pk);
    forget(*known);
  }
  for (const RowId pk : rows.albums) {
    if (const auto known = albums_.find(pk)) known->fault();
  }
  for (const RowId pk : rows.deletedAlbums) {
    const std::shared_ptr<StoredAlbum> known = albums_.find(pk);
    if (!known) continue;
    known->die();
    changedAlbums_.erase(pk);
    albums_.erase(pk);
  }
  if (!rows.deletedAlbums.empty()) ++albumsEpoch_;
  if (rows.lists) {
    for (const auto& list : lists_) list->fault();
  }
}

}  // namespace kx
