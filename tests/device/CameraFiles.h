#pragma once

#include <cmath>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace kx {

// What a test's photo says of itself.
struct CameraTags {
  std::string time;    // "2020:01:02 03:04:05"; "": none
  std::string offset;  // "+02:00"; "": none
  std::optional<double> latitude, longitude;
};

// Builds a TIFF structure: a directory, and below it one for the time and one for the place.
class CameraTiff {
 public:
  CameraTiff(const CameraTags& tags, bool little) : little_(little) {
    bytes_ = little ? std::string("II*\0", 4) : std::string("MM\0*", 4);
    put32(8);
    const std::uint32_t exifAt = 8 + 2 + 2 * 12 + 4;
    const std::uint32_t exifEntries = (tags.time.empty() ? 0U : 1U) + (tags.offset.empty() ? 0 : 1);
    const std::uint32_t gpsAt = exifAt + 2 + exifEntries * 12 + 4;
    const std::uint32_t gpsEntries = tags.latitude ? 4 : 0;
    valuesAt_ = gpsAt + 2 + gpsEntries * 12 + 4;
    put16(2);
    entry(0x8769, 4, 1, exifAt);
    entry(0x8825, 4, 1, gpsAt);
    put32(0);
    put16(exifEntries);
    if (!tags.time.empty()) text(0x9003, tags.time);
    if (!tags.offset.empty()) text(0x9011, tags.offset);
    put32(0);
    put16(gpsEntries);
    if (tags.latitude) {
      letter(1, *tags.latitude < 0 ? 'S' : 'N');
      degrees(2, std::abs(*tags.latitude));
      letter(3, *tags.longitude < 0 ? 'W' : 'E');
      degrees(4, std::abs(*tags.longitude));
    }
    put32(0);
    bytes_ += values_;
  }
  const std::string& bytes() const { return bytes_; }

 private:
  void put(std::string& into, std::uint32_t value, int size) const {
    for (int i = 0; i < size; ++i) {
      const int shift = 8 * (little_ ? i : size - 1 - i);
      into += static_cast<char>(value >> shift & 0xffU);
    }
  }
  void put16(std::uint32_t value) { put(bytes_, value, 2); }
  void put32(std::uint32_t value) { put(bytes_, value, 4); }
  void head(std::uint32_t tag, std::uint32_t type, std::uint32_t count) {
    put16(tag);
    put16(type);
    put32(count);
  }
  void entry(std::uint32_t tag, std::uint32_t type, std::uint32_t count, std::uint32_t value) {
    head(tag, type, count);
    put32(value);
  }
  std::uint32_t nextValue() const { return valuesAt_ + static_cast<std::uint32_t>(values_.size()); }
  void text(std::uint32_t tag, const std::string& value) {
    entry(tag, 2, static_cast<std::uint32_t>(value.size() + 1), nextValue());
    values_ += value + '\0';
    if (values_.size() % 2 != 0) values_ += '\0';
  }
  void letter(std::uint32_t tag, char value) {
    head(tag, 2, 2);
    bytes_ += value;
    bytes_ += std::string(3, '\0');
  }
  // Degrees in hundredths, whole minutes and seconds left out.
  void degrees(std::uint32_t tag, double value) {
    entry(tag, 5, 3, nextValue());
    put(values_, static_cast<std::uint32_t>(std::lround(value * 100.0)), 4);
    put(values_, 100, 4);
    for (int i = 0; i < 2; ++i) {
      put(values_, 0, 4);
      put(values_, 1, 4);
    }
  }

  bool little_;
  std::uint32_t valuesAt_ = 0;
  std::string bytes_;
  std::string values_;
};

inline std::string cameraTiff(const CameraTags& tags, bool little) {
  return CameraTiff(tags, little).bytes();
}

inline std::string cameraJpeg(const std::string& tiff) {
  const std::size_t length = tiff.size() + 8;
  std::string bytes = "\xFF\xD8\xFF\xE1";
  bytes += static_cast<char>(length >> 8U);
  bytes += static_cast<char>(length & 0xffU);
  return bytes + std::string("Exif\0\0", 6) + tiff + "\xFF\xD9";
}

inline std::string cameraBox(const std::string& type, const std::string& content) {
  const auto length = static_cast<std::uint32_t>(content.size() + 8);
  std::string bytes;
  for (int shift = 24; shift >= 0; shift -= 8) bytes += static_cast<char>(length >> shift & 0xffU);
  return bytes + type + content;
}

// A film that was made `created` seconds after 1904-01-01 at a place as ISO 6709 writes it.
inline std::string cameraFilm(std::uint32_t created, const std::string& place) {
  std::string header(4, '\0');
  for (int shift = 24; shift >= 0; shift -= 8) header += static_cast<char>(created >> shift & 0xff);
  header += std::string(92, '\0');
  const std::string text =
      std::string("\0", 1) + static_cast<char>(place.size()) + std::string("\x15\xc7", 2) + place;
  return cameraBox("ftyp", std::string("qt  \0\0\0\0", 8)) +
         cameraBox("mdat", std::string(500, 'f')) +
         cameraBox("moov",
                   cameraBox("mvhd", header) + cameraBox("udta", cameraBox("\xA9xyz", text)));
}

}  // namespace kx
