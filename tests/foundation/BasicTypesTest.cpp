#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

#include <cmath>
#include <limits>

#include "platform/foundation/Calendar.h"
#include "platform/foundation/Data.h"
#include "platform/foundation/Date.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/Exceptions.h"
#include "platform/foundation/Rect.h"

namespace kx {
namespace {

TEST(Date, DescriptionOfKnownTimes) {
  const std::pair<double, const char*> rows[] = {{0, "2001-01-01 00:00:00 +0000"},
                                                 {-978307200, "1970-01-01 00:00:00 +0000"},
                                                 {-0.5, "2000-12-31 23:59:59 +0000"},
                                                 {5097599.999, "2001-02-28 23:59:59 +0000"},
                                                 {-26352000, "2000-03-02 00:00:00 +0000"},
                                                 {-26438400, "2000-03-01 00:00:00 +0000"},
                                                 {-26524800, "2000-02-29 00:00:00 +0000"},
                                                 {-3061152000, "1904-01-01 00:00:00 +0000"},
                                                 {-63113904000, "0001-01-01 00:00:00 +0000"},
                                                 {252423993599, "9999-12-31 23:59:59 +0000"}};
  for (const auto& [seconds, text] : rows) EXPECT_EQ(Date{seconds}.description(), text);
}

TEST(Date, OutOfRangeSaysSo) {
  for (const double seconds :
       {-63113904001.0, 252423993600.0, 1e300, -1e300, std::numeric_limits<double>::quiet_NaN(),
        std::numeric_limits<double>::infinity()}) {
    EXPECT_EQ(Date{seconds}.description(), "(date out of range)");
  }
}

TEST(Date, EqualExactlyWhenSecondsAre) {
  EXPECT_EQ(Date{1.5}, Date{1.5});
  EXPECT_NE(Date{1.5}, (Date{std::nextafter(1.5, 2.0)}));
}

RC_GTEST_PROP(Date, CalendarGoesBothWays, ()) {
  const auto days =
      *rc::gen::inRange<std::int64_t>(daysFromReference(1, 1, 1), daysFromReference(10000, 1, 1));
  const auto second = *rc::gen::inRange<std::int64_t>(0, kSecondsPerDay);
  const auto time = civilTimeFromReference(static_cast<double>(days * kSecondsPerDay + second));
  RC_ASSERT(time.has_value());
  RC_ASSERT(daysFromReference(time->year, time->month, time->day) == days);
  RC_ASSERT(time->hour * 3600 + time->minute * 60 + time->second == second);
  RC_ASSERT(time->day >= 1 && time->day <= daysInMonth(time->year, time->month));
}

TEST(Data, EqualByBytes) {
  const Data empty;
  const Data a("abc", 3);
  EXPECT_TRUE(empty.isEqualToData(Data(nullptr, 0)));
  EXPECT_TRUE(a.isEqual(Data("abc", 3)));
  EXPECT_FALSE(a.isEqualToData(Data("abd", 3)));
  EXPECT_FALSE(a.isEqualToData(Data("ab", 2)));
  EXPECT_EQ(a.span().size(), 3U);
}

TEST(Error, DescriptionAndMessage) {
  const ErrorPtr plain = Error::make("POSIX", 28);
  EXPECT_EQ(plain->description(), "Error Domain=POSIX Code=28");
  EXPECT_EQ(plain->message(), "");
  EXPECT_TRUE(plain->userInfo().isNull());
  const ErrorPtr told = Error::make("FRError", 7, "disk full");
  EXPECT_EQ(told->description(), "Error Domain=FRError Code=7 \"disk full\"");
  EXPECT_EQ(told->userInfo()["message"], Value::string("disk full"));
  ErrorPtr out;
  setError(&out, told);
  EXPECT_EQ(out, told);
  setError(nullptr, told);
}

TEST(Exceptions, TextNamesWhatIsWrong) {
  EXPECT_STREQ(TypeError("uuid", "string", "number").what(),
               "wrong type under \"uuid\": expected string, found number");
  EXPECT_STREQ(InternalInconsistency("why").what(), "why");
}

TEST(Rect, DictionaryFormGoesBothWays) {
  const Rect rect{0.1, -0.25, 1e-300, 3};
  EXPECT_EQ(rectFromDictionary(dictionaryFromRect(rect)), rect);
  EXPECT_EQ(rect.description(), "{{0.1, -0.25}, {1e-300, 3}}");
}

TEST(Rect, AnyNumberWillDoButAllFourAreNeeded) {
  const Value integers = Value::dictionary({{"X", Value::integer(1)},
                                            {"Y", Value::boolean(true)},
                                            {"Width", Value(Number::real32(0.5F))},
                                            {"Height", Value::integer(2)}});
  EXPECT_EQ(rectFromDictionary(integers), (Rect{1, 1, 0.5, 2}));
  for (const char* key : {"X", "Y", "Width", "Height"}) {
    Dictionary partial(integers.dictionaryValue());
    partial.remove(key);
    EXPECT_EQ(rectFromDictionary(Value::dictionary(partial)), std::nullopt);
    partial.set(key, Value::string("1"));
    EXPECT_EQ(rectFromDictionary(Value::dictionary(partial)), std::nullopt);
  }
  EXPECT_EQ(rectFromDictionary(Value()), std::nullopt);
  EXPECT_EQ(rectFromDictionary(Value::array({})), std::nullopt);
}

}  // namespace
}  // namespace kx
