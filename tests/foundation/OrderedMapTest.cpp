#include "platform/foundation/OrderedMap.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

#include <string>

namespace kx {
namespace {

std::string describe(const OrderedMap<int>& map) {
  std::string text;
  for (const auto& entry : map) {
    text += std::string(entry.key.stringValue()) + "=" + std::to_string(entry.value) + " ";
  }
  return text;
}

TEST(OrderedMap, AnnouncedKeysAreSetAsOthersAre) {
  OrderedMap<int> map;
  std::vector<std::uint64_t> hashes;
  for (int i = 0; i < 100; ++i) hashes.push_back(map.announce(std::to_string(i % 60)));
  for (int i = 0; i < 100; ++i) {
    map.setHashed(Value::string(std::to_string(i % 60)), i, hashes[static_cast<std::size_t>(i)]);
  }
  EXPECT_EQ(map.size(), 60U);
  for (int i = 0; i < 60; ++i) EXPECT_EQ(*map.find(std::to_string(i)), i < 40 ? i + 60 : i);
}

TEST(OrderedMap, KeepsOrderThroughReplacementAndRemoval) {
  OrderedMap<int> map;
  map.set("b", 1);
  map.set("a", 2);
  map.set("c", 3);
  map.set("b", 4);
  EXPECT_EQ(describe(map), "b=4 a=2 c=3 ");
  EXPECT_TRUE(map.remove("b"));
  EXPECT_FALSE(map.remove("b"));
  map.set("b", 5);
  EXPECT_EQ(describe(map), "a=2 c=3 b=5 ");
  EXPECT_EQ(map.size(), 3U);
  EXPECT_EQ(*map.find("c"), 3);
  EXPECT_EQ(map.find("d"), nullptr);
  map.clear();
  EXPECT_TRUE(map.empty());
  EXPECT_FALSE(map.contains("a"));
}

TEST(OrderedMap, ACursorFindsEveryKeyInAnyOrder) {
  OrderedMap<int> map;
  for (int i = 0; i < 100; ++i) map.set("key " + std::to_string(i), i);
  map.remove("key 50");
  OrderedMap<int>::Cursor cursor;
  for (const int step : {1, 7, 99}) {
    for (int i = 0; i < 100; ++i) {
      const int number = i * step % 100;
      const auto* found = map.find("key " + std::to_string(number), cursor);
      ASSERT_EQ(found == nullptr, number == 50) << number;
      if (found == nullptr) continue;
      EXPECT_EQ(found->value, number);
      EXPECT_EQ(cursor.place(), static_cast<std::size_t>(number));
    }
    EXPECT_EQ(map.find("missing", cursor), nullptr);
  }
  EXPECT_EQ(map.places(), 100U);
  OrderedMap<int> empty;
  EXPECT_EQ(empty.find("", cursor), nullptr);
}

TEST(OrderedMap, EmptyKeyIsAKey) {
  OrderedMap<int> map;
  map.set("", 1);
  EXPECT_TRUE(map.contains(""));
  EXPECT_EQ(describe(map), "=1 ");
}

// Removed entries fill the table: each probe must still end, and memory must not grow without
// bound.
TEST(OrderedMap, InsertAndRemoveAMillionTimes) {
  OrderedMap<int> map;
  for (int i = 0; i < 1'000'000; ++i) {
    map.set(std::to_string(i), i);
    if (i >= 3) {
      EXPECT_TRUE(map.remove(std::to_string(i - 3)));
    }
    EXPECT_FALSE(map.contains("missing"));
  }
  EXPECT_EQ(map.size(), 3U);
  EXPECT_EQ(describe(map), "999997=999997 999998=999998 999999=999999 ");
}

// Taking the first entry again and again must not look at all removed ones before it each time.
TEST(OrderedMap, EmptiedFromTheFront) {
  OrderedMap<int> map;
  for (int i = 0; i < 300'000; ++i) map.set(std::to_string(i), i);
  for (int i = 0; i < 300'000; ++i) {
    const Value key = map.begin()->key;
    ASSERT_EQ(map.begin()->value, i);
    ASSERT_TRUE(map.remove(key.stringValue()));
  }
  EXPECT_EQ(map.begin(), map.end());
}

TEST(OrderedMap, ReserveKeepsContent) {
  OrderedMap<int> map;
  map.set("a", 1);
  map.remove("a");
  map.set("b", 2);
  map.reserve(1000);
  EXPECT_EQ(describe(map), "b=2 ");
  map.reserve(1);
  EXPECT_EQ(describe(map), "b=2 ");
}

// Against a plain list of pairs.
RC_GTEST_PROP(OrderedMap, BehavesLikeAListOfPairs,
              (const std::vector<std::pair<std::uint8_t, bool>>& steps)) {
  OrderedMap<int> map;
  std::vector<std::pair<std::string, int>> model;
  int serial = 0;
  for (const auto& [number, inserts] : steps) {
    const std::string key = std::to_string(number % 24);
    const auto found = std::find_if(model.begin(), model.end(),
                                    [&](const auto& entry) { return entry.first == key; });
    if (inserts) {
      map.set(key, ++serial);
      if (found == model.end()) {
        model.emplace_back(key, serial);
      } else {
        found->second = serial;
      }
    } else {
      RC_ASSERT(map.remove(key) == (found != model.end()));
      if (found != model.end()) model.erase(found);
    }
    std::string text;
    for (const auto& [k, v] : model) text += k + "=" + std::to_string(v) + " ";
    RC_ASSERT(describe(map) == text);
    RC_ASSERT(map.size() == model.size());
  }
}

}  // namespace
}  // namespace kx
