#pragma once

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/library/KXAssetsSaver.h"
#include "testing/FaultScript.h"

namespace kx {

// Passes save jobs on to another asset saver, keeps a record of what was handed over, and makes
// steps fail by script: "serialize" (a job has no serialized form), "saver" (a batch ends with the
// fault's error and nothing is imported), "saverHold" (from its first hit on, batches wait until
// release), "cleanupError" (a batch with a clean-up job is worked, and ends with the fault's
// error), "cleanupNever" (the completion of a batch with a clean-up job that somebody waits for is
// kept back until deliverKeptBack).
// Failures are told to `onFailure`. Any thread.
class FaultySaver final : public KXAssetsSaver {
 public:
  using FailureHandler = std::function<void(const std::string& what, const ErrorPtr& error)>;
  struct Job {
    KXSyncSaveJob::Fields fields;
    bool hasFinishedBlock = false;
  };
  using Batch = std::vector<Job>;

  // Both outlive this object.
  FaultySaver(KXAssetsSaver& inner, FaultScript& script, FailureHandler onFailure);
  ~FaultySaver() override;

  KXSyncSaveJobPtr newSyncSaveJob() override;
  void saveSyncedAssets(std::vector<DataPtr> serializedJobs, Completion completion) override;

  // The record keeps this many jobs that nobody takes; older batches leave it.
  static constexpr std::size_t kMostJobsKept = 20'000;
  struct Record {
    std::vector<Batch> batches;  // oldest first
    std::size_t forgotten = 0;   // batches before them that left the record
  };
  // The batches handed over since the last call.
  Record takeBatches();
  bool isHolding() const;
  std::size_t heldBatches() const;
  // Hands over what was held, in order, and holds no more.
  void release();
  // Whether "saverHold" may take hold from now on. Without, what was held is released.
  void setMayHold(bool mayHold);
  // Whether a completion is being kept back; the waiting for it may as well end.
  bool isKeepingBack() const;
  void deliverKeptBack();

 private:
  class ObservedJob;
  struct Shared;
  struct Held {
    std::vector<DataPtr> jobs;
    Completion completion;
    bool cleansUp = false;   // holds a clean-up job
    bool isAwaited = false;  // one with a finished block
  };
  void handOver(Held batch);
  void keepBack(Held batch);
  Batch observe(const std::vector<DataPtr>& jobs);
  void keep(Batch observed);

  KXAssetsSaver& inner_;
  FaultScript& script_;
  FailureHandler onFailure_;
  std::shared_ptr<Shared> shared_;
};

}  // namespace kx
