#include "device/MemberPositions.h"

#include <algorithm>
#include <cstddef>
#include <iterator>
#include <utility>

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

bool isBefore(const std::pair<std::int64_t, std::int64_t>& place, std::int64_t index) {
  return place.first < index;
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

const MemberPositions::Place* MemberPositions::before(std::int64_t index) const {
  const auto learned = std::lower_bound(learned_.begin(), learned_.end(), index, isBefore);
  const auto later = later_.lower_bound(index);
  const Place* const a = learned == learned_.begin() ? nullptr : &*std::prev(learned);
  const Place* const b = later == later_.begin() ? nullptr : &std::prev(later)->second;
  return a == nullptr || (b != nullptr && a->first < b->first) ? b : a;
}

const MemberPositions::Place* MemberPositions::notBefore(std::int64_t index) const {
  const auto learned = std::lower_bound(learned_.begin(), learned_.end(), index, isBefore);
  const auto later = later_.lower_bound(index);
  const Place* const a = learned == learned_.end() ? nullptr : &*learned;
  const Place* const b = later == later_.end() ? nullptr : &later->second;
  return a == nullptr || (b != nullptr && b->first < a->first) ? b : a;
}

std::vector<Move> MemberPositions::adopt(std::vector<Member> members) {
  const std::vector<Group> groups = groupsOf(members);
  learned_.clear();
  later_.clear();
  learned_.reserve(groups.size());
  for (const Group& group : longestAscent(groups)) {
    learned_.emplace_back(group.index, *group.stored);
  }
  if (learned_.size() < groups.size()) {
    for (const Group& group : groups) {
      if (!place(group.index)) return numberAnew(members, std::nullopt);
    }
  }
  return movesOf(members);
}

std::optional<std::int64_t> MemberPositions::place(std::int64_t index) {
  const Place* const next = notBefore(index);
  if (next != nullptr && next->first == index) return next->second;
  const Place* const last = before(index);
  std::int64_t position = 0;
  if (next == nullptr && last == nullptr) {
    position = canBeSpaced(index) ? index * kGap : index;
  } else if (next == nullptr || last == nullptr) {
    const auto& [nearIndex, near] = next == nullptr ? *last : *next;
    std::int64_t distance = 0;
    if (__builtin_sub_overflow(index, nearIndex, &distance) ||
        __builtin_mul_overflow(distance, kGap, &distance) ||
        __builtin_add_overflow(near, distance, &position)) {
      return std::nullopt;
    }
  } else {
    const auto& [lowIndex, low] = *last;
    const auto distance = [](std::int64_t from, std::int64_t to) {
      return static_cast<std::uint64_t>(to) - static_cast<std::uint64_t>(from);
    };
    // As far as the index is on its way, so that all between find room later.
    const std::uint64_t step = distance(low, next->second) / distance(lowIndex, next->first);
    if (step == 0) return std::nullopt;
    position = static_cast<std::int64_t>(static_cast<std::uint64_t>(low) +
                                         step * distance(lowIndex, index));
  }
  later_.emplace(index, Place(index, position));
  return position;
}

std::vector<Move> MemberPositions::numberAnew(const std::vector<Member>& members,
                                              std::optional<std::int64_t> joining) {
  const bool spaced = (!joining || canBeSpaced(*joining)) &&
                      std::all_of(members.begin(), members.end(), [](const Member& member) {
                        return !member.index || canBeSpaced(*member.index);
                      });
  learned_.clear();
  later_.clear();
  const auto number = [&](std::int64_t index) {
    learned_.emplace_back(index, spaced ? index * kGap : index);
  };
  if (joining) number(*joining);
  for (const Member& member : members) {
    if (member.index) number(*member.index);
  }
  std::sort(learned_.begin(), learned_.end());
  learned_.erase(std::unique(learned_.begin(), learned_.end()), learned_.end());
  return movesOf(members);
}

std::vector<Move> MemberPositions::movesOf(const std::vector<Member>& members) const {
  std::vector<Move> moves;
  auto next = learned_.begin();
  for (const Member& member : members) {
    std::optional<std::int64_t> position;
    if (member.index) {
      const auto isNext = [&] { return next != learned_.end() && next->first == *member.index; };
      // Mostly one after the other.
      if (!isNext())
        next = std::lower_bound(learned_.begin(), learned_.end(), *member.index, isBefore);
      position = isNext() ? (next++)->second : later_.at(*member.index).second;
    }
    if (position != member.stored) moves.push_back({member.asset, position});
  }
  std::sort(moves.begin(), moves.end(),
            [](const Move& a, const Move& b) { return a.asset < b.asset; });
  return moves;
}

}  // namespace kx
