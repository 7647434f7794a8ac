#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <unordered_map>
#include <vector>

#include "device/AssetOrder.h"
#include "device/LibraryRows.h"

namespace kx {

// The stored positions of one album's members. Only their order counts: it is that of the members'
// indexes in the asset order file, and equal indexes have equal positions. Between positions there
// is room for at least as many others as there are indexes, as long as `place` answers.
class MemberPositions {
 public:
  struct Member {
    RowId asset = 0;
    std::optional<std::int64_t> index;   // in the asset order file
    std::optional<std::int64_t> stored;  // as the row has it
  };
  // A row to write.
  struct Move {
    RowId asset = 0;
    std::optional<std::int64_t> position;
  };

  // Learns what the members' rows hold, puts what is out of order in its place and gives these
  // rows: as few as there can be, or when there is no room for them, all that change when the album
  // is numbered anew.
  std::vector<Move> adopt(std::vector<Member> members);
  // The position of a member with that index. Null when there is no room.
  std::optional<std::int64_t> place(std::int64_t index);
  // Numbers the album anew, with the index of one that joins.
  std::vector<Move> numberAnew(const std::vector<Member>& members,
                               std::optional<std::int64_t> joining);

 private:
  using Place = std::pair<std::int64_t, std::int64_t>;  // index, position

  std::vector<Move> movesOf(const std::vector<Member>& members) const;
  // The nearest below the index, and the nearest that is not; null when there is none.
  const Place* before(std::int64_t index) const;
  const Place* notBefore(std::int64_t index) const;

  // What was learned at once, and what has come since, mostly little.
  std::vector<Place> learned_;           // by index, ascending
  std::map<std::int64_t, Place> later_;  // by index
};

// What is known of albums' positions under the order that the file gave them. Whoever rolls back
// has to forget all of it.
struct KnownPositions {
  std::shared_ptr<const AssetOrder::Album> order;
  MemberPositions positions;
};
using KnownAlbumPositions = std::unordered_map<RowId, KnownPositions>;

}  // namespace kx
