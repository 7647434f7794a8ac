#include "platform/foundation/Number.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

#include <cmath>
#include <limits>

namespace kx {
namespace {

using Type = Number::Type;
constexpr std::int64_t kLowest = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kHighest = std::numeric_limits<std::int64_t>::max();
constexpr std::uint64_t kAllOnes = std::numeric_limits<std::uint64_t>::max();
const double kInfinity = std::numeric_limits<double>::infinity();
const double kNaN = std::numeric_limits<double>::quiet_NaN();

TEST(Number, EqualityIsNumericAcrossTypes) {
  const Number ones[] = {Number::boolean(true), Number::integer(1), Number::unsignedInteger(1),
                         Number::real32(1.0F), Number::real(1.0)};
  for (const Number& a : ones) {
    for (const Number& b : ones) EXPECT_EQ(a, b);
    EXPECT_NE(a, Number::integer(0));
    EXPECT_NE(a, Number::real(1.5));
  }
  EXPECT_EQ(Number::boolean(false), Number::real(-0.0));
}

TEST(Number, EqualityDoesNotRoundIntegers) {
  constexpr std::int64_t kAbove = (std::int64_t{1} << 53) + 1;
  EXPECT_NE(Number::integer(kAbove), Number::real(9007199254740992.0));
  EXPECT_NE(Number::integer(kHighest), Number::real(9223372036854775808.0));
  EXPECT_EQ(Number::integer(kLowest), Number::real(-9223372036854775808.0));
  EXPECT_EQ(Number::unsignedInteger(std::uint64_t{1} << 63), Number::real(9223372036854775808.0));
  EXPECT_NE(Number::unsignedInteger(kAllOnes), Number::real(18446744073709551616.0));
  EXPECT_NE(Number::integer(-1), Number::unsignedInteger(kAllOnes));
  EXPECT_NE(Number::integer(-1), Number::real(1));
}

TEST(Number, NonFiniteRealsEqualOnlyTheirKind) {
  EXPECT_EQ(Number::real(kNaN), Number::real(kNaN));
  EXPECT_EQ(Number::real(kInfinity), Number::real32(std::numeric_limits<float>::infinity()));
  EXPECT_NE(Number::real(kInfinity), Number::real(-kInfinity));
  EXPECT_NE(Number::real(kNaN), Number::integer(0));
  EXPECT_NE(Number::real(kInfinity), Number::integer(kHighest));
}

TEST(Number, UnsignedTypeOnlyBeyondInt64) {
  EXPECT_EQ(Number::unsignedInteger(static_cast<std::uint64_t>(kHighest)).type(), Type::kInteger);
  EXPECT_EQ(Number::unsignedInteger(static_cast<std::uint64_t>(kHighest) + 1).type(),
            Type::kUnsigned);
}

TEST(Number, RealsReadAsIntegersTruncateAndSaturate) {
  EXPECT_EQ(Number::real(-1.9).int64Value(), -1);
  EXPECT_EQ(Number::real(1.9).int64Value(), 1);
  EXPECT_EQ(Number::real(1e300).int64Value(), kHighest);
  EXPECT_EQ(Number::real(9223372036854775808.0).int64Value(), kHighest);
  EXPECT_EQ(Number::real(-1e300).int64Value(), kLowest);
  EXPECT_EQ(Number::real(-kInfinity).int64Value(), kLowest);
  EXPECT_EQ(Number::real(kNaN).int64Value(), 0);
  EXPECT_EQ(Number::real(1e300).uint64Value(), kAllOnes);
  EXPECT_EQ(Number::real(-1).uint64Value(), kAllOnes);
  EXPECT_EQ(Number::real(kNaN).uint64Value(), 0U);
}

TEST(Number, NarrowReadingsTakeTheLowBits) {
  EXPECT_EQ(Number::integer(0x1'0000'0005).int32Value(), 5);
  EXPECT_EQ(Number::integer(0x18000).int16Value(), std::numeric_limits<std::int16_t>::min());
  EXPECT_EQ(Number::unsignedInteger(kAllOnes).int64Value(), -1);
}

TEST(Number, OtherReadings) {
  EXPECT_TRUE(Number::real(0.5).boolValue());
  EXPECT_FALSE(Number::real(-0.0).boolValue());
  EXPECT_TRUE(Number::integer(-3).boolValue());
  EXPECT_EQ(Number::unsignedInteger(kAllOnes).doubleValue(), 18446744073709551616.0);
  EXPECT_EQ(Number::integer(-2).doubleValue(), -2.0);
  EXPECT_EQ(Number::boolean(true).doubleValue(), 1.0);
}

TEST(Number, Description) {
  EXPECT_EQ(Number::boolean(true).description(), "1");
  EXPECT_EQ(Number::boolean(false).description(), "0");
  EXPECT_EQ(Number::integer(-7).description(), "-7");
  EXPECT_EQ(Number::unsignedInteger(kAllOnes).description(), "18446744073709551615");
  EXPECT_EQ(Number::real(0.1).description(), "0.1");
  EXPECT_EQ(Number::real32(0.1F).description(), "0.1");
  EXPECT_EQ(Number::real(3).description(), "3");
  EXPECT_EQ(Number::real(kNaN).description(), "nan");
  EXPECT_EQ(Number::real(-kInfinity).description(), "-inf");
}

RC_GTEST_PROP(Number, RealDescriptionReadsBackTheSame, (double value)) {
  RC_ASSERT(std::stod(Number::real(value).description()) == value);
}

RC_GTEST_PROP(Number, EqualIntegersAndRealsAgreeWithWideArithmetic, (std::int64_t value)) {
  const auto real = static_cast<double>(value);
  const bool exact = std::fabs(real) < 9223372036854775808.0
                         ? static_cast<std::int64_t>(real) == value
                         : real < 0 && value == kLowest;
  RC_ASSERT((Number::integer(value) == Number::real(real)) == exact);
}

}  // namespace
}  // namespace kx
