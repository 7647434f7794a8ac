#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "client/KXSyncFileStatusPair.h"

namespace kx {

// The files of one asset that a restore brings back, in the order in which the restore list named
// them. The accessors are atomic; the pairs themselves are not.
class KXSyncAssetGroup {
 public:
  using Pairs = std::vector<std::shared_ptr<KXSyncFileStatusPair>>;

  // Null until the library's list of incomplete assets names a file of this group.
  std::optional<std::string> uuid() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return uuid_;
  }
  void setUuid(std::optional<std::string> uuid) {
    std::lock_guard<std::mutex> lock(mutex_);
    uuid_ = std::move(uuid);
  }

  // Null until set.
  std::shared_ptr<Pairs> assetPairs() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return assetPairs_;
  }
  void setAssetPairs(std::shared_ptr<Pairs> pairs) {
    std::lock_guard<std::mutex> lock(mutex_);
    assetPairs_ = std::move(pairs);
  }

  std::string description() const { return "KXSyncAssetGroup"; }

 private:
  mutable std::mutex mutex_;
  std::optional<std::string> uuid_;
  std::shared_ptr<Pairs> assetPairs_;
};

}  // namespace kx
