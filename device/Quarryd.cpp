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
      files_(*parts_.files),
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

}  // namespace kx
