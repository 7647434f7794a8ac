#include "device/CameraMetadata.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <string_view>
#include <vector>

#include "platform/foundation/Calendar.h"

namespace kx {
namespace {

using Bytes = std::span<const std::uint8_t>;

constexpr std::size_t kExifBytes = 64 * 1024;  // what a JPEG's segment holds
constexpr std::size_t kDirectoryEntries = 512;
constexpr std::size_t kTopBoxes = 64;
constexpr std::size_t kMovieBytes = std::size_t{1} << 20;
constexpr std::int64_t kUnixSecondsOfReferenceDate = 978307200;
constexpr std::int64_t kUnixSecondsOfMovieEpoch = -2082844800;  // 1904-01-01

std::string_view textOf(Bytes bytes) {
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

std::uint64_t bigEndian(Bytes bytes, std::size_t at, std::size_t length) {
  std::uint64_t value = 0;
  for (std::size_t i = 0; i < length; ++i) value = value << 8U | bytes[at + i];
  return value;
}

// A TIFF structure in memory, read without ever leaving it.
class Tiff {
 public:
  struct Entry {
    std::uint16_t type = 0;
    std::uint32_t count = 0;
    std::size_t at = 0;  // where its value is
  };

  explicit Tiff(Bytes bytes) : bytes_(bytes) {
    if (bytes.size() < 8) return;
    little_ = bytes[0] == 'I';
    valid_ = u16(2) == 42;
  }
  bool valid() const { return valid_; }
  std::size_t first() const { return u32(4); }

  std::optional<Entry> find(std::size_t directory, std::uint16_t tag) const {
    if (!holds(directory, 2)) return std::nullopt;
    const std::size_t count = std::min<std::size_t>(u16(directory), kDirectoryEntries);
    for (std::size_t i = 0; i < count; ++i) {
      const std::size_t at = directory + 2 + i * 12;
      if (!holds(at, 12)) return std::nullopt;
      if (u16(at) != tag) continue;
      Entry entry{u16(at + 2), u32(at + 4), at + 8};
      const std::uint64_t length = std::uint64_t{entry.count} * sizeOf(entry.type);
      if (length > 4) entry.at = u32(at + 8);
      if (length == 0 || !holds(entry.at, length)) return std::nullopt;
      return entry;
    }
    return std::nullopt;
  }
  std::size_t directoryAt(std::size_t directory, std::uint16_t tag) const {
    const auto entry = find(directory, tag);
    return entry && entry->type == kLong ? u32(entry->at) : 0;
  }
  std::string_view text(std::size_t directory, std::uint16_t tag) const {
    const auto entry = find(directory, tag);
    if (!entry || entry->type != kAscii) return {};
    std::string_view value = textOf(bytes_.subspan(entry->at, entry->count));
    value = value.substr(0, value.find('\0'));
    return value.substr(0, value.find_last_not_of(' ') + 1);
  }
  // Degrees, minutes and seconds as one number.
  std::optional<double> degrees(std::size_t directory, std::uint16_t tag) const {
    const auto entry = find(directory, tag);
    if (!entry || entry->type != kRational) return std::nullopt;
    double value = 0.0;
    double unit = 1.0;
    for (std::size_t i = 0; i < std::min<std::size_t>(entry->count, 3); ++i, unit *= 60.0) {
      const double above = u32(entry->at + i * 8);
      const double below = u32(entry->at + i * 8 + 4);
      // Nothing over nothing stands for a part that is not known.
      if (below == 0.0 && (i == 0 || above != 0.0)) return std::nullopt;
      if (below == 0.0) break;
      value += above / below / unit;
    }
    return value;
  }

 private:
  static constexpr std::uint16_t kAscii = 2, kLong = 4, kRational = 5;

  static std::size_t sizeOf(std::uint16_t type) {
    constexpr std::array<std::size_t, 13> kSizes = {0, 1, 1, 2, 4, 8, 1, 1, 2, 4, 8, 4, 8};
    return type < kSizes.size() ? kSizes[type] : 0;
  }
  bool holds(std::size_t at, std::uint64_t length) const {
    return at <= bytes_.size() && length <= bytes_.size() - at;
  }
  std::uint16_t u16(std::size_t at) const {
    return static_cast<std::uint16_t>(little_ ? bytes_[at] | bytes_[at + 1] << 8U
                                              : bytes_[at] << 8U | bytes_[at + 1]);
  }
  std::uint32_t u32(std::size_t at) const {
    const std::uint32_t a = u16(at);
    const std::uint32_t b = u16(at + 2);
    return little_ ? b << 16U | a : a << 16U | b;
  }

  Bytes bytes_;
  bool little_ = false;
  bool valid_ = false;
};

// Digits alone; nothing otherwise.
std::optional<int> number(std::string_view text) {
  if (text.empty()) return std::nullopt;
  int value = 0;
  for (const char c : text) {
    if (c < '0' || c > '9') return std::nullopt;
    value = value * 10 + (c - '0');
  }
  return value;
}

// "2024:05:31 23:59:59", with the offset "+02:00" or "".
std::optional<Date> dateOf(std::string_view time, std::string_view offset) {
  if (time.size() != 19) return std::nullopt;
  const auto part = [time](std::size_t at, std::size_t length) {
    return number(time.substr(at, length)).value_or(-1);
  };
  const int year = part(0, 4);
  const int month = part(5, 2);
  const int day = part(8, 2);
  const int hour = part(11, 2);
  const int minute = part(14, 2);
  const int second = part(17, 2);
  if (year < 1 || month < 1 || month > 12 || day < 1 || day > daysInMonth(year, month) ||
      hour < 0 || hour > 23 || minute < 0 || minute > 59 || second < 0 || second > 59) {
    return std::nullopt;
  }
  std::int64_t seconds =
      daysFromReference(year, month, day) * kSecondsPerDay + hour * 3600 + minute * 60 + second;
  if (offset.size() == 6 && (offset[0] == '+' || offset[0] == '-')) {
    const auto hours = number(offset.substr(1, 2));
    const auto minutes = number(offset.substr(4, 2));
    if (hours && minutes && *hours <= 14 && *minutes <= 59) {
      const int east = *hours * 3600 + *minutes * 60;
      seconds -= offset[0] == '+' ? east : -east;
    }
  }
  return Date{static_cast<double>(seconds)};
}

std::optional<Coordinate> validPlace(const std::optional<double>& latitude,
                                     const std::optional<double>& longitude) {
  if (!latitude || !longitude || !std::isfinite(*latitude) || !std::isfinite(*longitude)) {
    return std::nullopt;
  }
  if (std::abs(*latitude) > 90.0 || std::abs(*longitude) > 180.0) return std::nullopt;
  if (*latitude == 0.0 && *longitude == 0.0) return std::nullopt;
  return Coordinate{*latitude, *longitude};
}

// With the letter that gives the sign; nothing without it.
std::optional<double> signedDegrees(const Tiff& tiff, std::size_t directory, std::uint16_t tag,
                                    std::string_view letters) {
  const auto value = tiff.degrees(directory, tag);
  const std::string_view letter = tiff.text(directory, static_cast<std::uint16_t>(tag - 1));
  if (!value || letter.empty()) return std::nullopt;
  const std::size_t sign = letters.find(letter.front());
  if (sign == std::string_view::npos) return std::nullopt;
  return sign == 0 ? *value : -*value;
}

constexpr std::uint16_t kExifDirectory = 0x8769, kGpsDirectory = 0x8825, kDateTime = 0x0132,
                        kDateTimeOriginal = 0x9003, kOffsetTime = 0x9010,
                        kOffsetTimeOriginal = 0x9011, kLatitude = 2, kLongitude = 4;

CameraMetadata readTiff(Bytes bytes) {
  CameraMetadata metadata;
  const Tiff tiff(bytes);
  if (!tiff.valid()) return metadata;
  const std::size_t exif = tiff.directoryAt(tiff.first(), kExifDirectory);
  const std::size_t gps = tiff.directoryAt(tiff.first(), kGpsDirectory);
  if (exif != 0) {
    metadata.captured =
        dateOf(tiff.text(exif, kDateTimeOriginal), tiff.text(exif, kOffsetTimeOriginal));
  }
  if (!metadata.captured) {
    metadata.captured = dateOf(tiff.text(tiff.first(), kDateTime),
                               exif != 0 ? tiff.text(exif, kOffsetTime) : std::string_view());
  }
  if (gps != 0) {
    metadata.place = validPlace(signedDegrees(tiff, gps, kLatitude, "NS"),
                                signedDegrees(tiff, gps, kLongitude, "EW"));
  }
  return metadata;
}

bool beginsTiff(std::string_view text) {
  return text.starts_with(std::string_view("II*\0", 4)) ||
         text.starts_with(std::string_view("MM\0*", 4));
}

std::vector<std::uint8_t> bytesAt(int file, std::uint64_t offset, std::size_t length) {
  std::vector<std::uint8_t> bytes(length);
  std::size_t done = 0;
  while (done < length) {
    const ssize_t got =
        ::pread(file, bytes.data() + done, length - done, static_cast<off_t>(offset + done));
    if (got < 0 && errno == EINTR) continue;
    if (got <= 0) break;
    done += static_cast<std::size_t>(got);
  }
  bytes.resize(done);
  return bytes;
}

// The content of the box that begins with the film's structure, cut at a limit; empty without one.
std::vector<std::uint8_t> movieBox(int file, std::uint64_t size) {
  std::uint64_t at = 0;
  for (std::size_t boxes = 0; boxes < kTopBoxes && at < size && size - at >= 8; ++boxes) {
    const std::vector<std::uint8_t> head = bytesAt(file, at, 16);
    if (head.size() < 8) return {};
    std::uint64_t length = bigEndian(head, 0, 4);
    std::uint64_t headBytes = 8;
    if (length == 1) {
      if (head.size() < 16) return {};
      length = bigEndian(head, 8, 8);
      headBytes = 16;
    } else if (length == 0) {
      length = size - at;
    }
    if (length < headBytes || length > size - at) return {};
    if (textOf(head).substr(4, 4) == "moov") {
      return bytesAt(
          file, at + headBytes,
          static_cast<std::size_t>(std::min<std::uint64_t>(length - headBytes, kMovieBytes)));
    }
    at += length;
  }
  return {};
}

std::optional<Date> creationOf(Bytes movie) {
  const std::size_t found = textOf(movie).find("mvhd");
  if (found == std::string_view::npos || movie.size() - found < 16) return std::nullopt;
  const bool wide = movie[found + 4] == 1;
  const std::uint64_t since = bigEndian(movie, found + 8, wide ? 8 : 4);
  // Nothing, or beyond the year 9999: nobody set it.
  if (since == 0 || since > 255'000'000'000ULL) return std::nullopt;
  return Date{static_cast<double>(static_cast<std::int64_t>(since) + kUnixSecondsOfMovieEpoch -
                                  kUnixSecondsOfReferenceDate)};
}

// One number of "+48.1234+011.5678+519.000/".
std::optional<double> signedNumber(std::string_view* text) {
  if (text->empty() || ((*text)[0] != '+' && (*text)[0] != '-')) return std::nullopt;
  const std::size_t end = std::min(text->find_first_not_of("0123456789.", 1), text->size());
  const std::string_view digits = text->substr(1, end - 1);
  const std::size_t dot = digits.find('.');
  const auto whole = number(digits.substr(0, std::min(dot, std::size_t{4})));
  if (!whole) return std::nullopt;
  double value = *whole;
  double unit = 0.1;
  for (std::size_t i = dot == std::string_view::npos ? digits.size() : dot + 1; i < digits.size();
       ++i, unit /= 10.0) {
    if (digits[i] == '.') return std::nullopt;
    value += (digits[i] - '0') * unit;
  }
  const bool negative = (*text)[0] == '-';
  text->remove_prefix(end);
  return negative ? -value : value;
}

std::optional<Coordinate> filmPlaceOf(Bytes movie) {
  constexpr std::string_view kMark = "\xA9xyz";
  const std::size_t found = textOf(movie).find(kMark);
  if (found == std::string_view::npos || movie.size() - found < 9) return std::nullopt;
  std::string_view text = textOf(movie).substr(found + 8);  // after the length and the language
  const auto latitude = signedNumber(&text);
  const auto longitude = signedNumber(&text);
  return validPlace(latitude, longitude);
}

}  // namespace

CameraMetadata readExif(Bytes head) {
  const std::string_view text = textOf(head);
  if (beginsTiff(text)) return readTiff(head);
  constexpr std::string_view kExifMark("Exif\0\0", 6);
  constexpr std::string_view kPngMark = "eXIf";
  for (const std::string_view mark : {kExifMark, kPngMark}) {
    for (std::size_t at = text.find(mark); at != std::string_view::npos;
         at = text.find(mark, at + mark.size())) {
      const std::size_t begin = at + mark.size();
      if (!beginsTiff(text.substr(begin))) continue;
      return readTiff(head.subspan(begin, std::min(kExifBytes, head.size() - begin)));
    }
  }
  return {};
}

CameraMetadata readFilmHeader(int file, std::uint64_t size) {
  const std::vector<std::uint8_t> movie = movieBox(file, size);
  return {creationOf(movie), filmPlaceOf(movie)};
}

}  // namespace kx
