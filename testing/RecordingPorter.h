#pragma once

#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/library/KXAssetsSaver.h"

namespace kx {

// The asset daemon's other services: keeps what it was told. Any thread.
class RecordingPorter final : public KXPorterClient {
 public:
  struct Update {
    std::optional<std::string> uuid;
    std::vector<std::string> paths;
    friend bool operator==(const Update&, const Update&) = default;
  };

  void updateRestoredAssetWithUUID(const std::optional<std::string>& uuid,
                                   const std::vector<std::string>& paths) override {
    std::lock_guard<std::mutex> lock(mutex_);
    updates_.push_back({uuid, paths});
  }
  void finalizeOTARestoreRecreatingAlbums(bool recreateAlbums) override {
    std::lock_guard<std::mutex> lock(mutex_);
    finalizations_.push_back(recreateAlbums);
  }

  std::vector<Update> updates() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return updates_;
  }
  std::vector<bool> finalizations() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return finalizations_;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<Update> updates_;
  std::vector<bool> finalizations_;
};

}  // namespace kx
