#pragma once

#include <cmath>
#include <cstdint>
#include <optional>
#include <string>

// The Gregorian calendar in UTC for the years 1 to 9999, without leap seconds.
namespace kx {

struct CivilTime {
  int year = 0;
  int month = 0;
  int day = 0;
  int hour = 0;
  int minute = 0;
  int second = 0;
};

inline constexpr std::int64_t kSecondsPerDay = 86400;

// Days from 2001-01-01 to the date; proleptic Gregorian, any year from 1 on.
constexpr std::int64_t daysFromReference(int year, int month, int day) {
  const std::int64_t y = month <= 2 ? year - 1 : year;
  const std::int64_t era = y / 400;
  const std::int64_t yearOfEra = y - era * 400;
  const std::int64_t dayOfYear = (153 * (month > 2 ? month - 3 : month + 9) + 2) / 5 + day - 1;
  const std::int64_t dayOfEra = yearOfEra * 365 + yearOfEra / 4 - yearOfEra / 100 + dayOfYear;
  constexpr std::int64_t kReferenceDay = 730791;  // 2001-01-01 counted from 0000-03-01
  return era * 146097 + dayOfEra - kReferenceDay;
}
static_assert(daysFromReference(2001, 1, 1) == 0);
static_assert(daysFromReference(1970, 1, 1) == -11323);

inline constexpr double kFirstSecond = static_cast<double>(daysFromReference(1, 1, 1) * 86400);
inline constexpr double kSecondAfterLast =
    static_cast<double>(daysFromReference(10000, 1, 1) * 86400);

// Finite and in the years 1 to 9999.
inline bool isDateInRange(double secondsSinceReference) {
  return secondsSinceReference >= kFirstSecond && secondsSinceReference < kSecondAfterLast;
}

// The whole second at or before the time; nullopt when it is out of range.
inline std::optional<CivilTime> civilTimeFromReference(double secondsSinceReference) {
  if (!isDateInRange(secondsSinceReference)) return std::nullopt;
  const auto total = static_cast<std::int64_t>(std::floor(secondsSinceReference));
  std::int64_t days = total / kSecondsPerDay;
  std::int64_t rest = total % kSecondsPerDay;
  if (rest < 0) {
    rest += kSecondsPerDay;
    --days;
  }
  const std::int64_t z = days - daysFromReference(1, 1, 1) + 306;  // from 0000-03-01
  const std::int64_t era = z / 146097;
  const std::int64_t dayOfEra = z - era * 146097;
  const std::int64_t yearOfEra =
      (dayOfEra - dayOfEra / 1460 + dayOfEra / 36524 - dayOfEra / 146096) / 365;
  const std::int64_t dayOfYear = dayOfEra - (365 * yearOfEra + yearOfEra / 4 - yearOfEra / 100);
  const std::int64_t monthFromMarch = (5 * dayOfYear + 2) / 153;
  CivilTime time;
  time.day = static_cast<int>(dayOfYear - (153 * monthFromMarch + 2) / 5 + 1);
  time.month = static_cast<int>(monthFromMarch < 10 ? monthFromMarch + 3 : monthFromMarch - 9);
  time.year = static_cast<int>(yearOfEra + era * 400 + (time.month <= 2 ? 1 : 0));
  time.hour = static_cast<int>(rest / 3600);
  time.minute = static_cast<int>(rest / 60 % 60);
  time.second = static_cast<int>(rest % 60);
  return time;
}

inline bool isLeapYear(int year) { return (year % 4 == 0 && year % 100 != 0) || year % 400 == 0; }

inline int daysInMonth(int year, int month) {
  constexpr int kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  return month == 2 && isLeapYear(year) ? 29 : kDays[month - 1];
}

inline std::string padded(int value, std::size_t width) {
  std::string text = std::to_string(value);
  if (text.size() < width) text.insert(0, width - text.size(), '0');
  return text;
}

}  // namespace kx
