#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/Value.h"

namespace kx {

// The assets that a snapshot lists, by identifier; of several with the same the last counts. Texts
// are those of the property list that the snapshot was read from: its root outlives this. One
// thread at a time.
class SnapshotAssets {
 public:
  struct Asset {
    std::string_view uuid;
    double modified = 0;  // seconds since the reference date
    bool proved = false;
  };

  // Null, and why, when the snapshot makes no sense or lists more assets than a library may have.
  static std::optional<SnapshotAssets> of(const Value& root, std::string* why);

  // Null when the snapshot does not list it.
  Asset* find(std::string_view uuid);
  // Null when all are.
  const Asset* firstNotProved() const;

 private:
  explicit SnapshotAssets(std::size_t most);
  // False when there are as many as there may be.
  bool set(std::string_view uuid, double modified);
  std::size_t slotOf(std::string_view uuid) const;

  const std::size_t most_;
  std::vector<Asset> assets_;
  std::vector<std::uint32_t> slots_;  // index into assets_ plus 1, 0 when free; half are free
};

}  // namespace kx
