#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "host/HostLibrary.h"

namespace kx {

// A time of the file system, since 1970-01-01 UTC.
struct FileTime {
  std::int64_t seconds = 0;
  std::int32_t nanoseconds = 0;
  friend auto operator<=>(const FileTime&, const FileTime&) = default;
};

// A regular file below the folder that may be a photo or video: its content is not looked at yet.
struct ScannedFile {
  std::string path;  // below the folder
  std::int64_t sizeBytes = 0;
  FileTime modified;
  std::string sidePath;  // its XMP side file, "" when it has none
  FileTime sideModified;
};

struct FolderListing {
  std::vector<ScannedFile> files;     // sorted by path, byte by byte
  std::vector<HostProblem> problems;  // links and what else is no regular file
};

// Lists all below the folder: hidden entries (a leading dot) and XMP side files apart, links never
// followed. A photo's side file is "name.ext.xmp", else "name.xmp" (or ".XMP"). False and an error
// when a folder cannot be read, or the tree kept changing meanwhile.
bool scanFolder(int folder, const HostOptions& options, FolderListing* listing, ErrorPtr* error);

// An error of kHostErrorDomain; paths in the text are escaped.
ErrorPtr hostError(HostError code, const std::string& text);

}  // namespace kx
