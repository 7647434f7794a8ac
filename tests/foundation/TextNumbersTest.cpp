#include "platform/foundation/TextNumbers.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

#include <map>
#include <string>

namespace kx {
namespace {

TEST(TextNumbersTest, NumbersFollowTheFirstMention) {
  TextNumbers numbers;
  EXPECT_TRUE(numbers.empty());
  EXPECT_FALSE(numbers.contains(""));
  EXPECT_EQ(numbers.add("b"), 0U);
  EXPECT_EQ(numbers.add(""), 1U);
  EXPECT_EQ(numbers.add("b"), 0U);
  EXPECT_EQ(numbers.add("a"), 2U);
  EXPECT_EQ(numbers.texts(), (std::vector<std::string_view>{"b", "", "a"}));
  EXPECT_EQ(numbers.find("c"), TextNumbers::kNone);
}

TEST(TextNumbersTest, AGuessNeedNotBeRight) {
  TextNumbers numbers(2);
  numbers.add("a");
  numbers.add("b");
  for (const std::uint32_t guess : {0U, 1U, 2U, TextNumbers::kNone}) {
    EXPECT_EQ(numbers.find("a", guess), 0U);
    EXPECT_EQ(numbers.find("b", guess), 1U);
    EXPECT_EQ(numbers.find("c", guess), TextNumbers::kNone);
  }
}

RC_GTEST_PROP(TextNumbersTest, AgreesWithAMap, ()) {
  const auto texts = *rc::gen::container<std::vector<std::string>>(
      rc::gen::map(rc::gen::inRange(0, 200), [](int number) { return std::to_string(number); }));
  const auto expected = *rc::gen::inRange<std::size_t>(0, 64);
  TextNumbers numbers(expected);
  std::map<std::string, std::uint32_t> known;
  for (const std::string& text : texts) {
    const auto [place, isNew] = known.emplace(text, static_cast<std::uint32_t>(known.size()));
    RC_ASSERT(numbers.contains(text) == !isNew);
    RC_ASSERT(numbers.add(text) == place->second);
  }
  RC_ASSERT(numbers.size() == known.size());
  for (const auto& [text, number] : known) RC_ASSERT(numbers.find(text) == number);
}

}  // namespace
}  // namespace kx
