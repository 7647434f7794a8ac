#include "host/ImageProperties.h"

#include <algorithm>
#include <array>
#include <cmath>

#include "host/MetadataText.h"

namespace kx {

namespace {

using namespace std::string_view_literals;

constexpr std::array kIptcKeys{"Iptc.Application2.ObjectName"sv,  "Iptc.Application2.Keywords"sv,
                               "Iptc.Application2.Byline"sv,      "Iptc.Application2.City"sv,
                               "Iptc.Application2.CountryName"sv, "Iptc.Application2.Copyright"sv,
                               "Iptc.Application2.Caption"sv};

constexpr std::array kXmpKeys{
    "Xmp.dc.title"sv,       "Xmp.dc.description"sv,   "Xmp.dc.subject"sv, "Xmp.dc.creator"sv,
    "Xmp.dc.rights"sv,      "Xmp.xmp.Rating"sv,       "Xmp.xmp.Label"sv,  "Xmp.xmp.CreatorTool"sv,
    "Xmp.photoshop.City"sv, "Xmp.photoshop.Country"sv};

template <typename Keys>
bool contains(const Keys& keys, std::string_view key) {
  return std::find(keys.begin(), keys.end(), key) != keys.end();
}

bool isPointer(const std::string& key) {
  return key == "Exif.Image.ExifTag" || key == "Exif.Image.GPSTag";
}

// Null for what is empty or too long.
Value textValue(const std::string& raw) {
  if (raw.size() > kPropertyBytes) return Value();
  const std::string text = cleanText(raw);
  return text.empty() ? Value() : Value::string(text);
}

Value exifValue(const Exiv2::Exifdatum& datum, const Exiv2::ExifData& exif) {
  if (datum.typeId() == Exiv2::asciiString) return textValue(datum.toString());
  if (datum.count() != 1) return textValue(datum.print(&exif));
  switch (datum.typeId()) {
    case Exiv2::unsignedByte:
    case Exiv2::unsignedShort:
    case Exiv2::unsignedLong:
    case Exiv2::signedByte:
    case Exiv2::signedShort:
    case Exiv2::signedLong:
      return Value::integer(datum.toLong());
    case Exiv2::unsignedRational:
    case Exiv2::signedRational:
    case Exiv2::tiffFloat:
    case Exiv2::tiffDouble: {
      const std::optional<double> number = finiteNumber(datum.toString());
      return number ? Value::real(*number) : Value();
    }
    default:
      return textValue(datum.print(&exif));
  }
}

void addExif(const Exiv2::ExifData& exif, Dictionary* root) {
  Dictionary picture;
  Dictionary place;
  for (const Exiv2::Exifdatum& datum : exif) {
    const std::string key = datum.key();
    if (isPointer(key) || datum.count() < 1) continue;
    Dictionary& family = datum.groupName() == "GPSInfo" ? place : picture;
    family.setIfPresent(key, exifValue(datum, exif));
  }
  if (!picture.empty()) root->set("Exif", Value::dictionary(std::move(picture)));
  if (!place.empty()) root->set("GPS", Value::dictionary(std::move(place)));
}

// A key may stand several times, once for each of its values.
void addIptc(const Exiv2::IptcData& iptc, Dictionary* root) {
  Dictionary family;
  for (const Exiv2::Iptcdatum& datum : iptc) {
    const std::string key = datum.key();
    if (!contains(kIptcKeys, key)) continue;
    const Value known = family.find(key);
    const std::string before = known.isNull() ? "" : std::string(known.stringValue()) + ", ";
    const Value value = textValue(before + cleanText(datum.toString()));
    family.setIfPresent(key, value);
  }
  if (!family.empty()) root->set("Iptc", Value::dictionary(std::move(family)));
}

void addXmp(const Exiv2::XmpData& xmp, Dictionary* root) {
  Dictionary family;
  for (const Exiv2::Xmpdatum& datum : xmp) {
    const std::string key = datum.key();
    if (!contains(kXmpKeys, key)) continue;
    const std::string text = xmpValueText(datum.value());
    const std::optional<double> number =
        key == "Xmp.xmp.Rating" ? finiteNumber(text) : std::optional<double>();
    family.setIfPresent(key, number ? Value::real(*number) : textValue(text));
  }
  if (!family.empty()) root->set("Xmp", Value::dictionary(std::move(family)));
}

}  // namespace

Value imageProperties(const Exiv2::ExifData& exif, const Exiv2::IptcData& iptc,
                      const Exiv2::XmpData& xmp, std::string_view mimeType) {
  Dictionary root;
  addExif(exif, &root);
  addIptc(iptc, &root);
  addXmp(xmp, &root);
  root.set("MQFileUTType", Value::string(mimeType));
  return Value::dictionary(std::move(root));
}

std::string xmpValueText(const Exiv2::Value& value) {
  const auto* languages = dynamic_cast<const Exiv2::LangAltValue*>(&value);
  if (languages == nullptr) return cleanText(value.toString());
  const auto found = languages->value_.find("x-default");
  if (found != languages->value_.end()) return cleanText(found->second);
  return languages->value_.empty() ? std::string() : cleanText(languages->value_.begin()->second);
}

}  // namespace kx
