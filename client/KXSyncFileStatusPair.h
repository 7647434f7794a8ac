#pragma once

#include <cstdint>
#include <string>

namespace kx {

// One file that a restore must bring back, with the state of its transfer. Used on the plug-in
// queue or the library's queue, never on both at once.
class KXSyncFileStatusPair {
 public:
  // States; any other value has no name and counts as settled, like kFailed and kComplete.
  static constexpr std::int32_t kPending = 0;
  static constexpr std::int32_t kFailed = 1;
  static constexpr std::int32_t kComplete = 2;

  // Starts pending. `path` is an absolute device path.
  explicit KXSyncFileStatusPair(std::string path) : path_(std::move(path)) {}

  const std::string& path() const { return path_; }
  std::int32_t status() const { return status_; }
  void setStatus(std::int32_t status) { status_ = status; }

 private:
  const std::string path_;
  std::int32_t status_ = kPending;
};

}  // namespace kx
