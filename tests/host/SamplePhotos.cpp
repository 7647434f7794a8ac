#include "tests/host/SamplePhotos.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include "platform/foundation/PropertyList.h"

namespace kx::test {

namespace {

constexpr std::int64_t kUsualTime = 1'704'164'645;  // 2024-01-02 03:04:05 UTC

void addStructure(Exiv2::XmpData* xmp, const std::string& key, bool isBag) {
  Exiv2::XmpTextValue value("");
  if (isBag) {
    value.setXmpArrayType(Exiv2::XmpValue::xaBag);
  } else {
    value.setXmpStruct();
  }
  xmp->add(Exiv2::XmpKey(key), &value);
}

}  // namespace

TemporaryFolder::TemporaryFolder() {
  std::string pattern = ::testing::TempDir() + "kxhostXXXXXX";
  if (::mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no temporary folder");
  path_ = std::filesystem::canonical(pattern).string();
}

TemporaryFolder::~TemporaryFolder() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

void TemporaryFolder::write(std::string_view name, std::string_view bytes) const {
  std::filesystem::create_directories(std::filesystem::path(at(name)).parent_path());
  std::ofstream stream(at(name), std::ios::binary | std::ios::trunc);
  stream.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
  stream.close();
  if (!stream) throw std::runtime_error("cannot write " + at(name));
  setTime(name, kUsualTime, 0);
}

void TemporaryFolder::makeFolder(std::string_view name) const {
  std::filesystem::create_directories(at(name));
}

void TemporaryFolder::remove(std::string_view name) const { std::filesystem::remove_all(at(name)); }

void TemporaryFolder::setTime(std::string_view name, std::int64_t seconds,
                              std::int32_t nanoseconds) const {
  const std::array<timespec, 2> times{timespec{0, UTIME_OMIT}, timespec{seconds, nanoseconds}};
  if (::utimensat(AT_FDCWD, at(name).c_str(), times.data(), 0) != 0)
    throw std::runtime_error("cannot set the time of " + at(name));
}

AsOrdinaryUser::AsOrdinaryUser(const TemporaryFolder& folder) : wasRoot_(::geteuid() == 0) {
  if (!wasRoot_) return;
  constexpr unsigned kNobody = 65'534;
  const auto give = [](const std::string& path) {
    if (::lchown(path.c_str(), kNobody, kNobody) != 0) throw std::runtime_error("cannot chown");
  };
  give(folder.path());
  for (const auto& entry : std::filesystem::recursive_directory_iterator(folder.path()))
    give(entry.path().string());
  if (::seteuid(kNobody) != 0) throw std::runtime_error("cannot become an ordinary user");
}

AsOrdinaryUser::~AsOrdinaryUser() {
  if (wasRoot_ && ::seteuid(0) != 0) std::abort();
}

std::string readFile(const std::string& path) {
  std::ifstream stream(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(stream), std::istreambuf_iterator<char>()};
}

std::string jpeg(int width, int height, std::string_view filling) {
  const auto byte = [](int value) { return static_cast<char>(value & 0xFF); };
  std::string bytes("\xFF\xD8\xFF\xE0\x00\x10JFIF\x00\x01\x01\x00\x00\x01\x00\x01\x00\x00", 20);
  bytes += std::string("\xFF\xC0\x00\x0B\x08", 5);
  bytes += {byte(height >> 8), byte(height), byte(width >> 8), byte(width)};
  bytes += std::string("\x01\x01\x11\x00", 4);
  bytes += std::string("\xFF\xDA\x00\x08\x01\x01\x00\x00\x3F\x00", 10);
  bytes += filling;
  return bytes + "\xFF\xD9";
}

std::string withMetadata(const std::string& photo, const MetadataEdit& edit) {
  const auto image = Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(photo.data()),
                                               static_cast<long>(photo.size()));
  image->readMetadata();
  edit(*image);
  image->writeMetadata();
  Exiv2::BasicIo& io = image->io();
  io.seek(0, Exiv2::BasicIo::beg);
  const Exiv2::DataBuf buffer = io.read(static_cast<long>(io.size()));
  return std::string(reinterpret_cast<const char*>(buffer.pData_),
                     static_cast<std::size_t>(buffer.size_));
}

std::string photoTaken(const std::string& exifTime, std::string_view filling) {
  return withMetadata(jpeg(64, 48, filling), [&](Exiv2::Image& image) {
    image.exifData()["Exif.Photo.DateTimeOriginal"] = exifTime;
  });
}

void addRegions(const SampleRegions& sample, Exiv2::XmpData* xmp) {
  const auto addText = [xmp](const std::string& key, const std::string& text) {
    const Exiv2::XmpTextValue value(text);
    xmp->add(Exiv2::XmpKey(key), &value);
  };
  const std::string root = "Xmp.mwg-rs.Regions";
  addStructure(xmp, root, false);
  const std::string dimensions = root + "/mwg-rs:AppliedToDimensions";
  addStructure(xmp, dimensions, false);
  addText(dimensions + "/stDim:w", std::to_string(sample.width));
  addText(dimensions + "/stDim:h", std::to_string(sample.height));
  addText(dimensions + "/stDim:unit", "pixel");
  addStructure(xmp, root + "/mwg-rs:RegionList", true);
  int number = 0;
  for (const SampleRegion& region : sample.regions) {
    const std::string key = root + "/mwg-rs:RegionList[" + std::to_string(++number) + "]";
    addStructure(xmp, key, false);
    if (!region.name.empty()) addText(key + "/mwg-rs:Name", region.name);
    addText(key + "/mwg-rs:Type", region.type);
    addStructure(xmp, key + "/mwg-rs:Area", false);
    addText(key + "/mwg-rs:Area/stArea:x", std::to_string(region.x));
    addText(key + "/mwg-rs:Area/stArea:y", std::to_string(region.y));
    addText(key + "/mwg-rs:Area/stArea:w", std::to_string(region.width));
    addText(key + "/mwg-rs:Area/stArea:h", std::to_string(region.height));
    addText(key + "/mwg-rs:Area/stArea:unit", sample.unit);
  }
}

std::string xmpPacket(std::string_view attributes, std::string_view elements) {
  return "<x:xmpmeta xmlns:x=\"adobe:ns:meta/\">"
         "<rdf:RDF xmlns:rdf=\"http://www.w3.org/1999/02/22-rdf-syntax-ns#\">"
         "<rdf:Description rdf:about=\"\" xmlns:xmp=\"http://ns.adobe.com/xap/1.0/\""
         " xmlns:exif=\"http://ns.adobe.com/exif/1.0/\""
         " xmlns:dc=\"http://purl.org/dc/elements/1.1/\" " +
         std::string(attributes) + ">" + std::string(elements) +
         "</rdf:Description></rdf:RDF></x:xmpmeta>";
}

std::unique_ptr<HostLibrary> openHost(const std::string& path, const HostOptions& options) {
  ErrorPtr error;
  std::unique_ptr<HostLibrary> library = openHostLibrary(path, options, &error);
  if (library == nullptr) throw std::runtime_error("cannot open: " + error->description());
  return library;
}

std::int64_t openingErrorCode(const std::string& path, const HostOptions& options) {
  ErrorPtr error;
  if (openHostLibrary(path, options, &error) != nullptr) return 0;
  EXPECT_EQ(error->domain(), kHostErrorDomain);
  EXPECT_FALSE(error->message().empty());
  return error->code();
}

Value rootOf(const HostLibrary& library) {
  ErrorPtr error;
  const Value root = readPropertyList(library.snapshotBytes(), &error);
  if (error != nullptr) throw std::runtime_error("no snapshot: " + error->description());
  return root;
}

std::vector<Value> itemsOf(const Value& root, std::string_view itemType) {
  std::vector<Value> items;
  for (const Value item : root["updates"].arrayValue()) {
    if (item["itemType"].stringValue() == itemType) items.push_back(item);
  }
  return items;
}

Value assetNamed(const Value& root, std::string_view fileName) {
  for (const Value& asset : itemsOf(root, "Asset")) {
    if (asset["originalFileName"].stringValue() == fileName) return asset;
  }
  return Value();
}

Value containerNamed(const Value& root, std::string_view name) {
  for (const Value& album : itemsOf(root, "Album")) {
    if (album["albumName"].stringValue() == name) return album;
  }
  for (const Value& event : itemsOf(root, "Event")) {
    if (event["eventName"].stringValue() == name) return event;
  }
  return Value();
}

std::string fileNamesOf(const Value& root, const Value& album) {
  const std::vector<Value> assets = itemsOf(root, "Asset");
  std::string names;
  for (const Value uuid : album["assetUUIDs"].arrayValue()) {
    for (const Value& asset : assets) {
      if (!(asset["uuid"] == uuid)) continue;
      if (!names.empty()) names += " ";
      names += asset["originalFileName"].stringValue();
    }
  }
  return names;
}

std::string problemsOf(const HostLibrary& library) {
  std::string text;
  for (const HostProblem& problem : library.problems())
    text += problem.path + ": " + problem.text + "\n";
  return text;
}

}  // namespace kx::test
