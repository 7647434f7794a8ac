#include "host/MetadataText.h"

#include <charconv>
#include <cmath>

#include "host/HostLimits.h"
#include "platform/foundation/Text.h"

namespace kx {

namespace {

constexpr std::string_view kBlank = " \t\r\n\v\f";

std::string_view trimmed(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kBlank);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlank) - first + 1);
}

std::string fromLatin1(std::string_view text) {
  std::string result;
  for (const char letter : text) {
    const auto byte = static_cast<std::uint8_t>(letter);
    if (byte < 0x80) {
      result.push_back(letter);
    } else {
      result.push_back(static_cast<char>(0xC0 | byte >> 6));
      result.push_back(static_cast<char>(0x80 | (byte & 0x3F)));
    }
  }
  return result;
}

bool continuesCharacter(char letter) { return (static_cast<std::uint8_t>(letter) & 0xC0) == 0x80; }

// A decimal number at the front of the text, which is taken off it.
std::optional<double> takeNumber(std::string_view* text) {
  const std::size_t plus = text->starts_with('+') ? 1 : 0;
  double value = 0.0;
  const auto [end, error] =
      std::from_chars(text->data() + plus, text->data() + text->size(), value);
  if (error != std::errc() || !std::isfinite(value)) return std::nullopt;
  text->remove_prefix(static_cast<std::size_t>(end - text->data()));
  return value;
}

// The number of bytes of the valid character at the front of the text, 0 when there is none.
std::size_t characterLength(std::string_view text) {
  for (std::size_t length = 1; length <= 4 && length <= text.size(); ++length) {
    if (isValidUtf8(text.substr(0, length))) return length;
  }
  return 0;
}

}  // namespace

std::string cleanText(std::string_view raw) {
  const std::string_view text = trimmed(raw.substr(0, raw.find('\0')));
  std::string result = isValidUtf8(text) ? std::string(text) : fromLatin1(text);
  if (result.size() <= hostlimits::kTextBytes) return result;
  std::size_t end = hostlimits::kTextBytes;
  while (end > 0 && continuesCharacter(result[end])) --end;
  result.resize(end);
  return result;
}

std::optional<double> finiteNumber(std::string_view raw) {
  std::string_view text = trimmed(raw);
  const std::optional<double> value = takeNumber(&text);
  if (!value || text.empty()) return value;
  if (!text.starts_with('/')) return std::nullopt;
  text.remove_prefix(1);
  const std::optional<double> divisor = takeNumber(&text);
  if (!divisor || !text.empty() || *divisor == 0.0) return std::nullopt;
  const double quotient = *value / *divisor;
  return std::isfinite(quotient) ? std::optional(quotient) : std::nullopt;
}

std::optional<double> xmpDegrees(std::string_view raw) {
  std::string_view text = trimmed(raw);
  if (text.empty()) return std::nullopt;
  const char direction = text.back();
  const bool negative = direction == 'S' || direction == 'W';
  if (!negative && direction != 'N' && direction != 'E') return std::nullopt;
  text.remove_suffix(1);
  double degrees = 0.0;
  double unit = 1.0;
  while (true) {
    const std::optional<double> part = takeNumber(&text);
    if (!part || *part < 0 || unit > 3600.0) return std::nullopt;
    degrees += *part / unit;
    unit *= 60.0;
    if (text.empty()) break;
    if (!text.starts_with(',')) return std::nullopt;
    text.remove_prefix(1);
  }
  return negative ? -degrees : degrees;
}

std::optional<Place> iso6709(std::string_view raw) {
  std::string_view text = trimmed(raw.substr(0, raw.find('\0')));
  const auto isSigned = [&text] { return text.starts_with('+') || text.starts_with('-'); };
  if (!isSigned()) return std::nullopt;
  const std::optional<double> latitude = takeNumber(&text);
  if (!latitude || !isSigned()) return std::nullopt;
  return validPlace(latitude, takeNumber(&text));
}

std::optional<Place> validPlace(std::optional<double> latitude, std::optional<double> longitude) {
  if (!latitude || !longitude || !std::isfinite(*latitude) || !std::isfinite(*longitude))
    return std::nullopt;
  if (std::abs(*latitude) > 90.0 || std::abs(*longitude) > 180.0) return std::nullopt;
  return Place{*latitude, *longitude};
}

std::string nameText(std::string_view raw) {
  if (isValidUtf8(raw)) return std::string(raw);
  static constexpr std::string_view kDigits = "0123456789ABCDEF";
  std::string result;
  while (!raw.empty()) {
    const std::size_t length = characterLength(raw);
    if (length > 0) {
      result.append(raw.substr(0, length));
      raw.remove_prefix(length);
      continue;
    }
    const auto byte = static_cast<std::uint8_t>(raw.front());
    result += "\\x";
    result.push_back(kDigits[byte >> 4]);
    result.push_back(kDigits[byte & 0xF]);
    raw.remove_prefix(1);
  }
  return result;
}

}  // namespace kx
