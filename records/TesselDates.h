#pragma once

#include "platform/foundation/Date.h"

namespace kx {

// Seconds from 1904-01-01 to 2001-01-01, both 00:00:00 UTC: 35430 days.
inline constexpr double kTesselEpochOffsetSeconds = 3061152000.0;

// The date of a host time, in seconds since 1904-01-01 00:00:00 UTC, fractions allowed. No time
// zone and no leap second enters.
inline Date dateWithTesselTimeInterval(double secondsSince1904) {
  return Date{secondsSince1904 - kTesselEpochOffsetSeconds};
}

}  // namespace kx
