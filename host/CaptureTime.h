#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace kx {

// A moment as a camera states it: the time on the wall, and how far the wall's clock is from UTC
// where the file says so.
struct CaptureTime {
  std::int64_t wallSeconds = 0;  // of the wall-clock time, counted as if it were UTC, since 1970
  double fraction = 0.0;         // 0 <= fraction < 1
  std::optional<int> offsetMinutes;

  // Seconds since 1904-01-01 UTC; the given offset is for a time that states none.
  double hostSeconds(int defaultOffsetMinutes) const;
  // The wall-clock day, "2024-05-31".
  std::string isoDay() const;
};

// "2024:05:31 23:59:59", also with "-" or "T", with digits of a second ("" for none) and an offset
// ("+02:00", "Z", "" for none) that stand in tags of their own. Nothing for a time that is none
// (zeros, blanks), out of the calendar, or outside the years 1 to 9999.
std::optional<CaptureTime> exifTime(std::string_view time, std::string_view subSeconds,
                                    std::string_view offset);

// "2024-05-31", "2024-05-31T23:59:59.25+02:00" and the forms between. A date alone is its midnight.
std::optional<CaptureTime> isoTime(std::string_view text);

// A moment in UTC as it shows on a wall that far from UTC.
CaptureTime wallTimeOf(std::int64_t utcSeconds, int offsetMinutes);

// Minutes east of UTC: "+02:00", "-0530", "Z". Nothing beyond 14 hours.
std::optional<int> parseOffset(std::string_view text);

// Host time of a point in time that is given in seconds and nanoseconds since 1970.
double hostSecondsOf(std::int64_t seconds, std::int32_t nanoseconds);

}  // namespace kx
