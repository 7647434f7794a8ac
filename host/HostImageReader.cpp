#include "host/HostImageReader.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cstdint>

#include "host/FolderSnapshot.h"
#include "host/HostFiles.h"
#include "host/PhotoMetadata.h"

namespace kx {

ImageReader::Source HostImageReader::open(const std::string& path) {
  Source result;
  FileHandle file;
  struct stat status = {};
  if (openRegularPath(path, &file, &status) != 0) return result;
  try {
    const ByteSource source(file.get(), static_cast<std::uint64_t>(status.st_size));
    const ContentType type = contentTypeOf(source.head(kContentTypeBytes));
    if (!type.isMedia() || type.isVideo) return result;
    result.isImage = true;
    result.typeIdentifier = std::string(type.mime);
    result.properties = readPhotoMetadata(source, {type, std::nullopt, 0}).imageProperties;
  } catch (const ReadError&) {
    return {};
  }
  return result;
}

Value HostImageReader::fileAttributes(const std::string& path) {
  FileHandle file;
  struct stat status = {};
  if (openRegularPath(path, &file, &status) != 0) return Value();
  return fileAttributesValue(
      status.st_size, {status.st_mtim.tv_sec, static_cast<std::int32_t>(status.st_mtim.tv_nsec)});
}

}  // namespace kx
