#include "testing/RecordingSaver.h"

#include <algorithm>
#include <cstdlib>

#include "platform/foundation/PropertyList.h"
#include "platform/foundation/Rect.h"
#include "platform/foundation/Text.h"
#include "records/TesselDates.h"
#include "records/TransportKeys.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {
namespace {

class UnserializableJob final : public KXSyncSaveJob {
 public:
  DataPtr serializedData() const override { return nullptr; }
};

std::vector<FaceSeed> facesOf(const Value& facesInfo) {
  std::vector<FaceSeed> faces;
  if (!facesInfo.isArray()) return faces;
  for (const Value& info : facesInfo.arrayValue()) {
    FaceSeed face;
    const Value index = info[kKXSAssetFaceIndexKey];
    if (index.isNumber()) {
      face.identifier = static_cast<std::uint16_t>(index.numberValue().int16Value());
    }
    face.relativeRect = rectFromDictionary(info[kKXSAssetFaceRectangleKey]).value_or(Rect{});
    if (const Value album = info[kKXSAssetFaceAlbumUUIDKey]; album.isString()) {
      face.albumUUID = std::string(album.stringValue());
    }
    faces.push_back(std::move(face));
  }
  return faces;
}

// The row that the URI "kxlibrary://<store>/<Entity>/p<row>" names, 0 for any other text.
std::int64_t rowOf(const std::string& uri) {
  const std::size_t mark = uri.rfind("/p");
  return mark == std::string::npos ? 0 : std::atoll(uri.c_str() + mark + 2);
}

void reducePendingCount(InMemoryStore& store, std::int64_t row) {
  const auto album = store.albums.find(row);
  if (album == store.albums.end() || album->second.pendingItemsCount == 0) return;
  --album->second.pendingItemsCount;
}

}  // namespace

RecordingSaver::RecordingSaver(InMemoryPhotoLibraryFramework& library, FileSystem& files)
    : library_(library), files_(files), queue_(DispatchQueue::serial("kx.memory.saver")) {}

RecordingSaver::~RecordingSaver() {
  release();
  drain();
}

KXSyncSaveJobPtr RecordingSaver::newSyncSaveJob() {
  std::lock_guard<std::mutex> lock(mutex_);
  if (serializationsToFail_ == 0) return std::make_shared<KXSyncSaveJob>();
  --serializationsToFail_;
  return std::make_shared<UnserializableJob>();
}

void RecordingSaver::saveSyncedAssets(std::vector<DataPtr> serializedJobs, Completion completion) {
  Batch batch;
  for (const DataPtr& data : serializedJobs) {
    if (auto fields = KXSyncSaveJob::fieldsFromSerializedData(data, nullptr)) {
      batch.push_back(std::move(*fields));
    }
  }
  {
    std::lock_guard<std::mutex> lock(mutex_);
    batches_.push_back(batch);
  }
  queue_->async([this, batch = std::move(batch), completion = std::move(completion)] {
    process(batch, completion);
  });
}

void RecordingSaver::process(const Batch& batch, const Completion& completion) {
  ErrorPtr error;
  {
    std::unique_lock<std::mutex> lock(mutex_);
    released_.wait(lock, [this] { return !held_; });
    std::swap(error, nextError_);
  }
  if (error) {
    completion(0, error);
    return;
  }
  std::size_t imported = 0;
  library_.perform([&](InMemoryLibraryState& state) {
    for (const KXSyncSaveJob::Fields& job : batch) {
      if (job.isSyncComplete) {
        seal(state.store, job.originalAssetPath.value_or(""));
      } else if (!job.cleanupSyncState && import(state, job)) {
        ++imported;
      }
    }
  });
  completion(imported, nullptr);
}

// False for a job that would replace an asset of the device itself.
bool RecordingSaver::import(InMemoryLibraryState& state, const KXSyncSaveJob::Fields& job) {
  InMemoryStore& store = state.store;
  const std::int64_t present = store.assetWithUUID(job.uuid.value_or(""));
  if (present != 0) {
    if (store.assets[present].savedAssetType != kKXSavedAssetTypeSynced) return false;
    store.removeAsset(present);
  }
  AssetSeed seed;
  seed.uuid = job.uuid;
  seed.isVideo = job.isVideo;
  seed.creationDate = job.creationDate;
  seed.modificationDate = job.modificationDate;
  seed.sortToken = job.sortToken;
  seed.location = job.location;
  seed.originalFileName = job.originalFileName;
  seed.faces = facesOf(job.facesInfo);
  seed.files = {pathByAppending(library_.tesselSyncedAssetsDirectory(), job.uuid.value_or(""))};
  const std::int64_t row = store.addAsset(seed);
  for (const std::string& uri : job.albumURIs.value_or(std::vector<std::string>())) {
    const auto album = store.albums.find(rowOf(uri));
    if (album == store.albums.end()) continue;
    std::vector<std::int64_t>& members = album->second.assets;
    const auto place = std::upper_bound(
        members.begin(), members.end(), row, [&](std::int64_t added, std::int64_t other) {
          return state.isOrderedBefore(album->second, store.assets[added], store.assets[other]);
        });
    members.insert(place, row);
    store.assets[row].albums.insert(album->first);
    reducePendingCount(store, album->first);
  }
  reducePendingCount(store, store.syncProgress);
  return true;
}

// The snapshot becomes the last synced one when all its assets are there, as it describes them.
void RecordingSaver::seal(InMemoryStore& store, const std::string& snapshotPath) {
  const DataPtr bytes = files_.readFile(snapshotPath, nullptr);
  if (!bytes) return;
  const Value root = readPropertyList(bytes, nullptr);
  const KXSLibraryChangeSnapshotPtr snapshot =
      KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(root, nullptr);
  for (const auto& entry : *snapshot->assetsByUUID()) {
    const std::int64_t row = store.assetWithUUID(entry.key.stringValue());
    if (row == 0) return;
    const std::optional<Number> modified = entry.value->modificationDate();
    const Date expected = dateWithTesselTimeInterval(modified ? modified->doubleValue() : 0.0);
    if (store.assets[row].modificationDate != expected) return;
  }
  files_.writeFileAtomically(snapshotPath + ".lastsynced", bytes->span(), nullptr);
}

std::vector<RecordingSaver::Batch> RecordingSaver::batches() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return batches_;
}

RecordingSaver::Batch RecordingSaver::jobs() const {
  Batch all;
  for (const Batch& batch : batches()) all.insert(all.end(), batch.begin(), batch.end());
  return all;
}

void RecordingSaver::failNextBatch(ErrorPtr error) {
  std::lock_guard<std::mutex> lock(mutex_);
  nextError_ = std::move(error);
}

void RecordingSaver::failSerialization(std::size_t count) {
  std::lock_guard<std::mutex> lock(mutex_);
  serializationsToFail_ = count;
}

void RecordingSaver::hold() {
  std::lock_guard<std::mutex> lock(mutex_);
  held_ = true;
}

void RecordingSaver::release() {
  std::lock_guard<std::mutex> lock(mutex_);
  held_ = false;
  released_.notify_all();
}

void RecordingSaver::drain() { queue_->drain(); }

}  // namespace kx
