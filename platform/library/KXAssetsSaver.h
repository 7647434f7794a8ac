#pragma once

#include <functional>
#include <string>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"
#include "platform/library/KXSyncSaveJob.h"

namespace kx {

// KXAssetsSaver sharedAssetsSaver: hands serialized save jobs to the asset daemon. Any thread.
class KXAssetsSaver {
 public:
  // First value: the number of assets imported; second: null or what ended the batch. A single bad
  // file fails its own asset and is no error of the batch.
  using Completion = std::function<void(std::size_t imported, const ErrorPtr& outcome)>;

  virtual ~KXAssetsSaver() = default;
  // A job to be filled; never null.
  virtual KXSyncSaveJobPtr newSyncSaveJob() = 0;
  // Returns at once. The completion is called exactly once, later, on a queue of the saver's own,
  // after everything the jobs ask for is committed and every open context has been refreshed.
  virtual void saveSyncedAssets(std::vector<DataPtr> serializedJobs, Completion completion) = 0;
};

// KXPorterClient sharedInstance: the asset daemon's other services. Any thread; calls return when
// the daemon has taken note.
class KXPorterClient {
 public:
  virtual ~KXPorterClient() = default;
  // These restored files belong to the asset with that UUID. Null UUID and empty list are
  // tolerated.
  virtual void updateRestoredAssetWithUUID(const std::optional<std::string>& uuid,
                                           const std::vector<std::string>& paths) = 0;
  // Finishes a restore from backup; the flag says whether the device albums must be recreated.
  virtual void finalizeOTARestoreRecreatingAlbums(bool recreateAlbums) = 0;
};

}  // namespace kx
