#include <algorithm>
#include <cmath>
#include <utility>

#include "client/DeviceAssets.h"
#include "client/KXSyncClient.h"
#include "client/LogSource.h"
#include "client/Memberships.h"
#include "records/TesselDates.h"

namespace kx {
namespace {

constexpr const char* kReconcileAssets = "_reconcileAssets";
const KXSAssetMap kNoAssets;

void deleteWithFaces(KXManagedAsset& asset) {
  // A copy: the asset's own list changes with every deletion.
  const std::span<const KXManagedFacePtr> span = asset.faces();
  const std::vector<KXManagedFacePtr> faces(span.begin(), span.end());
  for (const KXManagedFacePtr& face : faces) face->deleteObject();
}

// The host's faces, found by identifier.
class HostFaces {
 public:
  explicit HostFaces(const KXSAsset& host) {
    const std::optional<ArrayView> info = host.facesInfo();
    if (!info || info->empty()) return;
    faces_ = host.getFacesArray();
    byIdentifier_.reserve(faces_.size());
    for (std::size_t i = 0; i < faces_.size(); ++i)
      byIdentifier_.emplace_back(identifierOf(*faces_[i]), i);
    std::sort(byIdentifier_.begin(), byIdentifier_.end());
    matched_.assign(faces_.size(), false);
  }

  static std::uint16_t identifierOf(const KXSFace& face) {
    return static_cast<std::uint16_t>(face.identifier());
  }

  // Marks the first host face of the same identifier and rectangle; false when there is none.
  bool match(const KXManagedFace& device) {
    const std::uint16_t identifier = device.identifier();
    auto place = std::lower_bound(byIdentifier_.begin(), byIdentifier_.end(),
                                  std::pair<std::uint16_t, std::size_t>(identifier, 0));
    for (; place != byIdentifier_.end() && place->first == identifier; ++place) {
      if (!(faces_[place->second]->relativeRect() == device.relativeRect())) continue;
      matched_[place->second] = true;
      return true;
    }
    return false;
  }

  template <typename Visitor>
  void forEachUnmatched(Visitor visit) const {
    for (std::size_t i = 0; i < faces_.size(); ++i) {
      if (!matched_[i]) visit(*faces_[i]);
    }
  }

 private:
  std::vector<KXSFacePtr> faces_;
  std::vector<std::pair<std::uint16_t, std::size_t>> byIdentifier_;
  std::vector<bool> matched_;
};

}  // namespace

// The working data of one asset reconciliation. Lives inside its transaction.
struct KXSyncClient::AssetReconciliation {
  const KXSAssetMap& hostAssets;
  DeviceAssets deviceAssets;
  DeviceAlbumMap deviceAlbums = {};
};

Memberships& KXSyncClient::memberships() {
  if (!memberships_) {
    memberships_.emplace(
        hostWork_.memberships.valid()
            ? hostWork_.memberships.get()
            : Memberships(hostAssets(), albumsAndEvents_ ? *albumsAndEvents_ : KXSItemMap()));
  }
  return *memberships_;
}

void KXSyncClient::forgetMemberships() {
  memberships_ = std::nullopt;
  hostWork_.memberships = {};
}

const KXSAssetMap& KXSyncClient::hostAssets() const {
  return uuidToKXSAsset_ ? *uuidToKXSAsset_ : kNoAssets;
}

std::optional<DeviceAssets> KXSyncClient::_onDeviceAssetsByUUID() {
  AssetFetchRequest request;
  request.prefetchFaces = true;
  request.prefetchAlbums = true;
  request.fetchOnlyUUID = true;
  ErrorPtr error;
  auto assets = library_->managedObjectContext().fetchAssets(request, &error);
  if (!assets) {
    KX_LOG(kClientSource, "_onDeviceAssetsByUUID", LogLevel::kError,
           "Error Reconciling Photos: Cannot fetch on device photos %@", error);
    return std::nullopt;
  }
  DeviceAssets byUUID(hostAssets());
  byUUID.reserve(assets->size());
  for (KXManagedAssetPtr& asset : *assets) {
    if (const OptionalString uuid = asset->uuid()) byUUID.set(*uuid, std::move(asset));
  }
  return byUUID;
}

void KXSyncClient::_reconcileAssets(const DispatchGroupPtr& group) {
  if (!hostWork_.sortTokens.valid()) startHostWork();
  sortTokens_.emplace(hostWork_.sortTokens.get());
  submitTransaction(group, [this] { reconcileAssetsInTransaction(); });
}

void KXSyncClient::reconcileAssetsInTransaction() {
  KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Transaction for Reconciling Assets");
  // A failed fetch counts as a device without synced assets.
  std::optional<DeviceAssets> assets = _onDeviceAssetsByUUID();
  if (!assets) assets.emplace(hostAssets());
  AssetReconciliation run{hostAssets(), std::move(*assets)};
  run.deviceAlbums = _onDeviceAlbumsByUUID();
  deleteAssets(run);
  requestNewAssets(run);
  if (!isResync_) updateAssets(run);
}

void KXSyncClient::deleteAssets(AssetReconciliation& run) {
  for (DeviceAssets::Entry& entry : run.deviceAssets.entries()) {
    if (!isResync_ && entry.host != nullptr) continue;
    const KXManagedAssetPtr asset = std::exchange(entry.asset, nullptr);
    const std::string_view uuid = entry.uuid();
    if (!asset) {
      KX_LOG(kClientSource, kReconcileAssets, LogLevel::kWarning, "couldn't find photo with id %@",
             uuid);
      continue;
    }
    deleteWithFaces(*asset);
    KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "deleted photo with %@ is %p", uuid,
           static_cast<const void*>(asset.get()));
    asset->deleteObject();
  }
}

void KXSyncClient::requestNewAssets(AssetReconciliation& run) {
  KXSAssetMap::Cursor cursor;
  for (const KXSAssetMap::Entry& entry : run.hostAssets) {
    const std::string_view uuid = entry.key.stringValue();
    run.hostAssets.find(uuid, cursor);
    if (!run.deviceAssets.hasHostAsset(cursor.place())) requestDownload(uuid, *entry.value);
  }
}

void KXSyncClient::requestDownload(std::string_view uuid, const KXSAsset& host) {
  const OptionalString caption = host.caption();
  const FRAssetPtr request = FRAsset::downloadAssetWithIdentifier(
      std::string(uuid), kKXPhotoDataclass,
      caption ? std::optional<std::string>(*caption) : std::nullopt);
  KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Download request for asset: %@",
         request);
  if (const std::shared_ptr<TransferList> list = outstandingAssets()) list->append(request);
}

void KXSyncClient::updateAssets(AssetReconciliation& run) {
  // The assets that both sides have, in row order; all that are left on the device by now.
  std::vector<AssetPair> pairs;
  pairs.reserve(run.deviceAssets.entries().size());
  for (DeviceAssets::Entry& entry : run.deviceAssets.entries()) {
    if (entry.asset) pairs.push_back({&entry.asset, entry.host, entry.place});
  }
  memberships().setPairs(pairs);
  for (std::size_t i = 0; i < pairs.size(); ++i) {
    const AssetPair& pair = pairs[i];
    const std::string_view uuid = pair.host->key.stringValue();
    const KXSAsset& host = *pair.host->value;
    KXManagedAssetPtr& device = *pair.device;
    if (deleteAssetIfStale(uuid, host, device)) continue;
    updateSortToken(*device, pair.place);
    updateLocation(*device, host);
    updateFaces(*device, host);
    updateAlbums(run, i, uuid, device);
  }
}

bool KXSyncClient::deleteAssetIfStale(std::string_view uuid, const KXSAsset& host,
                                      KXManagedAssetPtr& present) {
  const std::optional<Date> onDevice = present->modificationDate();
  if (onDevice && *onDevice == dateWithTesselTimeInterval(host.modificationDate())) {
    return false;
  }
  const KXManagedAssetPtr device = std::exchange(present, nullptr);
  KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Deleting stale asset: %@", device);
  deleteWithFaces(*device);
  device->deleteObject();
  KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo,
         "=========== ASSET %@ HAS CHANGED, RE-REQUESTING DOWNLOAD", uuid);
  requestDownload(uuid, host);
  return true;
}

void KXSyncClient::updateSortToken(KXManagedAsset& device, std::size_t place) {
  const double* token = sortTokens_ ? sortTokens_->at(place) : nullptr;
  if (token == nullptr) return;
  const std::optional<double> present = device.sortToken();
  if (!present || std::fabs(*present - *token) >= kTokenEpsilon) device.setSortToken(*token);
}

void KXSyncClient::updateLocation(KXManagedAsset& device, const KXSAsset& host) {
  const std::optional<Number> latitude = host.latitude();
  const std::optional<Number> longitude = host.longitude();
  std::optional<Coordinate> coordinate;
  if (latitude && longitude) coordinate = {latitude->doubleValue(), longitude->doubleValue()};
  if (device.isLocatedAtCoordinates(coordinate)) return;
  if (!canUseCoordinate(coordinate)) {
    KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Removing location for asset");
    device.setLocation(std::nullopt);
    return;
  }
  KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo,
         "Updating onDeviceAsset for its new location: %@", describeLocation(*coordinate));
  device.setLocation(coordinate);
}

void KXSyncClient::updateFaces(KXManagedAsset& device, const KXSAsset& host) {
  HostFaces hostFaces(host);
  std::vector<KXManagedFacePtr> surplus;
  for (const KXManagedFacePtr& face : device.faces()) {
    if (!hostFaces.match(*face)) surplus.push_back(face);
  }
  for (const KXManagedFacePtr& face : surplus) {
    KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Deleting face with index: %d",
           static_cast<int>(face->identifier()));
    face->deleteObject();
  }
  hostFaces.forEachUnmatched([&device](const KXSFace& face) {
    KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "adding face: %d",
           static_cast<int>(face.identifier()));
    device.addFace(face.relativeRect(), HostFaces::identifierOf(face), face.albumUUID());
  });
}

void KXSyncClient::updateAlbums(AssetReconciliation& run, std::size_t index, std::string_view uuid,
                                const KXManagedAssetPtr& device) {
  const MembershipChanges& changes = memberships_->changesFor(index, device->albums());
  for (const Value& key : changes.toLeave) {
    const KXGenericAlbumPtr* found = run.deviceAlbums.find(key.stringValue());
    const KXGenericAlbumPtr album = found != nullptr ? *found : nullptr;
    if (album && album->isDeleted()) continue;
    KXManagedAlbum* const managed = album ? album->asManagedAlbum() : nullptr;
    if (managed != nullptr) managed->removeAsset(device);
    KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Asset %@ %@ removed from album %@ %@",
           device, uuid, album, key);
  }
  for (const Value& key : changes.toJoin) {
    const KXGenericAlbumPtr* found = run.deviceAlbums.find(key.stringValue());
    const KXGenericAlbumPtr album = found != nullptr ? *found : nullptr;
    if (album && album->isDeleted()) continue;
    KXManagedAlbum* const managed = album ? album->asManagedAlbum() : nullptr;
    if (managed != nullptr) managed->addAssetUsingTesselAlbumOrder(device);
    KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Asset %@ %@ added to album %@ %@",
           device, uuid, album, key);
  }
}

}  // namespace kx
