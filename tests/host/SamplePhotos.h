#pragma once

#include <exiv2/exiv2.hpp>

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "host/HostLibrary.h"
#include "platform/foundation/Value.h"

namespace kx::test {

// A folder that is removed with all that is in it when the test ends.
class TemporaryFolder {
 public:
  TemporaryFolder();
  ~TemporaryFolder();
  TemporaryFolder(const TemporaryFolder&) = delete;
  TemporaryFolder& operator=(const TemporaryFolder&) = delete;

  const std::string& path() const { return path_; }
  std::string at(std::string_view name) const { return path_ + "/" + std::string(name); }
  // Writes a file, and the folders above it; its time of change is set to 2024-01-02 03:04:05 UTC.
  void write(std::string_view name, std::string_view bytes) const;
  void makeFolder(std::string_view name) const;
  void remove(std::string_view name) const;
  void setTime(std::string_view name, std::int64_t seconds, std::int32_t nanoseconds) const;

 private:
  std::string path_;
};

// While it lives, permissions bind the process even when root runs the tests; the folder and all in
// it belong to the user that it then is.
class AsOrdinaryUser {
 public:
  explicit AsOrdinaryUser(const TemporaryFolder& folder);
  ~AsOrdinaryUser();
  AsOrdinaryUser(const AsOrdinaryUser&) = delete;
  AsOrdinaryUser& operator=(const AsOrdinaryUser&) = delete;

 private:
  bool wasRoot_;
};

std::string readFile(const std::string& path);

// A small JPEG of those dimensions; `filling` makes its content its own.
std::string jpeg(int width = 64, int height = 48, std::string_view filling = "");

// The same photo with metadata that `edit` writes.
using MetadataEdit = std::function<void(Exiv2::Image&)>;
std::string withMetadata(const std::string& photo, const MetadataEdit& edit);

// A JPEG that was taken then ("2024:05:31 10:00:00").
std::string photoTaken(const std::string& exifTime, std::string_view filling = "");

struct SampleRegion {
  std::string name;
  std::string type = "Face";
  double x = 0.0;  // centre
  double y = 0.0;
  double width = 0.0;
  double height = 0.0;
};

// XMP with regions that were made for a picture of those dimensions.
struct SampleRegions {
  int width = 0;
  int height = 0;
  std::vector<SampleRegion> regions;
  std::string unit = "normalized";
};
void addRegions(const SampleRegions& sample, Exiv2::XmpData* xmp);

// An XMP packet with the given properties inside its description element.
std::string xmpPacket(std::string_view attributes, std::string_view elements = "");

// Opens the folder as a host library; a failure fails the test.
std::unique_ptr<HostLibrary> openHost(const std::string& path, const HostOptions& options = {});
// The code of the error that opening gives, 0 when it opens.
std::int64_t openingErrorCode(const std::string& path, const HostOptions& options = {});

// A library's snapshot as a property list, and items in it.
Value rootOf(const HostLibrary& library);
std::vector<Value> itemsOf(const Value& root, std::string_view itemType);
// The asset of that original file name, null when there is none.
Value assetNamed(const Value& root, std::string_view fileName);
// The album, or event, of that name.
Value containerNamed(const Value& root, std::string_view name);
// Original file names of an album's assets, joined by blanks.
std::string fileNamesOf(const Value& root, const Value& album);
// "path: text" of all problems, one a line.
std::string problemsOf(const HostLibrary& library);

// Seconds since 1904 of a time given since 1970.
inline double hostTime(double secondsSince1970) { return secondsSince1970 + 2082844800.0; }

}  // namespace kx::test
