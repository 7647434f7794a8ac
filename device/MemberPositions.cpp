#include "device/MemberPositions.h"

#include <algorithm>
#include <cstddef>
#include <iterator>

namespace kx {
namespace {

using Member = MemberPositions::Member;
using Move = MemberPositions::Move;

constexpr std::int64_t kGap = std::int64_t{1} << 20;
// Beyond, an index is its own position.
constexpr std::int64_t kLargestSpacedIndex = std::int64_t{1} << 42;

bool canBeSpaced(std::int64_t index) {
  return -kLargestSpacedIndex < index && index < kLargestSpacedIndex;
}

// Members with the same index.
struct Group {
  std::int64_t index = 0;
  std::optional<std::int64_t> stored;  // null when not all have the same
};

// By index, ascending.
std::vector<Group> groupsOf(std::vector<Member>& members) {
  if (!std::is_sorted(members.begin(), members.end(),
                      [](const Member& a, const Member& b) { return a.index < b.index; })) {
    std::sort(members.begin(), members.end(), [](const Member& a, const Member& b) {
      return a.index != b.index ? a.index < b.index : a.asset < b.asset;
    });
  }
  std::vector<Group> groups;
  groups.reserve(members.size());
  for (const Member& member : members) {
    if (!member.index) continue;
    if (groups.empty() || groups.back().index != *member.index) {
      groups.push_back({*member.index, member.stored});
    } else if (groups.back().stored != member.stored) {
      groups.back().stored.reset();
    }
  }
  return groups;
}

// The most groups whose positions ascend already.
std::vector<Group> longestAscent(const std::vector<Group>& groups) {
  constexpr std::size_t kNone = static_cast<std::size_t>(-1);
  std::vector<std::size_t> lasts;  // the smallest end of an ascent of each length
  std::vector<std::size_t> before(groups.size(), kNone);
  for (std::size_t i = 0; i < groups.size(); ++i) {
    if (!groups[i].stored) continue;
    const auto place = std::lower_bound(
        lasts.begin(), lasts.end(), *groups[i].stored,
        [&](std::size_t last, std::int64_t stored) { return *groups[last].stored < stored; });
    if (place != lasts.begin()) before[i] = *std::prev(place);
    if (place == lasts.end()) {
      lasts.push_back(i);
    } else {
      *place = i;
    }
  }
  std::vector<Group> ascent;
  ascent.reserve(lasts.size());
  for (std::size_t i = lasts.empty() ? kNone : lasts.back(); i != kNone; i = before[i]) {
    ascent.push_back(groups[i]);
  }
  std::reverse(ascent.begin(), ascent.end());
  return ascent;
}

}  // namespace

std::vector<Move> MemberPositions::adopt(std::vector<Member> members) {
  const std::vector<Group> groups = groupsOf(members);
  positions_.clear();
  for (const Group& group : longestAscent(groups)) {
    positions_.emplace_hint(positions_.end(), group.index, *group.stored);
  }
  if (positions_.size() < groups.size()) {
    for (const Group& group : groups) {
      if (!place(group.index)) return numberAnew(members, std::nullopt);
    }
  }
  return movesOf(members);
}

std::optional<std::int64_t> MemberPositions::place(std::int64_t index) {
  const auto next = positions_.lower_bound(index);
  if (next != positions_.end() && next->first == index) return next->second;
  std::int64_t position = 0;
  if (positions_.empty()) {
    position = canBeSpaced(index) ? index * kGap : index;
  } else if (next == positions_.end() || next == positions_.begin()) {
    const auto& [nearIndex, near] = next == positions_.end() ? *positions_.rbegin() : *next;
    std::int64_t distance = 0;
    if (__builtin_sub_overflow(index, nearIndex, &distance) ||
        __builtin_mul_overflow(distance, kGap, &distance) ||
        __builtin_add_overflow(near, distance, &position)) {
      return std::nullopt;
    }
  } else {
    const auto& [lowIndex, low] = *std::prev(next);
    const auto distance = [](std::int64_t from, std::int64_t to) {
      return static_cast<std::uint64_t>(to) - static_cast<std::uint64_t>(from);
    };
    // As far as the index is on its way, so that all between find room later.
    const std::uint64_t step = distance(low, next->second) / distance(lowIndex, next->first);
    if (step == 0) return std::nullopt;
    position = static_cast<std::int64_t>(static_cast<std::uint64_t>(low) +
                                         step * distance(lowIndex, index));
  }
  positions_.emplace_hint(next, index, position);
  return position;
}

std::vector<Move> MemberPositions::numberAnew(const std::vector<Member>& members,
                                              std::optional<std::int64_t> joining) {
  const bool spaced = (!joining || canBeSpaced(*joining)) &&
                      std::all_of(members.begin(), members.end(), [](const Member& member) {
                        return !member.index || canBeSpaced(*member.index);
                      });
  const auto number = [&](std::int64_t index) {
    positions_.emplace(index, spaced ? index * kGap : index);
  };
  positions_.clear();
  if (joining) number(*joining);
  for (const Member& member : members) {
    if (member.index) number(*member.index);
  }
  return movesOf(members);
}

std::vector<Move> MemberPositions::movesOf(const std::vector<Member>& members) const {
  std::vector<Move> moves;
  auto known = positions_.begin();
  for (const Member& member : members) {
    std::optional<std::int64_t> position;
    if (member.index) {
      // Mostly one after the other.
      if (known == positions_.end() || known->first != *member.index) {
        if (known != positions_.end()) ++known;
        if (known == positions_.end() || known->first != *member.index) {
          known = positions_.find(*member.index);
        }
      }
      position = known->second;
    }
    if (position != member.stored) moves.push_back({member.asset, position});
  }
  std::sort(moves.begin(), moves.end(),
            [](const Move& a, const Move& b) { return a.asset < b.asset; });
  return moves;
}

}  // namespace kx
