#include "host/CaptureTime.h"

#include <array>
#include <charconv>
#include <chrono>

namespace kx {

namespace {

constexpr std::int64_t kSecondsFrom1904To1970 = 2'082'844'800;
constexpr std::int64_t kDaySeconds = 86'400;

// Takes pieces from the front of a text.
class Scanner {
 public:
  explicit Scanner(std::string_view text) : rest_(text) {}

  std::optional<int> digits(std::size_t count) {
    if (rest_.size() < count) return std::nullopt;
    int value = 0;
    for (const char letter : rest_.substr(0, count)) {
      if (letter < '0' || letter > '9') return std::nullopt;
      value = value * 10 + (letter - '0');
    }
    rest_.remove_prefix(count);
    return value;
  }
  bool oneOf(std::string_view letters) {
    if (rest_.empty() || letters.find(rest_.front()) == std::string_view::npos) return false;
    rest_.remove_prefix(1);
    return true;
  }
  std::string_view rest() const { return rest_; }

 private:
  std::string_view rest_;
};

std::string_view trimmed(std::string_view text) {
  static constexpr std::string_view kBlank(" \t\r\n\0", 5);
  const std::size_t first = text.find_first_not_of(kBlank);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlank) - first + 1);
}

// The digits behind the decimal point of a second, as a share of it.
double fractionOf(std::string_view digits) {
  double value = 0.0;
  std::string text = "0.";
  for (const char letter : digits.substr(0, 17)) {
    if (letter < '0' || letter > '9') break;
    text.push_back(letter);
  }
  if (text.size() > 2) std::from_chars(text.data(), text.data() + text.size(), value);
  return value < 1.0 ? value : 0.0;
}

std::optional<std::int64_t> dayOf(int year, int month, int day) {
  using namespace std::chrono;
  if (year < 1 || year > 9999) return std::nullopt;
  const year_month_day date{std::chrono::year(year),
                            std::chrono::month(static_cast<unsigned>(month)),
                            std::chrono::day(static_cast<unsigned>(day))};
  if (!date.ok()) return std::nullopt;
  return sys_days(date).time_since_epoch().count();
}

// Year, month and day with the separators given between them.
std::optional<std::int64_t> scanDay(Scanner* scanner, std::string_view separators) {
  const auto year = scanner->digits(4);
  if (!year || !scanner->oneOf(separators)) return std::nullopt;
  const auto month = scanner->digits(2);
  if (!month || !scanner->oneOf(separators)) return std::nullopt;
  const auto day = scanner->digits(2);
  if (!day) return std::nullopt;
  return dayOf(*year, *month, *day);
}

// Hours and minutes, and seconds where they stand. A leap second is the one before it.
std::optional<std::int64_t> scanClock(Scanner* scanner) {
  const auto hours = scanner->digits(2);
  if (!hours || !scanner->oneOf(":")) return std::nullopt;
  const auto minutes = scanner->digits(2);
  if (!minutes) return std::nullopt;
  int seconds = 0;
  if (scanner->oneOf(":")) {
    const auto found = scanner->digits(2);
    if (!found) return std::nullopt;
    seconds = *found;
  }
  if (*hours > 23 || *minutes > 59 || seconds > 60) return std::nullopt;
  return *hours * 3600 + *minutes * 60 + (seconds == 60 ? 59 : seconds);
}

std::string padded(int value, std::size_t width) {
  std::string text = std::to_string(value);
  return std::string(text.size() < width ? width - text.size() : 0, '0') + text;
}

}  // namespace

double CaptureTime::hostSeconds(int defaultOffsetMinutes) const {
  const std::int64_t utc = wallSeconds - 60LL * offsetMinutes.value_or(defaultOffsetMinutes);
  return static_cast<double>(utc + kSecondsFrom1904To1970) + fraction;
}

std::string CaptureTime::isoDay() const {
  std::int64_t days = wallSeconds / kDaySeconds;
  if (wallSeconds % kDaySeconds < 0) --days;
  const std::chrono::year_month_day date{
      std::chrono::sys_days(std::chrono::days(static_cast<int>(days)))};
  return padded(static_cast<int>(date.year()), 4) + "-" +
         padded(static_cast<int>(static_cast<unsigned>(date.month())), 2) + "-" +
         padded(static_cast<int>(static_cast<unsigned>(date.day())), 2);
}

std::optional<CaptureTime> exifTime(std::string_view time, std::string_view subSeconds,
                                    std::string_view offset) {
  Scanner scanner(trimmed(time));
  const auto day = scanDay(&scanner, ":-/.");
  if (!day || !scanner.oneOf(" T")) return std::nullopt;
  const auto clock = scanClock(&scanner);
  if (!clock) return std::nullopt;
  CaptureTime result;
  result.wallSeconds = *day * kDaySeconds + *clock;
  result.fraction = fractionOf(trimmed(subSeconds));
  result.offsetMinutes = parseOffset(offset);
  return result;
}

std::optional<CaptureTime> isoTime(std::string_view text) {
  Scanner scanner(trimmed(text));
  const auto day = scanDay(&scanner, "-");
  if (!day) return std::nullopt;
  CaptureTime result;
  result.wallSeconds = *day * kDaySeconds;
  if (scanner.rest().empty()) return result;
  if (!scanner.oneOf("T ")) return std::nullopt;
  const auto clock = scanClock(&scanner);
  if (!clock) return std::nullopt;
  result.wallSeconds += *clock;
  std::string_view rest = scanner.rest();
  if (scanner.oneOf(".,")) {
    rest = scanner.rest();
    result.fraction = fractionOf(rest);
    const std::size_t end = rest.find_first_not_of("0123456789");
    rest = end == std::string_view::npos ? std::string_view() : rest.substr(end);
  }
  if (rest.empty()) return result;
  result.offsetMinutes = parseOffset(rest);
  if (!result.offsetMinutes) return std::nullopt;
  return result;
}

CaptureTime wallTimeOf(std::int64_t utcSeconds, int offsetMinutes) {
  CaptureTime result;
  result.wallSeconds = utcSeconds + 60LL * offsetMinutes;
  result.offsetMinutes = offsetMinutes;
  return result;
}

std::optional<int> parseOffset(std::string_view text) {
  const std::string_view clean = trimmed(text);
  if (clean == "Z") return 0;
  Scanner scanner(clean);
  const bool west = clean.starts_with('-');
  if (!scanner.oneOf("+-")) return std::nullopt;
  const auto hours = scanner.digits(2);
  if (!hours) return std::nullopt;
  scanner.oneOf(":");
  const auto minutes = scanner.rest().empty() ? std::optional<int>(0) : scanner.digits(2);
  if (!minutes || !scanner.rest().empty() || *minutes > 59) return std::nullopt;
  const int total = *hours * 60 + *minutes;
  if (total > 14 * 60) return std::nullopt;
  return west ? -total : total;
}

double hostSecondsOf(std::int64_t seconds, std::int32_t nanoseconds) {
  return static_cast<double>(seconds + kSecondsFrom1904To1970) +
         static_cast<double>(nanoseconds) / 1e9;
}

}  // namespace kx
