#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/TextNumbers.h"
#include "platform/foundation/Value.h"

namespace kx {

// The assets that a snapshot lists, by identifier; of several with the same the last counts. Texts
// are those of the property list that the snapshot was read from: its root outlives this. One
// thread at a time.
class SnapshotAssets {
 public:
  struct Asset {
    double modified = 0;  // seconds since the reference date
    bool proved = false;
  };

  // Null, and why, when the snapshot makes no sense or lists more assets than a library may have.
  static std::optional<SnapshotAssets> of(const Value& root, std::string* why);

  // Null when the snapshot does not list it. Cheapest in the order of the list.
  Asset* find(std::string_view uuid);
  // The identifier of one that is not proved; null when all are.
  OptionalString firstNotProved() const;

 private:
  explicit SnapshotAssets(std::size_t most);
  // False when there are as many as there may be.
  bool set(std::string_view uuid, double modified);

  const std::size_t most_;
  TextNumbers uuids_;
  std::vector<Asset> assets_;  // by their identifiers' numbers
  std::uint32_t next_ = 0;     // the number after the one found last
};

}  // namespace kx
