#pragma once

#include <exiv2/exiv2.hpp>

#include <cstdint>
#include <string>
#include <vector>

#include "platform/foundation/Rect.h"

namespace kx {

// The picture as it is stored: before its orientation turns it for display.
struct StoredPicture {
  std::uint32_t width = 0;  // pixels; 0 when unknown
  std::uint32_t height = 0;
  int orientation = 1;  // Exif's, 1 to 8
};

// A face: whose ("" for nobody's), and where, in shares of the stored picture's width and height
// from its top left corner.
struct FaceRegion {
  std::string name;
  Rect rect;
};

// The faces among the regions of the Metadata Working Group's form, in their order. Regions state
// the centre and size of an area of the stored picture. Some programs state them for the displayed
// one; that shows where the dimensions that the regions were made for are the stored ones swapped,
// and then the areas are turned back. Areas are cut at the picture's edge; empty ones, ones that
// are not finite, and those beyond hostlimits::kFacesPerPhoto are left out.
std::vector<FaceRegion> faceRegions(const Exiv2::XmpData& xmp, const StoredPicture& picture);

// A rectangle of the displayed picture, in the stored one.
Rect storedRect(const Rect& displayed, int orientation);

}  // namespace kx
