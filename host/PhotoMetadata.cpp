#include "host/PhotoMetadata.h"

#include <exiv2/exiv2.hpp>

#include <algorithm>
#include <cmath>
#include <mutex>

#include "host/ImageProperties.h"
#include "host/MetadataBlocks.h"
#include "host/XmpGuard.h"

namespace kx {

namespace {

// All that was decoded of one photo.
struct Decoded {
  Exiv2::ExifData exif;
  Exiv2::IptcData iptc;
  Exiv2::XmpData xmp;   // the file's own
  Exiv2::XmpData side;  // the side file's
  MovieFacts movie;
  StoredPicture picture;
};

// The metadata library writes what it thinks of its input to standard error; the problems tell it.
void muteOnce() {
  static std::once_flag once;
  std::call_once(once, [] { Exiv2::LogMsg::setLevel(Exiv2::LogMsg::mute); });
}

// Packets may declare namespaces, which are known to the whole process: one packet at a time.
bool decodeXmp(std::string_view packet, Exiv2::XmpData* xmp) {
  static std::mutex mutex;
  const std::lock_guard lock(mutex);
  return Exiv2::XmpParser::decode(*xmp, std::string(packet)) == 0;
}

// Takes a packet's content; what is wrong with it otherwise.
std::string takePacket(std::string_view packet, Exiv2::XmpData* xmp) {
  if (packet.starts_with("\xEF\xBB\xBF")) packet.remove_prefix(3);
  if (packet.empty()) return {};
  if (std::string objection = xmpObjection(packet); !objection.empty()) return objection;
  try {
    if (decodeXmp(packet, xmp)) return {};
  } catch (const std::exception&) {
    // Said below, as for a packet that is refused without an exception.
  }
  xmp->clear();
  return "its XMP cannot be read";
}

std::string exifText(const Exiv2::ExifData& exif, const char* key) {
  const auto found = exif.findKey(Exiv2::ExifKey(key));
  return found == exif.end() ? std::string() : cleanText(found->toString());
}

std::string iptcText(const Exiv2::IptcData& iptc, const char* key) {
  const auto found = iptc.findKey(Exiv2::IptcKey(key));
  return found == iptc.end() ? std::string() : cleanText(found->toString());
}

std::string xmpText(const Exiv2::XmpData& xmp, const char* key) {
  const auto found = xmp.findKey(Exiv2::XmpKey(key));
  return found == xmp.end() ? std::string() : xmpValueText(found->value());
}

std::optional<CaptureTime> exifTimeOf(const Exiv2::ExifData& exif, const char* time,
                                      const char* subSeconds, const char* offset) {
  return exifTime(exifText(exif, time), exifText(exif, subSeconds), exifText(exif, offset));
}

std::optional<CaptureTime> xmpTimeOf(const Exiv2::XmpData& xmp) {
  for (const char* key : {"Xmp.exif.DateTimeOriginal", "Xmp.photoshop.DateCreated"}) {
    if (const auto time = isoTime(xmpText(xmp, key))) return time;
  }
  return std::nullopt;
}

// "2024-05-31" and "23:59:59+02:00" in two fields.
std::optional<CaptureTime> iptcTimeOf(const Exiv2::IptcData& iptc) {
  const std::string day = iptcText(iptc, "Iptc.Application2.DateCreated");
  const std::string clock = iptcText(iptc, "Iptc.Application2.TimeCreated");
  return isoTime(clock.empty() ? day : day + "T" + clock);
}

// The moment of exposure, wherever it is stated; then when the picture was made digital; last, and
// only for want of anything better, when it was changed.
std::optional<CaptureTime> captureTimeOf(const Decoded& from, int timezoneOffsetMinutes) {
  if (const auto time = xmpTimeOf(from.side)) return time;
  if (const auto time =
          exifTimeOf(from.exif, "Exif.Photo.DateTimeOriginal", "Exif.Photo.SubSecTimeOriginal",
                     "Exif.Photo.OffsetTimeOriginal"))
    return time;
  if (const auto time = isoTime(from.movie.creationDate)) return time;
  if (const auto time = xmpTimeOf(from.xmp)) return time;
  if (const auto time = iptcTimeOf(from.iptc)) return time;
  if (const auto time =
          exifTimeOf(from.exif, "Exif.Photo.DateTimeDigitized", "Exif.Photo.SubSecTimeDigitized",
                     "Exif.Photo.OffsetTimeDigitized"))
    return time;
  if (const auto time = isoTime(xmpText(from.xmp, "Xmp.xmp.CreateDate"))) return time;
  if (from.movie.createdUtc) return wallTimeOf(*from.movie.createdUtc, timezoneOffsetMinutes);
  return exifTimeOf(from.exif, "Exif.Image.DateTime", "Exif.Photo.SubSecTime",
                    "Exif.Photo.OffsetTime");
}

// Degrees, minutes and seconds, and the letter that gives the sign; without it there is no place.
std::optional<double> exifDegrees(const Exiv2::ExifData& exif, const char* key, const char* refKey,
                                  std::string_view letters) {
  const auto found = exif.findKey(Exiv2::ExifKey(key));
  const std::string reference = exifText(exif, refKey);
  if (found == exif.end() || reference.empty()) return std::nullopt;
  const std::size_t sign = letters.find(reference.front());
  if (sign == std::string_view::npos) return std::nullopt;
  double degrees = 0.0;
  double unit = 1.0;
  for (long i = 0; i < std::min(found->count(), 3L); ++i, unit *= 60.0) {
    const Exiv2::Rational part = found->toRational(i);
    // Nothing over nothing stands for a part that is not known.
    if (part.second == 0 && (i == 0 || part.first != 0)) return std::nullopt;
    if (part.second == 0) break;
    degrees += static_cast<double>(part.first) / static_cast<double>(part.second) / unit;
  }
  if (found->count() < 1 || degrees < 0) return std::nullopt;
  return sign == 0 ? degrees : -degrees;
}

std::optional<Place> xmpPlaceOf(const Exiv2::XmpData& xmp) {
  return validPlace(xmpDegrees(xmpText(xmp, "Xmp.exif.GPSLatitude")),
                    xmpDegrees(xmpText(xmp, "Xmp.exif.GPSLongitude")));
}

std::optional<Place> placeOf(const Decoded& from) {
  if (const auto place = xmpPlaceOf(from.side)) return place;
  const auto latitude =
      exifDegrees(from.exif, "Exif.GPSInfo.GPSLatitude", "Exif.GPSInfo.GPSLatitudeRef", "NS");
  const auto longitude =
      exifDegrees(from.exif, "Exif.GPSInfo.GPSLongitude", "Exif.GPSInfo.GPSLongitudeRef", "EW");
  if (const auto place = validPlace(latitude, longitude)) return place;
  if (const auto place = xmpPlaceOf(from.xmp)) return place;
  return iso6709(from.movie.location);
}

std::optional<int> ratingOf(const Decoded& from) {
  for (const std::string& text :
       {xmpText(from.side, "Xmp.xmp.Rating"), xmpText(from.xmp, "Xmp.xmp.Rating"),
        exifText(from.exif, "Exif.Image.Rating")}) {
    const std::optional<double> number = finiteNumber(text);
    if (number && *number >= -1.0 && *number <= 5.0) return static_cast<int>(std::lround(*number));
  }
  return std::nullopt;
}

// What cameras write into every picture's description says nothing about the picture.
bool isCameraDefault(std::string_view description) {
  // "OLYMPUS DIGITAL CAMERA" and its like, from many makers.
  return description.ends_with("DIGITAL CAMERA") || description == "SONY DSC" ||
         description == "Exif_JPEG_PICTURE" || description.starts_with("<Digimax");
}

std::string captionOf(const Decoded& from) {
  for (const std::string& text :
       {xmpText(from.side, "Xmp.dc.description"), xmpText(from.xmp, "Xmp.dc.description"),
        iptcText(from.iptc, "Iptc.Application2.Caption"),
        exifText(from.exif, "Exif.Image.ImageDescription"), cleanText(from.movie.description)}) {
    if (!text.empty() && !isCameraDefault(text)) return text;
  }
  return {};
}

bool hasRegions(const Exiv2::XmpData& xmp) {
  return xmp.findKey(Exiv2::XmpKey("Xmp.mwg-rs.Regions")) != xmp.end();
}

int orientationOf(const Exiv2::ExifData& exif) {
  const auto found = exif.findKey(Exiv2::ExifKey("Exif.Image.Orientation"));
  if (found == exif.end() || found->count() < 1) return 1;
  const long orientation = found->toLong();
  return orientation >= 1 && orientation <= 8 ? static_cast<int>(orientation) : 1;
}

void decodeBlocks(const MetadataBlocks& blocks, Decoded* decoded,
                  std::vector<std::string>* problems) {
  const auto note = [problems](const std::string& text) {
    if (!text.empty()) problems->push_back(text);
  };
  note(blocks.damage);
  try {
    if (!blocks.exif.empty())
      Exiv2::ExifParser::decode(decoded->exif, blocks.exif.data(),
                                static_cast<std::uint32_t>(blocks.exif.size()));
  } catch (const std::exception&) {
    decoded->exif.clear();
    note("its Exif block cannot be read");
  }
  try {
    if (!blocks.iptc.empty() &&
        Exiv2::IptcParser::decode(decoded->iptc, blocks.iptc.data(),
                                  static_cast<std::uint32_t>(blocks.iptc.size())) != 0)
      note("its IPTC block cannot be read");
  } catch (const std::exception&) {
    decoded->iptc.clear();
    note("its IPTC block cannot be read");
  }
  note(takePacket(blocks.xmp, &decoded->xmp));
  decoded->movie = blocks.movie;
  decoded->picture = {blocks.width, blocks.height, orientationOf(decoded->exif)};
}

void fill(const Decoded& from, const MetadataRequest& request, PhotoMetadata* metadata) {
  metadata->captureTime = captureTimeOf(from, request.timezoneOffsetMinutes);
  metadata->place = placeOf(from);
  metadata->rating = ratingOf(from);
  metadata->caption = captionOf(from);
  metadata->faces = faceRegions(hasRegions(from.side) ? from.side : from.xmp, from.picture);
}

}  // namespace

PhotoMetadata readPhotoMetadata(const ByteSource& source, const MetadataRequest& request) {
  muteOnce();
  PhotoMetadata metadata;
  Decoded decoded;
  try {
    decodeBlocks(readMetadataBlocks(source, request.type.container), &decoded, &metadata.problems);
  } catch (const MetadataError& error) {
    metadata.problems.emplace_back(error.what());
  }
  if (request.sideFile) {
    const std::string problem = takePacket(*request.sideFile, &decoded.side);
    if (!problem.empty()) metadata.problems.push_back("its side file: " + problem);
  }
  try {
    fill(decoded, request, &metadata);
    // Where both have a key, the side file's stands last and counts.
    for (const Exiv2::Xmpdatum& datum : decoded.side) decoded.xmp.add(datum);
    metadata.imageProperties =
        imageProperties(decoded.exif, decoded.iptc, decoded.xmp, request.type.mime);
  } catch (const std::exception& error) {
    // The metadata library throws at values that are not what their tag says.
    PhotoMetadata empty;
    empty.problems = std::move(metadata.problems);
    empty.problems.push_back(std::string("its metadata makes no sense: ") + error.what());
    empty.imageProperties = imageProperties({}, {}, {}, request.type.mime);
    return empty;
  }
  return metadata;
}

}  // namespace kx
