#include "testing/InMemoryContext.h"

#include <algorithm>
#include <limits>
#include <tuple>

#include "testing/InMemoryObjects.h"

namespace kx {
namespace {

bool sameAlbum(const InMemoryAlbumRow& a, const InMemoryAlbumRow& b) {
  return std::tie(a.uuid, a.title, a.kind, a.pendingItemsType, a.pendingItemsCount, a.assets) ==
         std::tie(b.uuid, b.title, b.kind, b.pendingItemsType, b.pendingItemsCount, b.assets);
}

bool sameAsset(const InMemoryAssetRow& a, const InMemoryAssetRow& b) {
  return a.sortToken == b.sortToken && a.location == b.location && a.faces == b.faces &&
         a.albums == b.albums;
}

template <typename T>
void take(T& saved, const T& before, const T& now) {
  if (!(before == now)) saved = now;
}

// Applies to `saved` what was added and removed between the two others.
template <typename Container>
void takeMembers(Container& saved, const Container& before, const Container& now) {
  if (saved == before) {
    saved = now;
    return;
  }
  const std::set<std::int64_t> was(before.begin(), before.end());
  const std::set<std::int64_t> is(now.begin(), now.end());
  std::erase_if(saved,
                [&](std::int64_t member) { return was.contains(member) && !is.contains(member); });
  for (const std::int64_t member : now) {
    if (was.contains(member) || std::find(saved.begin(), saved.end(), member) != saved.end()) {
      continue;
    }
    saved.insert(saved.end(), member);
  }
}

}  // namespace

bool InMemoryLibraryState::fails(std::string_view operation, ErrorPtr* error) const {
  ErrorPtr failure = fault ? fault(operation) : nullptr;
  if (!failure) return false;
  setError(error, std::move(failure));
  return true;
}

bool InMemoryLibraryState::isOrderedBefore(const InMemoryAlbumRow& album, const InMemoryAssetRow& a,
                                           const InMemoryAssetRow& b) const {
  const auto keyOf = [&](const InMemoryAssetRow& asset) {
    std::optional<std::uint64_t> index;
    if (album.uuid && asset.uuid && orderIndex) index = orderIndex(*album.uuid, *asset.uuid);
    constexpr double kLast = std::numeric_limits<double>::infinity();
    return std::tuple(!index, index.value_or(0), asset.sortToken.value_or(kLast),
                      asset.uuid ? std::string_view(*asset.uuid) : std::string_view());
  };
  return keyOf(a) < keyOf(b);
}

InMemoryContext::InMemoryContext(std::shared_ptr<InMemoryLibraryState> state)
    : state_(std::move(state)) {}

InMemoryContext::~InMemoryContext() = default;

bool InMemoryContext::matches(const InMemoryAssetRow& row, const AssetPredicate& predicate) const {
  const bool equal = row.savedAssetType == predicate.savedAssetType;
  return equal == (predicate.comparison == AssetPredicate::Comparison::kSavedAssetTypeEquals);
}

std::optional<std::vector<KXManagedAssetPtr>> InMemoryContext::fetchAssets(
    const AssetFetchRequest& request, ErrorPtr* error) {
  if (state_->fails("fetchAssets", error)) return std::nullopt;
  std::vector<KXManagedAssetPtr> assets;
  for (const auto& entry : state_->store.assets) {
    if (!isDeleted(entry.first) && matches(entry.second, request.predicate)) {
      assets.push_back(assetObject(entry.first));
    }
  }
  return assets;
}

std::optional<std::uint64_t> InMemoryContext::countAssets(const AssetPredicate& predicate,
                                                          ErrorPtr* error) {
  if (state_->fails("countAssets", error)) return std::nullopt;
  std::uint64_t count = 0;
  for (const auto& entry : state_->store.assets) {
    if (!isDeleted(entry.first) && matches(entry.second, predicate)) ++count;
  }
  return count;
}

std::optional<std::vector<std::int64_t>> InMemoryContext::originalFileSizes(
    const AssetPredicate& predicate, ErrorPtr* error) {
  if (state_->fails("originalFileSizes", error)) return std::nullopt;
  std::vector<std::int64_t> sizes;
  for (const auto& entry : state_->store.assets) {
    if (matches(entry.second, predicate) && entry.second.originalFilesize) {
      sizes.push_back(*entry.second.originalFilesize);
    }
  }
  return sizes;
}

std::optional<std::vector<std::int64_t>> InMemoryContext::sidecarFileSizes(
    const AssetPredicate& predicate, ErrorPtr* error) {
  if (state_->fails("sidecarFileSizes", error)) return std::nullopt;
  std::vector<std::int64_t> sizes;
  for (const auto& entry : state_->store.assets) {
    if (!matches(entry.second, predicate)) continue;
    const std::vector<std::int64_t>& own = entry.second.sidecarSizes;
    sizes.insert(sizes.end(), own.begin(), own.end());
  }
  return sizes;
}

std::optional<std::vector<KXGenericAlbumPtr>> InMemoryContext::fetchEmptyAlbums(
    const std::vector<int>& kinds, ErrorPtr* error) {
  if (state_->fails("fetchEmptyAlbums", error)) return std::nullopt;
  std::vector<KXGenericAlbumPtr> albums;
  for (const std::int64_t row : albumRows()) {
    const bool isWanted = std::find(kinds.begin(), kinds.end(), album(row).kind) != kinds.end();
    if (isWanted && albumMembers(row).empty()) albums.push_back(albumObject(row));
  }
  return albums;
}

std::vector<std::shared_ptr<KXManagedObject>> InMemoryContext::registeredObjects() {
  std::vector<std::shared_ptr<KXManagedObject>> objects;
  for (const auto& entry : albumObjects_) objects.push_back(entry.second);
  for (const auto& entry : assetObjects_) objects.push_back(entry.second);
  for (const auto& entry : faceObjects_) objects.push_back(entry.second);
  return objects;
}

void InMemoryContext::refreshObject(const std::shared_ptr<KXManagedObject>& object,
                                    bool mergeChanges) {
  touch();
  if (auto* faulting = dynamic_cast<FaultingObject*>(object.get())) faulting->becomeFault();
  if (mergeChanges) return;
  if (const auto* album = dynamic_cast<const InMemoryAlbum*>(object.get())) {
    changes_.albums.erase(album->row());
  } else if (const auto* asset = dynamic_cast<const InMemoryAsset*>(object.get())) {
    changes_.assets.erase(asset->row());
  }
}

void InMemoryContext::setChanges(Changes changes) {
  changes_ = std::move(changes);
  touch();
}

bool InMemoryContext::commit() {
  InMemoryStore& store = state_->store;
  std::size_t written = changes_.deleted.size() + changes_.newFaces.size();
  for (const auto& entry : changes_.newFaces) {
    store.faces[entry.first] = entry.second;
  }
  for (const auto& entry : changes_.albums) {
    if (isDeleted(entry.first) || !hasChanges(entry.first)) continue;
    commitAlbum(entry.first, entry.second);
    ++written;
  }
  for (const auto& entry : changes_.assets) {
    if (isDeleted(entry.first) || !hasChanges(entry.first)) continue;
    commitAsset(entry.first, entry.second);
    ++written;
  }
  for (std::size_t i = 0; i < changes_.lists.size(); ++i) {
    if (!changes_.lists[i] || *changes_.lists[i] == store.lists[i]) continue;
    store.lists[i] = *changes_.lists[i];
    ++written;
  }
  for (const std::int64_t row : changes_.deleted) {
    if (const auto face = store.faces.find(row); face != store.faces.end()) {
      const auto asset = store.assets.find(face->second.asset);
      if (asset != store.assets.end()) asset->second.faces.erase(row);
      store.faces.erase(face);
    }
    store.removeAlbum(row);
    store.removeAsset(row);
    albumObjects_.erase(row);
    assetObjects_.erase(row);
    faceObjects_.erase(row);
  }
  changes_ = Changes();
  if (written == 0) return false;
  state_->rowsWritten += written;
  ++state_->revision;
  return true;
}

void InMemoryContext::commitAlbum(std::int64_t row, const Changed<InMemoryAlbumRow>& change) {
  InMemoryAlbumRow& saved = state_->store.albums[row];
  if (changes_.inserted.contains(row)) {
    saved = change.now;
    return;
  }
  take(saved.uuid, change.before.uuid, change.now.uuid);
  take(saved.title, change.before.title, change.now.title);
  take(saved.kind, change.before.kind, change.now.kind);
  take(saved.pendingItemsType, change.before.pendingItemsType, change.now.pendingItemsType);
  take(saved.pendingItemsCount, change.before.pendingItemsCount, change.now.pendingItemsCount);
  takeMembers(saved.assets, change.before.assets, change.now.assets);
}

void InMemoryContext::commitAsset(std::int64_t row, const Changed<InMemoryAssetRow>& change) {
  InMemoryAssetRow& saved = state_->store.assets[row];
  take(saved.sortToken, change.before.sortToken, change.now.sortToken);
  take(saved.location, change.before.location, change.now.location);
  takeMembers(saved.faces, change.before.faces, change.now.faces);
  takeMembers(saved.albums, change.before.albums, change.now.albums);
}

KXGenericAlbumPtr InMemoryContext::albumObject(std::int64_t row) {
  if (!exists(row)) return nullptr;
  std::shared_ptr<InMemoryAlbum>& object = albumObjects_[row];
  if (!object) object = std::make_shared<InMemoryAlbum>(*this, row);
  return object;
}

KXManagedAssetPtr InMemoryContext::assetObject(std::int64_t row) {
  if (!exists(row)) return nullptr;
  std::shared_ptr<InMemoryAsset>& object = assetObjects_[row];
  if (!object) object = std::make_shared<InMemoryAsset>(*this, row);
  return object;
}

KXManagedFacePtr InMemoryContext::faceObject(std::int64_t row) {
  if (!exists(row)) return nullptr;
  std::shared_ptr<InMemoryFace>& object = faceObjects_[row];
  if (!object) object = std::make_shared<InMemoryFace>(*this, row);
  return object;
}

const InMemoryAlbumRow& InMemoryContext::album(std::int64_t row) const {
  static const InMemoryAlbumRow kGone;
  if (const auto it = changes_.albums.find(row); it != changes_.albums.end()) return it->second.now;
  const auto saved = state_->store.albums.find(row);
  return saved == state_->store.albums.end() ? kGone : saved->second;
}

const InMemoryAssetRow& InMemoryContext::asset(std::int64_t row) const {
  static const InMemoryAssetRow kGone;
  if (const auto it = changes_.assets.find(row); it != changes_.assets.end()) return it->second.now;
  const auto saved = state_->store.assets.find(row);
  return saved == state_->store.assets.end() ? kGone : saved->second;
}

const InMemoryFaceRow& InMemoryContext::face(std::int64_t row) const {
  static const InMemoryFaceRow kGone;
  if (const auto it = changes_.newFaces.find(row); it != changes_.newFaces.end()) return it->second;
  const auto saved = state_->store.faces.find(row);
  return saved == state_->store.faces.end() ? kGone : saved->second;
}

InMemoryAlbumRow& InMemoryContext::changeAlbum(std::int64_t row) {
  auto it = changes_.albums.find(row);
  if (it == changes_.albums.end()) {
    const InMemoryAlbumRow& saved = album(row);
    it = changes_.albums.emplace(row, Changed<InMemoryAlbumRow>{saved, saved}).first;
  }
  return it->second.now;
}

InMemoryAssetRow& InMemoryContext::changeAsset(std::int64_t row) {
  auto it = changes_.assets.find(row);
  if (it == changes_.assets.end()) {
    const InMemoryAssetRow& saved = asset(row);
    it = changes_.assets.emplace(row, Changed<InMemoryAssetRow>{saved, saved}).first;
  }
  return it->second.now;
}

bool InMemoryContext::exists(std::int64_t row) const {
  const InMemoryStore& store = state_->store;
  return changes_.inserted.contains(row) || store.albums.contains(row) ||
         store.assets.contains(row) || store.faces.contains(row);
}

bool InMemoryContext::hasChanges(std::int64_t row) const {
  if (isDeleted(row) || changes_.inserted.contains(row)) return true;
  if (const auto it = changes_.albums.find(row); it != changes_.albums.end()) {
    return !sameAlbum(it->second.before, it->second.now);
  }
  const auto it = changes_.assets.find(row);
  return it != changes_.assets.end() && !sameAsset(it->second.before, it->second.now);
}

KXGenericAlbumPtr InMemoryContext::insertAlbum(SeedList which, std::int32_t kind) {
  if (state_->fails("insertAlbum", nullptr)) return nullptr;
  const std::int64_t row = state_->store.nextRow++;
  InMemoryAlbumRow fresh;
  fresh.kind = kind;
  changes_.albums.emplace(row, Changed<InMemoryAlbumRow>{fresh, fresh});
  changes_.inserted.insert(row);
  std::vector<std::int64_t> rows = list(which);
  rows.push_back(row);
  setList(which, std::move(rows));
  return albumObject(row);
}

void InMemoryContext::insertFace(std::int64_t owner, InMemoryFaceRow newFace) {
  const std::int64_t row = state_->store.nextRow++;
  newFace.asset = owner;
  changes_.newFaces[row] = std::move(newFace);
  changes_.inserted.insert(row);
  changeAsset(owner).faces.insert(row);
}

std::vector<std::int64_t> InMemoryContext::list(SeedList which) const {
  const auto index = static_cast<std::size_t>(which);
  std::vector<std::int64_t> rows =
      changes_.lists[index] ? *changes_.lists[index] : state_->store.lists[index];
  std::erase_if(rows, [this](std::int64_t row) { return isDeleted(row); });
  return rows;
}

void InMemoryContext::setList(SeedList which, std::vector<std::int64_t> rows) {
  changes_.lists[static_cast<std::size_t>(which)] = std::move(rows);
}

std::vector<std::int64_t> InMemoryContext::albumRows() const {
  std::set<std::int64_t> rows;
  for (const auto& entry : state_->store.albums) rows.insert(entry.first);
  for (const std::int64_t row : changes_.inserted) {
    if (changes_.albums.contains(row)) rows.insert(row);
  }
  std::erase_if(rows, [this](std::int64_t row) { return isDeleted(row); });
  return {rows.begin(), rows.end()};
}

std::int64_t InMemoryContext::albumWithUUID(std::string_view uuid) const {
  for (const auto& entry : state_->store.albums) {
    const bool isChanged = changes_.albums.contains(entry.first);
    const InMemoryAlbumRow& row = isChanged ? album(entry.first) : entry.second;
    if (row.uuid == uuid && !isDeleted(entry.first)) return entry.first;
  }
  for (const std::int64_t row : changes_.inserted) {
    if (!isDeleted(row) && changes_.albums.contains(row) && album(row).uuid == uuid) return row;
  }
  return 0;
}

std::vector<std::int64_t> InMemoryContext::albumMembers(std::int64_t row) const {
  std::vector<std::int64_t> members = album(row).assets;
  std::erase_if(members, [this](std::int64_t member) { return isDeleted(member); });
  return members;
}

void InMemoryContext::setAlbumMembers(std::int64_t row, std::vector<std::int64_t> members) {
  changeAlbum(row).assets = std::move(members);
  touch();
}

bool InMemoryContext::isOrderedBefore(std::int64_t inAlbum, std::int64_t a, std::int64_t b) const {
  return state_->isOrderedBefore(album(inAlbum), asset(a), asset(b));
}

}  // namespace kx
