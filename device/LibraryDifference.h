#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "device/LibraryRows.h"

namespace kx {

struct LibraryChanges;
class SqliteDatabase;

// What sets a library apart from what it was before: by asset, by synced container, by list. Only
// what differs is named, in row order, assets that went first.
struct LibraryDifference {
  enum class Fate : std::uint8_t { kNew, kGone, kKept };

  struct Asset {
    std::string uuid;
    std::optional<std::string> originalFileName;
    bool isVideo = false;
    Fate fate = Fate::kKept;
    std::int64_t sizeBefore = 0;  // bytes of its file; 0 for a new one
    bool content = false;         // of a kept one: it was imported again
    bool place = false, faces = false, sortToken = false, memberships = false;
  };
  struct Container {
    std::string uuid;
    std::int32_t kind = 0;
    std::optional<std::string> title, titleBefore;
    Fate fate = Fate::kKept;
    std::size_t joined = 0, left = 0;  // members; of a new or gone one all that it has or had
    bool reordered = false;            // the members that stayed stand in another order
    bool renamed = false;
  };

  std::vector<Asset> assets;
  std::vector<Container> containers;
  std::vector<ListId> reorderedLists;  // containers that stayed stand in another order
};

// Compares two readings of one library. `before` null: it was empty. `changes` names every asset
// that may differ. The work is that of the changes, not of the library, but for one pass over the
// containers. Raises SqliteError. On the queue of the connections.
LibraryDifference differenceOf(SqliteDatabase* before, SqliteDatabase& after,
                               const LibraryChanges& changes);

}  // namespace kx
