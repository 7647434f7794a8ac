#include "device/MemberPositions.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <limits>
#include <map>
#include <optional>
#include <random>
#include <set>
#include <utility>
#include <vector>

namespace kx {
namespace {

using Member = MemberPositions::Member;
using Move = MemberPositions::Move;
using Members = std::vector<Member>;
constexpr std::int64_t kLeast = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();

// As the rows are once the moves are written.
Members written(Members members, const std::vector<Move>& moves) {
  for (const Move& move : moves) {
    const auto member = std::find_if(members.begin(), members.end(),
                                     [&](const Member& m) { return m.asset == move.asset; });
    if (member == members.end()) {
      ADD_FAILURE() << "no member " << move.asset;
      continue;
    }
    EXPECT_NE(member->stored, move.position) << "a row is written for nothing";
    member->stored = move.position;
  }
  return members;
}

// Positions are ordered as the indexes, equal where these are, and missing where these are.
void expectOrdered(const Members& members) {
  std::map<std::int64_t, std::int64_t> positions;
  for (const Member& member : members) {
    ASSERT_EQ(member.stored.has_value(), member.index.has_value());
    if (!member.index) continue;
    EXPECT_EQ(positions.emplace(*member.index, *member.stored).first->second, *member.stored);
  }
  std::optional<std::int64_t> last;
  for (const auto& [index, position] : positions) {
    EXPECT_TRUE(!last || *last < position) << "at index " << index;
    last = position;
  }
}

// How many rows have to be written at the least, when each index is one member's.
std::size_t fewestMoves(Members members) {
  std::sort(members.begin(), members.end(),
            [](const Member& a, const Member& b) { return a.index < b.index; });
  std::vector<std::size_t> ascent;
  Members placed;
  std::size_t moves = 0, longest = 0;
  for (const Member& member : members) {
    if (!member.index) {
      moves += member.stored ? 1 : 0;
    } else {
      placed.push_back(member);
    }
  }
  for (std::size_t i = 0; i < placed.size(); ++i) {
    std::size_t length = placed[i].stored ? 1 : 0;
    for (std::size_t j = 0; j < i && length > 0; ++j) {
      if (placed[j].stored && *placed[j].stored < *placed[i].stored) {
        length = std::max(length, ascent[j] + 1);
      }
    }
    ascent.push_back(length);
    longest = std::max(longest, length);
  }
  return moves + placed.size() - longest;
}

TEST(MemberPositionsTest, WhatIsInOrderStays) {
  MemberPositions positions;
  EXPECT_TRUE(positions.adopt({{1, 0, 0}, {2, 1, 1}, {3, 2, 2}, {4, {}, {}}}).empty());
  EXPECT_TRUE(positions.adopt({{1, 0, -7}, {3, 4, kMost}, {2, 3, 0}}).empty());
}

TEST(MemberPositionsTest, OneThatMovesToTheFrontIsOneRow) {
  MemberPositions positions;
  const Members members{{1, 1, 10}, {2, 2, 20}, {3, 3, 30}, {4, 0, 40}};
  const std::vector<Move> moves = positions.adopt(members);
  ASSERT_EQ(moves.size(), 1U);
  EXPECT_EQ(moves[0].asset, 4);
  expectOrdered(written(members, moves));
}

TEST(MemberPositionsTest, OneThatLosesItsPlaceIsOneRow) {
  MemberPositions positions;
  const Members members{{1, 0, 10}, {2, {}, 20}, {3, 1, 30}};
  const std::vector<Move> moves = positions.adopt(members);
  ASSERT_EQ(moves.size(), 1U);
  expectOrdered(written(members, moves));
}

TEST(MemberPositionsTest, WithoutRoomTheAlbumIsNumberedAnew) {
  MemberPositions positions;
  Members members{{1, 0, 0}, {2, 2, 1}, {3, 3, 2}};
  EXPECT_TRUE(positions.adopt(members).empty());
  EXPECT_EQ(positions.place(1), std::nullopt);
  members = written(members, positions.numberAnew(members, 1));
  members.push_back({4, 1, positions.place(1)});
  expectOrdered(members);
  // Now there is room for many.
  for (int i = 0; i < 20; ++i) {
    for (Member& member : members) member.index = *member.index + (*member.index > 0 ? 1 : 0);
    EXPECT_TRUE(positions.adopt(members).empty());
    members.push_back({10 + i, 1, positions.place(1)});
    ASSERT_TRUE(members.back().stored) << i;
    expectOrdered(members);
  }
  for (Member& member : members) member.index = *member.index + (*member.index > 0 ? 1 : 0);
  EXPECT_TRUE(positions.adopt(members).empty());
  EXPECT_EQ(positions.place(1), std::nullopt);
}

TEST(MemberPositionsTest, ThereIsRoomForWhateverHasAnIndexBetween) {
  MemberPositions positions;
  Members members{{1, 0, 0}, {2, 1000, 1000}};
  EXPECT_TRUE(positions.adopt(members).empty());
  for (std::int64_t index = 1; index < 1000; ++index) {
    members.push_back({10 + index, index, positions.place(index)});
    ASSERT_TRUE(members.back().stored) << index;
  }
  expectOrdered(members);
}

TEST(MemberPositionsTest, IndexesAndPositionsMayBeAsLargeAsTheyLike) {
  const Members all{{1, kLeast, kLeast}, {2, kMost, kMost}, {3, 0, 0}};
  MemberPositions positions;
  EXPECT_TRUE(positions.adopt(all).empty());
  EXPECT_EQ(positions.place(5), 5);
  EXPECT_EQ(positions.place(-5), -5);
  EXPECT_TRUE(positions.adopt({{1, 0, kMost}}).empty());
  EXPECT_EQ(positions.place(1), std::nullopt);
  EXPECT_TRUE(positions.adopt({{1, 0, kLeast}}).empty());
  EXPECT_EQ(positions.place(-1), std::nullopt);
  expectOrdered(
      written({{1, 0, kMost}, {2, kMost, {}}}, positions.adopt({{1, 0, kMost}, {2, kMost, {}}})));
  expectOrdered(written(all, positions.numberAnew(all, 9)));
  EXPECT_EQ(positions.place(9), 9);
}

TEST(MemberPositionsTest, EqualIndexesHaveEqualPositions) {
  MemberPositions positions;
  const Members members{{1, 0, 5}, {2, 1, 6}, {3, 1, 7}, {4, 1, {}}, {5, 2, 8}};
  const Members after = written(members, positions.adopt(members));
  expectOrdered(after);
  EXPECT_EQ(after[1].stored, positions.place(1));
}

// Members come, go, move, gain and lose indexes, from one order to the next.
TEST(MemberPositionsTest, RandomHistoriesKeepTheOrderAndWriteLittle) {
  const std::uint32_t seed = std::random_device{}();
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937 random(seed);
  const auto below = [&](std::size_t n) { return static_cast<std::size_t>(random() % n); };
  for (int history = 0; history < 40; ++history) {
    Members members;
    RowId last = 0;
    std::size_t moved = 0, fewest = 0;
    for (int day = 0; day < 25; ++day) {
      std::erase_if(members, [&](const Member&) { return below(10) == 0; });
      // The order of before with some elsewhere, those to come included.
      std::vector<RowId> order;
      std::stable_sort(members.begin(), members.end(),
                       [](const Member& a, const Member& b) { return a.index < b.index; });
      for (const Member& member : members) order.push_back(member.asset);
      std::vector<RowId> joining(below(6));
      for (RowId& asset : joining) {
        asset = ++last;
        order.insert(order.begin() + static_cast<std::ptrdiff_t>(below(order.size() + 1)), asset);
      }
      for (std::size_t i = below(3); i > 0 && !order.empty(); --i) {
        std::swap(order[below(order.size())], order[below(order.size())]);
      }
      const auto indexOf = [&](RowId asset) -> std::optional<std::int64_t> {
        const auto place = std::find(order.begin(), order.end(), asset);
        return place - order.begin();
      };
      for (Member& member : members) {
        member.index = below(12) == 0 ? std::nullopt : indexOf(member.asset);
      }
      MemberPositions positions;
      const std::vector<Move> moves = positions.adopt(members);
      moved += moves.size();
      fewest += fewestMoves(members);
      members = written(members, moves);
      expectOrdered(members);
      std::shuffle(joining.begin(), joining.end(), random);
      for (const RowId asset : joining) {
        const std::int64_t index = *indexOf(asset);
        std::optional<std::int64_t> place = positions.place(index);
        if (!place) {
          members = written(members, positions.numberAnew(members, index));
          place = positions.place(index);
        }
        members.push_back({asset, index, place});
      }
      expectOrdered(members);
      if (HasFailure()) return;
    }
    EXPECT_GE(moved, fewest);
    EXPECT_LE(moved, 2 * fewest + 60) << "albums are numbered anew too often";
  }
}

}  // namespace
}  // namespace kx
