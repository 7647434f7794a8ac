#include "device/RowRegistry.h"

#include <gtest/gtest.h>

#include <limits>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <utility>
#include <vector>

namespace kx {
namespace {

using Rows = std::vector<std::pair<RowId, int>>;

Rows rowsOf(RowRegistry<std::pair<RowId, int>>& registry) {
  Rows rows;
  registry.forEach([&](const auto& object) { rows.push_back(*object); });
  return rows;
}

TEST(RowRegistryTest, RowsMayHaveAnyNumber) {
  RowRegistry<std::pair<RowId, int>> registry;
  const std::vector<RowId> numbers{std::numeric_limits<RowId>::max(), 5, 2'000, -1, 0,
                                   std::numeric_limits<RowId>::min()};
  for (const RowId number : numbers) {
    EXPECT_EQ(registry.find(number), nullptr);
    EXPECT_EQ(registry.peek(number), nullptr);
    registry.at(number) = std::make_shared<std::pair<RowId, int>>(number, 1);
  }
  for (const RowId number : numbers) EXPECT_EQ(registry.peek(number), registry.find(number).get());
  const Rows expected{{numbers[5], 1}, {-1, 1}, {0, 1}, {5, 1}, {2'000, 1}, {numbers[0], 1}};
  EXPECT_EQ(rowsOf(registry), expected);
  for (const RowId number : numbers) {
    registry.erase(number);
    EXPECT_EQ(registry.find(number), nullptr);
  }
  EXPECT_TRUE(rowsOf(registry).empty());
}

TEST(RowRegistryTest, ObjectsMayBeLetGoOfInTheirPlace) {
  RowRegistry<std::pair<RowId, int>> registry;
  registry.at(3) = std::make_shared<std::pair<RowId, int>>(3, 0);
  registry.at(1 << 20) = std::make_shared<std::pair<RowId, int>>(1 << 20, 0);
  registry.forEach([](auto& object) { object = nullptr; });
  EXPECT_TRUE(rowsOf(registry).empty());
  EXPECT_EQ(registry.find(3), nullptr);
}

// Dense and sparse numbers, in any order, against a tree.
TEST(RowRegistryTest, RandomHistoriesAreThoseOfATree) {
  const std::uint32_t seed = std::random_device{}();
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937 random(seed);
  for (int history = 0; history < 20; ++history) {
    RowRegistry<std::pair<RowId, int>> registry;
    std::map<RowId, int> model;
    const RowId span = history % 2 == 0 ? 20'000 : 400;
    for (int step = 0; step < 6'000; ++step) {
      const RowId row = random() % 3 == 0 ? static_cast<RowId>(random() % 4'000'000'000U)
                                          : static_cast<RowId>(random()) % span;
      if (random() % 5 == 0) {
        registry.erase(row);
        model.erase(row);
        continue;
      }
      auto& place = registry.at(row);
      ASSERT_EQ(place != nullptr, model.contains(row));
      if (place) {
        ASSERT_EQ(*place, std::pair(row, model.at(row)));
      } else {
        place = std::make_shared<std::pair<RowId, int>>(row, step);
        model.emplace(row, step);
      }
      ASSERT_EQ(registry.find(row)->second, model.at(row));
    }
    EXPECT_EQ(rowsOf(registry), Rows(model.begin(), model.end()));
  }
}

}  // namespace
}  // namespace kx
