#pragma once

#include <string>

namespace kx {

// A point in time: seconds since 2001-01-01 00:00:00 UTC (the reference date), fractions allowed.
// Two dates are the same exactly when their seconds are equal.
struct Date {
  double secondsSinceReference = 0.0;

  // "2001-01-01 00:00:00 +0000", whole seconds; "(date out of range)" outside the years 1 to 9999.
  std::string description() const;

  friend bool operator==(const Date& a, const Date& b) = default;
};

}  // namespace kx
