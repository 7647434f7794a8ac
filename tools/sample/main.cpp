// make-sample-library FOLDER: writes a small library of drawn photos into a new folder, with the
// dates, places, captions, ratings and faces that photos of a phone and a photo program carry.
#include <exiv2/exiv2.hpp>

#include <chrono>
#include <cmath>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "tools/sample/Picture.h"

namespace {

struct Face {
  std::string name;
  double x;  // centre, in shares of the width and height
  double y;
  double width;
};

struct Moment {
  std::string taken;    // EXIF's form, wall-clock time
  double latitude = 0;  // degrees; 0 and 0: no place
  double longitude = 0;
};

// What is drawn, and what a person has added to it.
struct Scene {
  kx::Colour sky;
  kx::Colour ground;
  std::string caption;
  int rating = 0;
  std::vector<Face> faces;
};

struct Photo {
  std::string path;
  std::string offset;  // of the time taken, from UTC; empty when the camera did not say
  Moment moment;
  Scene scene;
};

const kx::Colour kWhite{245, 245, 250};

const kx::Colour kGreen{70, 140, 60};
const kx::Colour kSand{220, 200, 140};
const kx::Colour kTable{150, 90, 60};
const Face kAda{"Ada", 0.35, 0.55, 0.22};
const Face kGrace{"Grace", 0.68, 0.52, 0.20};

void AddMountains(std::vector<Photo>& photos) {
  const auto add = [&](const std::string& name, const Moment& moment, const Scene& scene) {
    photos.push_back(Photo{"Mountains/" + name, "+02:00", moment, scene});
  };
  add("IMG_0001.jpg", {"2023:06:10 08:15:00", 46.5775, 7.9856},
      {{90, 150, 230}, kGreen, "The first peak", 5, {}});
  add("IMG_0002.jpg", {"2023:06:10 09:40:12", 46.5801, 7.9902},
      {{60, 120, 220}, {120, 120, 125}, "", 0, {kAda}});
  add("IMG_0003.jpg", {"2023:06:10 13:05:48", 46.5839, 8.0011},
      {{130, 180, 240}, kWhite, "Snow in June", 4, {kAda, kGrace}});
  add("IMG_0004.jpg", {"2023:06:11 17:30:00", 46.5702, 7.9790},
      {{240, 160, 90}, {60, 70, 90}, "", 0, {}});
}

void AddSeaside(std::vector<Photo>& photos) {
  const auto add = [&](const std::string& name, const Moment& moment, const Scene& scene) {
    photos.push_back(Photo{"Seaside/" + name, "+01:00", moment, scene});
  };
  add("DSC00101.jpg", {"2023:08:02 10:00:00", 50.2660, -5.0527},
      {{110, 190, 250}, kSand, "Low tide", 0, {kGrace}});
  add("DSC00102.jpg", {"2023:08:02 11:20:31", 50.2671, -5.0533},
      {{80, 170, 240}, {30, 110, 170}, "", 3, {}});
  add("DSC00103.jpg", {"2023:08:02 15:45:09", 50.2659, -5.0519},
      {{150, 210, 250}, kSand, "", 0, {kAda, kGrace}});
  add("DSC00104.jpg", {"2023:08:03 20:58:00", 50.2690, -5.0498},
      {{250, 120, 80}, {40, 50, 110}, "Sunset", 5, {}});
}

// A camera that knows neither place nor time zone.
void AddBirthday(std::vector<Photo>& photos) {
  const auto add = [&](const std::string& name, const std::string& taken, const Scene& scene) {
    photos.push_back(Photo{"Birthday/" + name, "", Moment{taken}, scene});
  };
  add("party-1.jpg", "2023:12:16 15:00:00", {{250, 210, 220}, kTable, "", 0, {kGrace}});
  add("party-2.jpg", "2023:12:16 15:10:42", {{250, 230, 180}, kTable, "The cake", 4, {}});
  add("party-3.jpg", "2023:12:16 15:42:07", {{220, 210, 250}, kTable, "", 0, {kAda}});
  add("party-4.jpg", "2023:12:16 16:30:55",
      {{210, 240, 220}, {140, 80, 50}, "Everybody", 5, {kAda, kGrace}});
}

std::vector<Photo> SamplePhotos() {
  std::vector<Photo> photos;
  AddMountains(photos);
  AddSeaside(photos);
  AddBirthday(photos);
  return photos;
}

kx::Picture Draw(const Photo& photo) {
  kx::Picture picture(320, 240);
  picture.FillGradient(photo.scene.sky, kWhite);
  picture.FillHills(0.6, 1.5, photo.scene.ground);
  for (const Face& face : photo.scene.faces) {
    picture.DrawFace(face.x, face.y, face.width,
                     face.name == "Ada" ? kx::Colour{235, 190, 160} : kx::Colour{170, 120, 90});
  }
  return picture;
}

// Degrees, minutes and hundredths of seconds as EXIF's three fractions.
std::string Degrees(double value) {
  const long hundredths = std::lround(std::abs(value) * 360000);
  return std::to_string(hundredths / 360000) + "/1 " + std::to_string(hundredths / 6000 % 60) +
         "/1 " + std::to_string(hundredths % 6000) + "/100";
}

void AddExif(const Photo& photo, Exiv2::ExifData& exif) {
  exif["Exif.Image.Make"] = "Sample";
  exif["Exif.Image.Model"] = "Drawn by kxsync";
  exif["Exif.Image.DateTime"] = photo.moment.taken;
  exif["Exif.Photo.DateTimeOriginal"] = photo.moment.taken;
  exif["Exif.Image.Orientation"] = std::uint16_t{1};
  if (!photo.offset.empty()) exif["Exif.Photo.OffsetTimeOriginal"] = photo.offset;
  if (photo.moment.latitude == 0 && photo.moment.longitude == 0) return;
  exif["Exif.GPSInfo.GPSVersionID"] = "2 3 0 0";
  exif["Exif.GPSInfo.GPSLatitudeRef"] = photo.moment.latitude < 0 ? "S" : "N";
  exif["Exif.GPSInfo.GPSLatitude"] = Degrees(photo.moment.latitude);
  exif["Exif.GPSInfo.GPSLongitudeRef"] = photo.moment.longitude < 0 ? "W" : "E";
  exif["Exif.GPSInfo.GPSLongitude"] = Degrees(photo.moment.longitude);
}

void AddStructure(Exiv2::XmpData& xmp, const std::string& key, bool isBag) {
  Exiv2::XmpTextValue value("");
  if (isBag) {
    value.setXmpArrayType(Exiv2::XmpValue::xaBag);
  } else {
    value.setXmpStruct();
  }
  xmp.add(Exiv2::XmpKey(key), &value);
}

// Faces as regions of the Metadata Working Group's form: centres and sizes in shares.
void AddFaces(const Photo& photo, const kx::Picture& picture, Exiv2::XmpData& xmp) {
  if (photo.scene.faces.empty()) return;
  const std::string regions = "Xmp.mwg-rs.Regions";
  AddStructure(xmp, regions, false);
  const std::string dimensions = regions + "/mwg-rs:AppliedToDimensions";
  AddStructure(xmp, dimensions, false);
  xmp[dimensions + "/stDim:w"] = std::to_string(picture.width());
  xmp[dimensions + "/stDim:h"] = std::to_string(picture.height());
  xmp[dimensions + "/stDim:unit"] = "pixel";
  AddStructure(xmp, regions + "/mwg-rs:RegionList", true);
  int index = 0;
  for (const Face& face : photo.scene.faces) {
    const std::string region = regions + "/mwg-rs:RegionList[" + std::to_string(++index) + "]";
    AddStructure(xmp, region, false);
    xmp[region + "/mwg-rs:Name"] = face.name;
    xmp[region + "/mwg-rs:Type"] = "Face";
    AddStructure(xmp, region + "/mwg-rs:Area", false);
    const double height = face.width * picture.width() / picture.height();
    xmp[region + "/mwg-rs:Area/stArea:x"] = std::to_string(face.x);
    xmp[region + "/mwg-rs:Area/stArea:y"] = std::to_string(face.y);
    xmp[region + "/mwg-rs:Area/stArea:w"] = std::to_string(face.width);
    xmp[region + "/mwg-rs:Area/stArea:h"] = std::to_string(height);
    xmp[region + "/mwg-rs:Area/stArea:unit"] = "normalized";
  }
}

void Write(const std::filesystem::path& folder, const Photo& photo) {
  const std::filesystem::path path = folder / photo.path;
  std::filesystem::create_directories(path.parent_path());
  const kx::Picture picture = Draw(photo);
  const std::string bytes = kx::EncodeJpeg(picture, 85);
  std::ofstream stream(path, std::ios::binary);
  stream.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
  stream.close();
  if (!stream) throw std::runtime_error("cannot write " + path.string());

  const auto image = Exiv2::ImageFactory::open(path.string());
  image->readMetadata();
  AddExif(photo, image->exifData());
  AddFaces(photo, picture, image->xmpData());
  if (!photo.scene.caption.empty()) image->xmpData()["Xmp.dc.description"] = photo.scene.caption;
  if (photo.scene.rating > 0)
    image->xmpData()["Xmp.xmp.Rating"] = std::to_string(photo.scene.rating);
  image->writeMetadata();
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fputs("usage: make-sample-library FOLDER\n", stderr);
    return 2;
  }
  try {
    Exiv2::XmpParser::initialize();
    for (const Photo& photo : SamplePhotos()) Write(argv[1], photo);
    Exiv2::XmpParser::terminate();
  } catch (const std::exception& error) {
    std::fprintf(stderr, "make-sample-library: %s\n", error.what());
    return 1;
  }
  return 0;
}
