#include "device/CameraRoll.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <cerrno>
#include <map>
#include <string_view>

#include "device/CameraMetadata.h"
#include "device/ContentType.h"
#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr std::int64_t kUnixSecondsOfReferenceDate = 978307200;
constexpr std::string_view kHiddenFolderMark = ".MISC";

enum class FileKind { kStill, kFilm, kSideFile };

// Extensions as the device's own content types name them, and those of files whose content tells
// nothing.
constexpr std::array<std::string_view, 13> kFilmExtensions = {
    "MOV", "MP4", "M4V", "3GP", "3G2", "AVI", "MKV", "MPG", "MPEG", "MTS", "M2TS", "WMV", "WEBM"};
constexpr std::array<std::string_view, 20> kStillExtensions = {
    "JPG", "JPEG", "HEIC", "HEIF", "AVIF", "PNG", "GIF", "TIF", "TIFF", "DNG",
    "BMP", "WEBP", "CR2",  "CR3",  "RAF",  "NEF", "ARW", "ORF", "RW2",  "PEF"};

template <std::size_t count>
bool contains(const std::array<std::string_view, count>& all, std::string_view one) {
  return std::find(all.begin(), all.end(), one) != all.end();
}

FileKind kindOf(std::string_view content, const std::string& path) {
  if (content != "DAT")
    return contains(kFilmExtensions, content) ? FileKind::kFilm : FileKind::kStill;
  std::string name(pathExtension(path));
  for (char& c : name) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
  if (contains(kFilmExtensions, name)) return FileKind::kFilm;
  return contains(kStillExtensions, name) ? FileKind::kStill : FileKind::kSideFile;
}

struct LookedAt {
  CameraAsset::File file;
  FileKind kind = FileKind::kSideFile;
  bool known = false;  // its content says what it is
  Date modified;
  CameraMetadata metadata;
};

Date dateOf(const struct timespec& time) {
  return Date{static_cast<double>(time.tv_sec - kUnixSecondsOfReferenceDate) +
              static_cast<double>(time.tv_nsec) * 1e-9};
}

// Nothing for what is no file that can be opened.
std::optional<LookedAt> lookAt(const DeviceRoot& root, const std::string& path,
                               const DeviceLog& log) {
  UniqueFd fd;
  struct stat status;
  int failed = root.openFile(path, O_RDONLY | O_NONBLOCK, &fd);
  if (failed == 0 && ::fstat(fd.get(), &status) != 0) failed = errno;
  if (failed != 0) {
    log.failure("a camera file is passed over", systemError("cannot open", path, failed));
    return std::nullopt;
  }
  if (!S_ISREG(status.st_mode) || status.st_size == 0) return std::nullopt;
  LookedAt found;
  found.file = {path, status.st_size};
  found.modified = dateOf(status.st_mtim);
  std::vector<std::uint8_t> head(static_cast<std::size_t>(
      std::min<std::int64_t>(status.st_size, std::int64_t{kCameraHeadBytes})));
  const ssize_t got = ::pread(fd.get(), head.data(), head.size(), 0);
  head.resize(got > 0 ? static_cast<std::size_t>(got) : 0);
  const std::string_view content = extensionForContent(
      std::span<const std::uint8_t>(head).first(std::min(head.size(), kContentTypeBytes)));
  found.known = content != "DAT";
  found.kind = kindOf(content, path);
  if (found.kind == FileKind::kStill) {
    found.metadata = readExif(head);
  } else if (found.kind == FileKind::kFilm) {
    found.metadata = readFilmHeader(fd.get(), static_cast<std::uint64_t>(status.st_size));
  }
  return found;
}

// Stills first, those whose content is known before the others; then films; then side files.
bool comesBefore(const LookedAt& a, const LookedAt& b) {
  if (a.kind != b.kind) return a.kind < b.kind;
  if (a.known != b.known) return a.known;
  return a.file.path < b.file.path;
}

CameraAsset assetOf(std::vector<LookedAt> files) {
  std::sort(files.begin(), files.end(), comesBefore);
  CameraAsset asset;
  const LookedAt& main = files.front();
  asset.isVideo = main.kind == FileKind::kFilm;
  asset.modificationDate = main.modified;
  for (LookedAt& each : files) {
    if (!asset.creationDate) asset.creationDate = each.metadata.captured;
    if (!asset.place) asset.place = each.metadata.place;
    asset.files.push_back(std::move(each.file));
  }
  if (!asset.creationDate) asset.creationDate = asset.modificationDate;
  return asset;
}

// Paths by what they are without their extension.
std::map<std::string, std::vector<std::string>> filesByName(
    FileSystem& files, const std::unordered_set<std::string>& known, const DeviceLog& log) {
  std::map<std::string, std::vector<std::string>> byName;
  files.enumerate(
      device_paths::kDcim,
      [&](const FileProperties& entry) {
        const bool hidden =
            entry.name.starts_with(".") || entry.name.find(kHiddenFolderMark) != std::string::npos;
        if (hidden) return EnumerationChoice::kSkipDescendants;
        if (!entry.isDirectory && !entry.error && !known.contains(entry.path)) {
          byName[std::string(pathByDeletingExtension(entry.path))].push_back(entry.path);
        }
        return EnumerationChoice::kDescend;
      },
      [&](const std::string& where, const ErrorPtr& error) {
        log.failure("cannot look into " + where, error);
      });
  return byName;
}

}  // namespace

std::vector<CameraAsset> findCameraAssets(const DeviceRoot& root, FileSystem& files,
                                          const std::unordered_set<std::string>& known,
                                          const DeviceLog& log) {
  std::vector<CameraAsset> assets;
  for (const auto& [name, paths] : filesByName(files, known, log)) {
    std::vector<LookedAt> looked;
    for (const std::string& path : paths) {
      if (auto found = lookAt(root, path, log)) looked.push_back(std::move(*found));
    }
    const bool hasMedia = std::any_of(looked.begin(), looked.end(), [](const LookedAt& each) {
      return each.kind != FileKind::kSideFile;
    });
    if (hasMedia) assets.push_back(assetOf(std::move(looked)));
  }
  return assets;
}

}  // namespace kx
