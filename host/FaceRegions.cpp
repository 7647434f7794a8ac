#include "host/FaceRegions.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <map>
#include <optional>
#include <string_view>

#include "host/HostLimits.h"
#include "host/MetadataText.h"

namespace kx {

namespace {

constexpr std::string_view kRegionPrefix = "Regions/mwg-rs:RegionList[";
constexpr std::string_view kDimensionPrefix = "Regions/mwg-rs:AppliedToDimensions/stDim:";

struct Region {
  std::string name;
  std::string type;
  std::string unit;
  std::optional<double> x;
  std::optional<double> y;
  std::optional<double> width;
  std::optional<double> height;
};

struct Regions {
  std::map<std::size_t, Region> byNumber;
  std::optional<double> width;  // of the picture that they were made for
  std::optional<double> height;
};

void setField(Region* region, std::string_view field, const std::string& value) {
  if (field == "mwg-rs:Name") region->name = cleanText(value);
  if (field == "mwg-rs:Type") region->type = value;
  if (field == "mwg-rs:Area/stArea:unit") region->unit = value;
  if (field == "mwg-rs:Area/stArea:x") region->x = finiteNumber(value);
  if (field == "mwg-rs:Area/stArea:y") region->y = finiteNumber(value);
  if (field == "mwg-rs:Area/stArea:w") region->width = finiteNumber(value);
  if (field == "mwg-rs:Area/stArea:h") region->height = finiteNumber(value);
}

Regions collect(const Exiv2::XmpData& xmp) {
  Regions regions;
  for (const Exiv2::Xmpdatum& datum : xmp) {
    if (datum.groupName() != "mwg-rs") continue;
    const std::string key = datum.tagName();
    const std::string_view name = key;
    if (name.starts_with(kDimensionPrefix)) {
      const std::string_view side = name.substr(kDimensionPrefix.size());
      if (side == "w") regions.width = finiteNumber(datum.toString());
      if (side == "h") regions.height = finiteNumber(datum.toString());
    }
    if (!name.starts_with(kRegionPrefix)) continue;
    const std::size_t close = name.find("]/");
    if (close == std::string_view::npos) continue;
    std::size_t number = 0;
    std::from_chars(key.data() + kRegionPrefix.size(), key.data() + close, number);
    if (number == 0 || number > hostlimits::kFacesPerPhoto) continue;
    setField(&regions.byNumber[number], name.substr(close + 2), datum.toString());
  }
  return regions;
}

// Whether the regions were made for the picture turned by a quarter, as it is displayed.
bool areForDisplay(const Regions& regions, const StoredPicture& picture) {
  if (picture.orientation < 5 || !regions.width || !regions.height) return false;
  if (picture.width == 0 || picture.width == picture.height) return false;
  const bool storedIsWide = picture.width > picture.height;
  return storedIsWide ? *regions.width < *regions.height : *regions.width > *regions.height;
}

// The area as a rectangle in shares; nothing when it makes none.
std::optional<Rect> rectOf(const Region& region, const Regions& regions) {
  if (!region.x || !region.y || !region.width || !region.height) return std::nullopt;
  double scaleX = 1.0;
  double scaleY = 1.0;
  if (region.unit == "pixel") {
    if (!regions.width || !regions.height || *regions.width <= 0 || *regions.height <= 0)
      return std::nullopt;
    scaleX = 1.0 / *regions.width;
    scaleY = 1.0 / *regions.height;
  } else if (!region.unit.empty() && region.unit != "normalized") {
    return std::nullopt;
  }
  const double left = std::clamp((*region.x - *region.width / 2) * scaleX, 0.0, 1.0);
  const double top = std::clamp((*region.y - *region.height / 2) * scaleY, 0.0, 1.0);
  const double right = std::clamp((*region.x + *region.width / 2) * scaleX, 0.0, 1.0);
  const double bottom = std::clamp((*region.y + *region.height / 2) * scaleY, 0.0, 1.0);
  if (!(right > left) || !(bottom > top)) return std::nullopt;
  return Rect{left, top, right - left, bottom - top};
}

}  // namespace

std::vector<FaceRegion> faceRegions(const Exiv2::XmpData& xmp, const StoredPicture& picture) {
  const Regions regions = collect(xmp);
  const bool turned = areForDisplay(regions, picture);
  std::vector<FaceRegion> faces;
  for (const auto& [number, region] : regions.byNumber) {
    if (region.type != "Face") continue;
    const std::optional<Rect> rect = rectOf(region, regions);
    if (!rect) continue;
    faces.push_back({region.name, turned ? storedRect(*rect, picture.orientation) : *rect});
  }
  return faces;
}

Rect storedRect(const Rect& displayed, int orientation) {
  const double x = displayed.x;
  const double y = displayed.y;
  const double w = displayed.width;
  const double h = displayed.height;
  switch (orientation) {
    case 2:  // mirrored left to right
      return {1 - x - w, y, w, h};
    case 3:  // upside down
      return {1 - x - w, 1 - y - h, w, h};
    case 4:  // mirrored top to bottom
      return {x, 1 - y - h, w, h};
    case 5:  // mirrored along the falling diagonal
      return {y, x, h, w};
    case 6:  // displayed after a quarter turn to the right
      return {y, 1 - x - w, h, w};
    case 7:  // mirrored along the rising diagonal
      return {1 - y - h, 1 - x - w, h, w};
    case 8:  // displayed after a quarter turn to the left
      return {1 - y - h, x, h, w};
    default:
      return displayed;
  }
}

}  // namespace kx
