#include <algorithm>
#include <cmath>
#include <limits>

#include "client/KXSyncClient.h"
#include "client/LogSource.h"
#include "client/Memberships.h"
#include "records/TesselDates.h"

namespace kx {
namespace {

constexpr const char* kReconcileAssets = "_reconcileAssets";
constexpr double kTokenEpsilon = 2.220446049250313e-16;
constexpr double kTieStepDivisor = 100000.0;
constexpr double kNoPreviousTime = -1.0;

double secondsOf(const std::optional<Number>& hostTime) {
  const double interval = hostTime ? hostTime->doubleValue() : 0.0;
  return dateWithTesselTimeInterval(interval).secondsSinceReference;
}

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
  DeviceAssetMap deviceAssets;
  DeviceAlbumMap deviceAlbums;
  const KXSAssetMap* hostAssets = nullptr;
  std::optional<Memberships> memberships;
  OrderedMap<double>::Cursor nextToken;
};

std::optional<KXSyncClient::DeviceAssetMap> KXSyncClient::_onDeviceAssetsByUUID() {
  AssetFetchRequest request;
  request.prefetchFaces = true;
  request.prefetchAlbums = true;
  request.fetchOnlyUUID = true;
  ErrorPtr error;
  const auto assets = library_->managedObjectContext().fetchAssets(request, &error);
  if (!assets) {
    KX_LOG(kClientSource, "_onDeviceAssetsByUUID", LogLevel::kError,
           "Error Reconciling Photos: Cannot fetch on device photos %@", error);
    return std::nullopt;
  }
  DeviceAssetMap map;
  map.reserve(assets->size());
  static const KXSAssetMap kNoAssets;
  const KXSAssetMap& hostAssets = uuidToKXSAsset_ ? *uuidToKXSAsset_ : kNoAssets;
  KXSAssetMap::Cursor cursor;
  for (const KXManagedAssetPtr& asset : *assets) {
    const OptionalString uuid = asset->uuid();
    if (!uuid) continue;
    const KXSAssetMap::Entry* host = hostAssets.find(*uuid, cursor);
    map.set(host != nullptr ? host->key : Value::string(*uuid), asset);
  }
  return map;
}

void KXSyncClient::_reconcileAssets(const DispatchGroupPtr& group) {
  // Neither depends on the device, so both are made while the transaction before is still at work.
  hostMemberships_ =
      std::async(std::launch::async, [assets = uuidToKXSAsset_, containers = albumsAndEvents_] {
        static const KXSAssetMap kNoAssets;
        static const KXSItemMap kNoContainers;
        return Memberships(assets ? *assets : kNoAssets, containers ? *containers : kNoContainers);
      });
  computeSortTokens();
  submitTransaction(group, [this] { reconcileAssetsInTransaction(); });
}

void KXSyncClient::computeSortTokens() {
  sortTokens_.emplace();
  if (!masterAlbum_ || !uuidToKXSAsset_) return;
  const std::optional<ArrayView> uuids = masterAlbum_->assetUUIDs();
  if (!uuids) return;
  sortTokens_->reserve(uuids->size());
  KXSAssetMap::Cursor cursor;
  double previous = kNoPreviousTime;
  unsigned ties = 0;
  for (std::size_t i = 0; i < uuids->size(); ++i) {
    const KXSAssetMap::Entry* found =
        uuidToKXSAsset_->find(*uuids->stringAt(i, kKXSAlbumAssetUUIDsKey), cursor);
    if (found == nullptr) continue;
    const KXSAsset& host = *found->value;
    const double time = secondsOf(host.exposureDate());
    ties = std::fabs(previous - time) < kTokenEpsilon ? ties + 1 : 0;
    const Value key = host.uuidValue();
    if (!key.isNull()) sortTokens_->set(key, time + ties / kTieStepDivisor);
    previous = time;
  }
}

void KXSyncClient::reconcileAssetsInTransaction() {
  KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Transaction for Reconciling Assets");
  AssetReconciliation run;
  // A failed fetch counts as a device without synced assets.
  if (std::optional<DeviceAssetMap> assets = _onDeviceAssetsByUUID()) {
    run.deviceAssets = std::move(*assets);
  }
  run.deviceAlbums = _onDeviceAlbumsByUUID();
  static const KXSAssetMap kNoAssets;
  run.hostAssets = uuidToKXSAsset_ ? uuidToKXSAsset_.get() : &kNoAssets;
  deleteAssets(run);
  requestNewAssets(run);
  if (!isResync_) updateAssets(run);
}

void KXSyncClient::deleteAssets(AssetReconciliation& run) {
  std::vector<Value> doomed;
  KXSAssetMap::Cursor cursor;
  for (const auto& entry : run.deviceAssets) {
    if (isResync_ || run.hostAssets->find(entry.key.stringValue(), cursor) == nullptr) {
      doomed.push_back(entry.key);
    }
  }
  for (const Value& key : doomed) {
    const std::string_view uuid = key.stringValue();
    const KXManagedAssetPtr* found = run.deviceAssets.find(uuid);
    if (found == nullptr || !*found) {
      KX_LOG(kClientSource, kReconcileAssets, LogLevel::kWarning, "couldn't find photo with id %@",
             uuid);
      continue;
    }
    const KXManagedAssetPtr asset = *found;
    deleteWithFaces(*asset);
    run.deviceAssets.remove(uuid);
    KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "deleted photo with %@ is %p", uuid,
           static_cast<const void*>(asset.get()));
    asset->deleteObject();
  }
}

void KXSyncClient::requestNewAssets(AssetReconciliation& run) {
  DeviceAssetMap::Cursor cursor;
  for (const auto& entry : *run.hostAssets) {
    const std::string_view uuid = entry.key.stringValue();
    if (isResync_ || run.deviceAssets.find(uuid, cursor) == nullptr) {
      requestDownload(uuid, *entry.value);
    }
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
  pairs.reserve(run.deviceAssets.size());
  KXSAssetMap::Cursor cursor;
  for (const auto& entry : run.deviceAssets) {
    const KXSAssetMap::Entry* host = run.hostAssets->find(entry.key.stringValue(), cursor);
    if (host != nullptr) pairs.push_back({&entry.value, host, cursor.place()});
  }
  run.memberships = hostMemberships_.get();
  run.memberships->setPairs(pairs);
  for (std::size_t i = 0; i < pairs.size(); ++i) {
    const AssetPair& pair = pairs[i];
    const std::string_view uuid = pair.host->key.stringValue();
    const KXSAsset& host = *pair.host->value;
    const KXManagedAssetPtr& device = *pair.device;
    if (deleteAssetIfStale(run, uuid, host, device)) continue;
    updateSortToken(run, *device, uuid);
    updateLocation(*device, host);
    updateFaces(*device, host);
    updateAlbums(run, i, uuid, device);
  }
}

bool KXSyncClient::deleteAssetIfStale(AssetReconciliation& run, std::string_view uuid,
                                      const KXSAsset& host, const KXManagedAssetPtr& present) {
  const std::optional<Date> onDevice = present->modificationDate();
  if (onDevice && onDevice->secondsSinceReference == secondsOf(host.modificationDate())) {
    return false;
  }
  const KXManagedAssetPtr device = present;  // which goes with its entry
  KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo, "Deleting stale asset: %@", device);
  run.deviceAssets.remove(uuid);
  deleteWithFaces(*device);
  device->deleteObject();
  KX_LOG(kClientSource, kReconcileAssets, LogLevel::kInfo,
         "=========== ASSET %@ HAS CHANGED, RE-REQUESTING DOWNLOAD", uuid);
  requestDownload(uuid, host);
  return true;
}

void KXSyncClient::updateSortToken(AssetReconciliation& run, KXManagedAsset& device,
                                   std::string_view uuid) {
  const auto* found = sortTokens_ ? sortTokens_->find(uuid, run.nextToken) : nullptr;
  if (found == nullptr) return;
  const double token = found->value;
  const std::optional<double> present = device.sortToken();
  if (!present || std::fabs(*present - token) >= kTokenEpsilon) device.setSortToken(token);
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
  const MembershipChanges& changes = run.memberships->changesFor(index, device->albums());
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
