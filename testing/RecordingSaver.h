#pragma once

#include <condition_variable>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/library/KXAssetsSaver.h"
#include "testing/InMemoryLibrary.h"

namespace kx {

// An asset saver for the in-memory library: keeps every batch for a test to look at, imports its
// assets (a file need not exist) and seals a sync whose assets all arrived by copying the snapshot.
// Completions come on a queue of its own. Any thread.
class RecordingSaver final : public KXAssetsSaver {
 public:
  using Batch = std::vector<KXSyncSaveJob::Fields>;

  // Both must outlive this object.
  RecordingSaver(InMemoryPhotoLibraryFramework& library, FileSystem& files);
  ~RecordingSaver() override;

  KXSyncSaveJobPtr newSyncSaveJob() override;
  void saveSyncedAssets(std::vector<DataPtr> serializedJobs, Completion completion) override;

  // Every batch handed over so far, oldest first.
  std::vector<Batch> batches() const;
  // The jobs of all batches, oldest first.
  Batch jobs() const;
  // The next batch ends with this error and imports nothing.
  void failNextBatch(ErrorPtr error);
  // From now on the named number of new jobs have no serialized form.
  void failSerialization(std::size_t count);
  // Completions wait until release.
  void hold();
  void release();
  // Waits until every batch handed over before has been completed.
  void drain();

 private:
  void process(const Batch& batch, const Completion& completion);
  bool import(InMemoryLibraryState& state, const KXSyncSaveJob::Fields& job);
  void seal(InMemoryStore& store, const std::string& snapshotPath);

  InMemoryPhotoLibraryFramework& library_;
  FileSystem& files_;
  mutable std::mutex mutex_;
  std::condition_variable released_;
  bool held_ = false;
  std::vector<Batch> batches_;
  ErrorPtr nextError_;
  std::size_t serializationsToFail_ = 0;
  DispatchQueuePtr queue_;
};

}  // namespace kx
