#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

#include "device/DeviceLog.h"
#include "platform/files/FileSystem.h"
#include "platform/foundation/Value.h"

namespace kx {

// The host's order of the assets inside each album: the asset order file and its cached copy. A
// file that is missing or makes no sense is an empty one. Used on the library's queue, clear from
// any thread.
class AssetOrder {
 public:
  // One album's order. `tag` is 0 for an album that the file does not name, else it differs from
  // that of any other order.
  class Album {
   public:
    Album() = default;
    // A dictionary: by UUID the index.
    explicit Album(Value indexes);
    std::int64_t tag() const { return tag_; }
    // Null for an asset that is not named. Found fastest when it has the index that is expected.
    std::optional<std::int64_t> indexOf(std::string_view assetUUID,
                                        std::uint32_t expected = 0) const;

   private:
    Value indexes_;  // null: none
    std::int64_t tag_ = 0;
  };

  AssetOrder(FileSystem& files, const DeviceLog& log) : files_(files), log_(log) {}

  // Drops the cached copy: the file is read again when next needed.
  void clear() { stale_.store(true, std::memory_order_release); }
  std::shared_ptr<const Album> album(const std::optional<std::string>& uuid);

 private:
  void read();

  FileSystem& files_;
  const DeviceLog& log_;
  std::atomic<bool> stale_{true};
  Value orders_;
  std::unordered_map<std::string, std::shared_ptr<const Album>> albums_;
  const std::shared_ptr<const Album> none_ = std::make_shared<const Album>();
};

}  // namespace kx
