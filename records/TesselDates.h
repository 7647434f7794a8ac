#pragma once

#include <optional>

#include "platform/foundation/Date.h"
#include "platform/foundation/Value.h"

namespace kx {

// Seconds from 1904-01-01 to 2001-01-01, both 00:00:00 UTC: 35430 days.
inline constexpr double kTesselEpochOffsetSeconds = 3061152000.0;

// The date of a host time, in seconds since 1904-01-01 00:00:00 UTC, fractions allowed. No time
// zone and no leap second enters.
inline Date dateWithTesselTimeInterval(double secondsSince1904) {
  return Date{secondsSince1904 - kTesselEpochOffsetSeconds};
}
// The same of a record's number; null counts as 0.0.
inline Date dateWithTesselTimeInterval(const std::optional<Number>& secondsSince1904) {
  return dateWithTesselTimeInterval(secondsSince1904 ? secondsSince1904->doubleValue() : 0.0);
}

}  // namespace kx
