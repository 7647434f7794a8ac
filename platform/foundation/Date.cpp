#include "platform/foundation/Date.h"

#include <cmath>

#include "platform/foundation/Calendar.h"

namespace kx {

std::string Date::description() const {
  const std::optional<CivilTime> time = civilTimeFromReference(secondsSinceReference);
  if (!time) return "(date out of range)";
  return padded(time->year, 4) + '-' + padded(time->month, 2) + '-' + padded(time->day, 2) + ' ' +
         padded(time->hour, 2) + ':' + padded(time->minute, 2) + ':' + padded(time->second, 2) +
         " +0000";
}

}  // namespace kx
