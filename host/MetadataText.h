#pragma once

#include <optional>
#include <string>
#include <string_view>

// Texts and numbers as they stand in metadata, made fit for a snapshot. Any thread.
namespace kx {

// Up to the first NUL, without blanks around it, in UTF-8 (text that is not is taken as Latin-1),
// cut at a character within hostlimits::kTextBytes.
std::string cleanText(std::string_view raw);

// A decimal number; a fraction "a/b" too. Nothing for other text, and for what is not finite.
std::optional<double> finiteNumber(std::string_view text);

// XMP's form of a latitude or longitude, "46,34.65N" or "46,34,39N", in degrees.
std::optional<double> xmpDegrees(std::string_view text);

// ISO 6709, "+46.5775+007.9856+1200.000/": latitude and longitude in degrees.
struct Place {
  double latitude = 0.0;
  double longitude = 0.0;
};
std::optional<Place> iso6709(std::string_view text);

// Both, finite and on the globe.
std::optional<Place> validPlace(std::optional<double> latitude, std::optional<double> longitude);

// A name from the host's file system as valid UTF-8: bytes that are not are written as \xNN.
std::string nameText(std::string_view raw);

}  // namespace kx
