#include "testing/FaultySaver.h"

#include <condition_variable>
#include <deque>
#include <iterator>
#include <utility>

#include "platform/dispatch/Dispatch.h"

namespace kx {

// What completions, which may come late, and jobs share with the saver.
struct FaultySaver::Shared {
  std::mutex mutex;
  std::map<const Data*, bool> finishedBlocks;  // of serialized jobs not handed over yet
  std::deque<Batch> batches;
  std::size_t jobs = 0;       // in batches
  std::size_t forgotten = 0;  // batches
  bool mayHold = true;
  bool holding = false;
  std::vector<Held> held;
  std::size_t keepingBack = 0;  // batches with "cleanupNever" that are under way or kept
  std::vector<Block> keptBack;
  std::condition_variable arrived;  // one more is kept back
  DispatchQueuePtr completions = DispatchQueue::serial("kx.testing.saver-completions");
};

class FaultySaver::ObservedJob final : public KXSyncSaveJob {
 public:
  ObservedJob(FaultScript& script, std::shared_ptr<Shared> shared)
      : script_(script), shared_(std::move(shared)) {}
  DataPtr serializedData() const override {
    if (script_.take("serialize")) return nullptr;
    DataPtr data = KXSyncSaveJob::serializedData();
    const std::lock_guard<std::mutex> lock(shared_->mutex);
    shared_->finishedBlocks[data.get()] = finishedBlock() != nullptr;
    return data;
  }

 private:
  FaultScript& script_;
  std::shared_ptr<Shared> shared_;
};

FaultySaver::FaultySaver(KXAssetsSaver& inner, FaultScript& script, FailureHandler onFailure)
    : inner_(inner),
      script_(script),
      onFailure_(std::move(onFailure)),
      shared_(std::make_shared<Shared>()) {}

FaultySaver::~FaultySaver() {
  release();
  deliverKeptBack();
}

KXSyncSaveJobPtr FaultySaver::newSyncSaveJob() {
  return std::make_shared<ObservedJob>(script_, shared_);
}

FaultySaver::Batch FaultySaver::observe(const std::vector<DataPtr>& jobs) {
  Batch batch;
  for (const DataPtr& data : jobs) {
    Job job;
    if (auto fields = KXSyncSaveJob::fieldsFromSerializedData(data, nullptr)) {
      job.fields = std::move(*fields);
    }
    const auto known = shared_->finishedBlocks.find(data.get());
    if (known != shared_->finishedBlocks.end()) {
      job.hasFinishedBlock = known->second;
      shared_->finishedBlocks.erase(known);
    }
    batch.push_back(std::move(job));
  }
  return batch;
}

// With the lock held.
void FaultySaver::keep(Batch observed) {
  shared_->jobs += observed.size();
  shared_->batches.push_back(std::move(observed));
  while (shared_->jobs > kMostJobsKept && shared_->batches.size() > 1) {
    shared_->jobs -= shared_->batches.front().size();
    shared_->batches.pop_front();
    ++shared_->forgotten;
  }
}

void FaultySaver::saveSyncedAssets(std::vector<DataPtr> serializedJobs, Completion completion) {
  Held batch{std::move(serializedJobs), std::move(completion)};
  {
    const std::lock_guard<std::mutex> lock(shared_->mutex);
    Batch observed = observe(batch.jobs);
    for (const Job& job : observed) {
      if (!job.fields.cleanupSyncState) continue;
      batch.cleansUp = true;
      batch.isAwaited = batch.isAwaited || job.hasFinishedBlock;
    }
    keep(std::move(observed));
    if (!shared_->holding && shared_->mayHold && script_.take("saverHold")) shared_->holding = true;
    if (shared_->holding) {
      shared_->held.push_back(std::move(batch));
      return;
    }
  }
  handOver(std::move(batch));
}

void FaultySaver::handOver(Held batch) {
  if (const auto fault = script_.take("saver")) {
    const ErrorPtr error = fault->error ? fault->error : injectedError("saver");
    if (onFailure_) onFailure_("saver", error);
    shared_->completions->async(
        [completion = std::move(batch.completion), error] { completion(0, error); });
    return;
  }
  if (batch.cleansUp) {
    if (const auto fault = script_.take("cleanupError")) {
      const ErrorPtr error = fault->error ? fault->error : injectedError("cleanupError");
      if (onFailure_) onFailure_("cleanupError", error);
      inner_.saveSyncedAssets(
          std::move(batch.jobs),
          [completion = std::move(batch.completion), error](std::size_t imported, const ErrorPtr&) {
            completion(imported, error);
          });
      return;
    }
  }
  if (batch.isAwaited && script_.take("cleanupNever")) {
    keepBack(std::move(batch));
    return;
  }
  inner_.saveSyncedAssets(std::move(batch.jobs), std::move(batch.completion));
}

void FaultySaver::keepBack(Held batch) {
  {
    const std::lock_guard<std::mutex> lock(shared_->mutex);
    ++shared_->keepingBack;
  }
  inner_.saveSyncedAssets(std::move(batch.jobs),
                          [shared = shared_, completion = std::move(batch.completion)](
                              std::size_t imported, const ErrorPtr& outcome) {
                            const std::lock_guard<std::mutex> lock(shared->mutex);
                            shared->keptBack.emplace_back(
                                [completion, imported, outcome] { completion(imported, outcome); });
                            shared->arrived.notify_all();
                          });
}

FaultySaver::Record FaultySaver::takeBatches() {
  const std::lock_guard<std::mutex> lock(shared_->mutex);
  Record record;
  record.batches.assign(std::make_move_iterator(shared_->batches.begin()),
                        std::make_move_iterator(shared_->batches.end()));
  record.forgotten = std::exchange(shared_->forgotten, 0);
  shared_->batches.clear();
  shared_->jobs = 0;
  return record;
}

std::size_t FaultySaver::heldBatches() const {
  const std::lock_guard<std::mutex> lock(shared_->mutex);
  return shared_->held.size();
}

bool FaultySaver::isHolding() const {
  const std::lock_guard<std::mutex> lock(shared_->mutex);
  return shared_->holding;
}

void FaultySaver::release() {
  std::vector<Held> held;
  {
    const std::lock_guard<std::mutex> lock(shared_->mutex);
    shared_->holding = false;
    held = std::exchange(shared_->held, {});
  }
  for (Held& batch : held) {
    batch.isAwaited = false;  // who waits for it waits already
    handOver(std::move(batch));
  }
}

void FaultySaver::setMayHold(bool mayHold) {
  {
    const std::lock_guard<std::mutex> lock(shared_->mutex);
    shared_->mayHold = mayHold;
  }
  if (!mayHold) release();
}

bool FaultySaver::isKeepingBack() const {
  const std::lock_guard<std::mutex> lock(shared_->mutex);
  return shared_->keepingBack > 0;
}

void FaultySaver::deliverKeptBack() {
  std::vector<Block> kept;
  {
    std::unique_lock<std::mutex> lock(shared_->mutex);
    shared_->arrived.wait(lock,
                          [this] { return shared_->keptBack.size() >= shared_->keepingBack; });
    shared_->keepingBack = 0;
    kept = std::exchange(shared_->keptBack, {});
  }
  for (const Block& deliver : kept) deliver();
}

}  // namespace kx
