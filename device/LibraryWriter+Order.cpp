#include <algorithm>
#include <tuple>

#include "device/LibraryWriter.h"

namespace kx {
namespace {

using Member = MemberPositions::Member;

// Whether positions and indexes alone say how the members stand, and would stand.
bool sayTheOrder(const std::vector<Member>& members) {
  const auto differ = [&](std::optional<std::int64_t> Member::*number) {
    std::vector<std::int64_t> numbers;
    numbers.reserve(members.size());
    for (const Member& member : members) {
      if (!(member.*number)) return false;
      numbers.push_back(*(member.*number));
    }
    std::sort(numbers.begin(), numbers.end());
    return std::adjacent_find(numbers.begin(), numbers.end()) == numbers.end();
  };
  return differ(&Member::stored) && differ(&Member::index);
}

// Whether a member that is to have no position, and so to stand behind those that have one, stands
// before one of these.
bool standsBeforePlaced(const std::vector<Member>& members) {
  std::optional<std::int64_t> first;  // of those without
  std::optional<std::int64_t> last;   // of those with one
  for (const Member& member : members) {
    if (!member.stored) continue;
    if (member.index) {
      last = std::max(last.value_or(*member.stored), *member.stored);
    } else {
      first = std::min(first.value_or(*member.stored), *member.stored);
    }
  }
  return first && last && *first < *last;
}

// A member with all that the order inside an album depends on.
struct WholeMember {
  std::string uuid;
  std::optional<double> sortToken;
  std::optional<std::int64_t> stored;
  std::optional<std::int64_t> wanted;
};

// The order inside an album: by position, those without one after the others by sort token (null
// last), then by UUID.
bool before(const WholeMember& a, const WholeMember& b,
            std::optional<std::int64_t> WholeMember::*position) {
  const auto key = [&](const WholeMember& m) {
    const bool placed = (m.*position).has_value();
    return std::make_tuple(!placed, placed ? *(m.*position) : 0, !placed && !m.sortToken,
                           placed ? 0.0 : m.sortToken.value_or(0.0));
  };
  const auto keyA = key(a);
  const auto keyB = key(b);
  return keyA != keyB ? keyA < keyB : a.uuid < b.uuid;
}

}  // namespace

LibraryWriter::AlbumOrderState& LibraryWriter::orderState(RowId album) {
  const auto [entry, isNew] = orderStates_.try_emplace(album);
  AlbumOrderState& state = entry->second;
  if (isNew) {
    SqliteStatement row(database_, "SELECT uuid, order_tag FROM albums WHERE pk = ?");
    row.integer(album);
    if (!row.step()) throw SqliteError(SQLITE_CONSTRAINT, "an album is gone");
    state.order = order_.album(row.optionalTextAt(0));
    state.tagged = row.optionalIntegerAt(1) == state.order->tag();
    const auto known = knownPositions_.find(album);
    if (known != knownPositions_.end() && known->second.order == state.order) {
      state.positions = &known->second.positions;
    }
  }
  return state;
}

template <typename Visit>
void LibraryWriter::withAsset(RowId asset, const Visit& visit) {
  if (const std::optional<AssetAtHand> known = atHand_ ? atHand_(asset) : std::nullopt) {
    visit(known->uuid, known->sortToken);
    return;
  }
  SqliteStatement row(database_, "SELECT uuid, sort_token FROM assets WHERE pk = ?");
  row.integer(asset);
  if (row.step()) visit(row.textViewAt(0), row.optionalRealAt(1));
}

std::vector<Member> LibraryWriter::membersOf(RowId album, const AssetOrder::Album& order) {
  std::vector<Member> members;
  SqliteStatement row(database_, "SELECT asset, position FROM memberships WHERE album = ?");
  row.integer(album);
  std::uint32_t next = 0;  // rows mostly come in the order of the indexes
  while (row.step()) {
    Member member{row.integerAt(0), std::nullopt, row.optionalIntegerAt(1)};
    if (order.tag() != 0) {
      withAsset(member.asset, [&](std::string_view uuid, const std::optional<double>&) {
        member.index = order.indexOf(uuid, next);
      });
    }
    if (member.index) next = static_cast<std::uint32_t>(*member.index) + 1;
    members.push_back(member);
  }
  return members;
}

// Whether the members stand in the order all the same, whatever their positions.
bool LibraryWriter::isInOrder(const std::vector<Member>& members) {
  if (standsBeforePlaced(members)) return false;
  std::vector<WholeMember> whole;
  whole.reserve(members.size());
  for (const Member& member : members) {
    withAsset(member.asset, [&](std::string_view uuid, const std::optional<double>& sortToken) {
      whole.push_back({std::string(uuid), sortToken, member.stored, member.index});
    });
  }
  std::sort(whole.begin(), whole.end(), [](const WholeMember& a, const WholeMember& b) {
    return before(a, b, &WholeMember::stored);
  });
  return std::is_sorted(whole.begin(), whole.end(), [](const WholeMember& a, const WholeMember& b) {
    return before(a, b, &WholeMember::wanted);
  });
}

MemberPositions& LibraryWriter::learnPositions(RowId album, AlbumOrderState& state) {
  KnownPositions& known = knownPositions_[album];
  known.order = state.order;
  state.positions = &known.positions;
  return known.positions;
}

void LibraryWriter::writeMoves(RowId album, const std::vector<MemberPositions::Move>& moves) {
  if (moves.empty()) return;
  SqliteStatement write(database_,
                        "UPDATE memberships SET position = ? WHERE album = ? AND asset = ?");
  for (const MemberPositions::Move& move : moves) {
    write.optionalInteger(move.position).integer(album).integer(move.asset).run();
    write.again();
  }
}

void LibraryWriter::writeTag(RowId album, AlbumOrderState& state) {
  if (state.tagged) return;
  SqliteStatement(database_, "UPDATE albums SET order_tag = ? WHERE pk = ?")
      .integer(state.order->tag())
      .integer(album)
      .run();
  state.tagged = true;
}

void LibraryWriter::putInOrder(RowId album, AlbumOrderState& state) {
  if (state.positions == nullptr) {
    std::vector<Member> members = membersOf(album, *state.order);
    writeMoves(album, learnPositions(album, state).adopt(std::move(members)));
  }
  writeTag(album, state);
}

std::int64_t LibraryWriter::placeOf(RowId album, AlbumOrderState& state, std::int64_t index) {
  if (const std::optional<std::int64_t> place = state.positions->place(index)) return *place;
  const std::vector<Member> members = membersOf(album, *state.order);
  writeMoves(album, state.positions->numberAnew(members, index));
  return *state.positions->place(index);
}

void LibraryWriter::forgetPositions(RowId album) {
  orderStates_.erase(album);
  knownPositions_.erase(album);
}

void LibraryWriter::forgetPlaces(RowId asset) {
  std::vector<RowId> albums;
  SqliteStatement row(database_, "SELECT album FROM memberships WHERE asset = ?");
  row.integer(asset);
  while (row.step()) albums.push_back(row.integerAt(0));
  for (const RowId album : albums) {
    forgetPositions(album);
    SqliteStatement(database_, "UPDATE albums SET order_tag = NULL WHERE pk = ?")
        .integer(album)
        .run();
  }
}

void LibraryWriter::addMembership(RowId album, RowId asset, std::string_view assetUUID) {
  AlbumOrderState& state = orderState(album);
  std::optional<std::int64_t> position = state.order->indexOf(assetUUID);
  // One that has no place says nothing about the others', and needs none of them.
  if (position || !state.tagged) putInOrder(album, state);
  if (position) position = placeOf(album, state, *position);
  SqliteStatement(database_,
                  "INSERT OR IGNORE INTO memberships(album, asset, position) "
                  "VALUES(?, ?, ?)")
      .integer(album)
      .integer(asset)
      .optionalInteger(position)
      .run();
  rows_.assets.insert(asset);
}

void LibraryWriter::appendMembership(RowId album, RowId asset, std::int64_t position) {
  SqliteStatement(database_,
                  "INSERT INTO memberships(album, asset, position) VALUES(?, ?, ?) "
                  "ON CONFLICT(album, asset) DO NOTHING")
      .integer(album)
      .integer(asset)
      .integer(position)
      .run();
  forgetPositions(album);
  rows_.assets.insert(asset);
}

void LibraryWriter::removeMembership(RowId album, RowId asset) {
  SqliteStatement(database_, "DELETE FROM memberships WHERE album = ? AND asset = ?")
      .integer(album)
      .integer(asset)
      .run();
  rows_.assets.insert(asset);
}

void LibraryWriter::sortAlbum(RowId album) {
  AlbumOrderState& state = orderState(album);
  if (state.tagged || state.positions != nullptr) return;
  const std::vector<Member> members = membersOf(album, *state.order);
  MemberPositions positions;
  const std::vector<MemberPositions::Move> moves = positions.adopt(members);
  if (!moves.empty()) {
    if (!sayTheOrder(members) && isInOrder(members)) return;
    writeMoves(album, moves);
    writeTag(album, state);
  }
  learnPositions(album, state) = std::move(positions);
}

}  // namespace kx
