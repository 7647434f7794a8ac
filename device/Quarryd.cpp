#include "device/Quarryd.h"

#include <cerrno>

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/QuarrydJobs.h"

namespace kx {
namespace {

constexpr std::size_t kBatchFiles = 200;
constexpr std::uint64_t kBatchBytes = std::uint64_t{512} << 20;

}  // namespace

Quarryd::Quarryd(Parts parts)
    : parts_(std::move(parts)),
      files_(parts_.root, false),
      folders_(parts_.root, parts_.filesPerFolder),
      completions_(DispatchQueue::serial("com.veltro.quarryd.completions")),
      work_(DispatchQueue::serial("com.veltro.quarryd")) {}

Quarryd::~Quarryd() = default;

void Quarryd::drain() {
  work_->drain();
  completions_->drain();
}

void Quarryd::save(std::vector<DataPtr> jobs, KXAssetsSaver::Completion completion) {
  work_->async([this, jobs = std::move(jobs), completion = std::move(completion)]() mutable {
    HandOver handOver;
    work(handOver, jobs);
    completions_->async([completion = std::move(completion), imported = handOver.imported,
                         outcome = handOver.outcome] {
      if (completion) completion(imported, outcome);
    });
  });
}

void Quarryd::work(HandOver& handOver, const std::vector<DataPtr>& jobs) {
  try {
    for (const DataPtr& job : jobs) workJob(handOver, job);
    importAll(handOver);
  } catch (const std::exception& exception) {
    handOver.outcome = deviceError(DeviceError::kIo, exception.what());
    parts_.store->health().noteFailure("quarryd gave up on a batch", handOver.outcome);
  }
}

void Quarryd::workJob(HandOver& handOver, const DataPtr& job) {
  ErrorPtr error;
  std::optional<KXSyncSaveJob::Fields> fields =
      job ? KXSyncSaveJob::fieldsFromSerializedData(job, &error) : std::nullopt;
  if (!fields) {
    parts_.store->health().noteFailure(
        "a save job makes no sense",
        deviceError(DeviceError::kBadJob, error ? error->message() : "an empty save job"));
    return;
  }
  if (fields->cleanupSyncState) {
    importAll(handOver);
    ErrorPtr failure = cleanUp(handOver, fields->cleanupBeforeDate);
    if (failure && !handOver.outcome) handOver.outcome = failure;
    return;
  }
  if (fields->isSyncComplete) {
    importAll(handOver);
    ErrorPtr failure = seal(fields->originalAssetPath.value_or(device_paths::kSnapshot));
    if (failure && !handOver.outcome) handOver.outcome = failure;
    return;
  }
  Import import;
  import.fields = std::move(*fields);
  if (import.fields.originalAssetPath) handOver.namedPaths.insert(*import.fields.originalAssetPath);
  ErrorPtr failure = prepare(import);
  if (!failure && handOver.waitingUUIDs.contains(import.uuid())) importAll(handOver);
  if (failure) {
    fail(import, failure);
    return;
  }
  handOver.waitingBytes += static_cast<std::uint64_t>(import.row.size);
  handOver.waitingUUIDs.insert(import.uuid());
  handOver.waiting.push_back(std::move(import));
  if (handOver.waiting.size() >= kBatchFiles || handOver.waitingBytes >= kBatchBytes) {
    importAll(handOver);
  }
}

void Quarryd::removeFiles(std::vector<std::string> paths) {
  work_->async([this, paths = std::move(paths)] {
    const std::string below = std::string(device_paths::kSyncedAssets) + "/";
    for (const std::string& path : paths) {
      if (!path.starts_with(below)) continue;
      ErrorPtr error;
      if (parts_.media->remove(path, &error)) {
        folders_.release(path);
      } else {
        leftFilesBehind_ = true;
        parts_.store->log().failure("a file stays behind", error);
      }
    }
  });
}

void Quarryd::updateRestoredAsset(std::optional<std::string> uuid, std::vector<std::string> paths) {
  if (!uuid || uuid->empty() || paths.empty()) return;
  work_->async([this, uuid = std::move(*uuid)] { completeRestoredAsset(uuid); });
}

void Quarryd::finalizeRestore(bool) {
  work_->async([this] {
    struct stat marker;
    if (parts_.root->status(device_paths::kRestoreMarker, &marker) != 0) return;
    std::vector<std::string> incomplete;
    parts_.store->queue().sync([&] {
      SqliteStatement row(parts_.store->database(),
                          "SELECT uuid FROM assets WHERE incomplete = 1 ORDER BY pk");
      while (row.step()) incomplete.push_back(row.textAt(0));
    });
    for (const std::string& uuid : incomplete) completeRestoredAsset(uuid);
    for (const char* path : {device_paths::kRestoreContext, device_paths::kRestoreMarker}) {
      const int failed = parts_.root->remove(path);
      if (failed != 0 && failed != ENOENT) {
        parts_.store->health().noteFailure("a restore cannot be ended",
                                           systemError("cannot remove", path, failed));
      }
    }
  });
}

void Quarryd::completeRestoredAsset(const std::string& uuid) {
  LibraryStore& store = *parts_.store;
  store.queue().sync([&] {
    std::vector<std::string> paths;
    RowId pk = 0;
    {
      SqliteStatement row(store.database(),
                          "SELECT a.pk, coalesce(f.path, a.path) FROM assets a LEFT JOIN "
                          "asset_files f ON f.asset = a.pk WHERE a.uuid = ? AND a.incomplete = 1 "
                          "ORDER BY f.ordinal");
      row.text(uuid);
      while (row.step()) {
        pk = row.integerAt(0);
        paths.push_back(row.textAt(1));
      }
    }
    if (paths.empty()) return;
    for (const std::string& path : paths) {
      struct stat status;
      const int failed = parts_.root->status(path, &status);
      if (failed != 0 || !S_ISREG(status.st_mode) || status.st_size == 0) return;
    }
    DeviceAssetFields complete;
    complete.incomplete = false;
    store.write([&](LibraryWriter& writer) { writer.updateAsset(pk, complete); });
  });
}

}  // namespace kx
