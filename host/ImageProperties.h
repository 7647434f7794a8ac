#pragma once

#include <exiv2/exiv2.hpp>

#include <string>
#include <string_view>

#include "platform/foundation/Value.h"

namespace kx {

// The image properties of a photo: flat dictionaries "Exif", "Iptc", "Xmp" and "GPS" (those that
// have something) and "MQFileUTType". Only what describes the picture is carried, and no value
// beyond kPropertyBytes: a snapshot of 100,000 photos has to stay small. Numbers stand as numbers,
// everything else as the metadata library prints it.
Value imageProperties(const Exiv2::ExifData& exif, const Exiv2::IptcData& iptc,
                      const Exiv2::XmpData& xmp, std::string_view mimeType);

inline constexpr std::size_t kPropertyBytes = 1024;

// An XMP value as plain text: the default language of a text in several, else the first of them.
std::string xmpValueText(const Exiv2::Value& value);

}  // namespace kx
