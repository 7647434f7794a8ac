#include "host/HostLibrary.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdlib>
#include <utility>

#include "host/BundleLibrary.h"
#include "host/FolderLibrary.h"
#include "host/FolderScan.h"
#include "host/HostFiles.h"

namespace kx {

namespace {

constexpr int kMaxOffsetMinutes = 14 * 60;

std::string canonicalPath(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr),
                                                             &std::free);
  return resolved == nullptr ? std::string() : std::string(resolved.get());
}

ErrorPtr openingError(int failure) {
  if (failure == ENOENT) return hostError(HostError::kMissing, "there is no such folder");
  if (failure == ENOTDIR) return hostError(HostError::kMissing, "it is no folder");
  return hostError(HostError::kUnreadable,
                   "the folder cannot be read: " + systemErrorText(failure));
}

}  // namespace

std::unique_ptr<HostLibrary> openHostLibrary(const std::string& path, const HostOptions& options,
                                             ErrorPtr* error) {
  if (std::abs(options.timezoneOffsetMinutes) > kMaxOffsetMinutes) {
    setError(error, hostError(HostError::kUsage, "the time zone is more than 14 hours from UTC"));
    return nullptr;
  }
  const std::string canonical = canonicalPath(path);
  FileHandle folder;
  const int failure = canonical.empty() ? errno : openFolder(canonical, &folder);
  if (failure != 0) {
    setError(error, openingError(failure));
    return nullptr;
  }
  if (isHostBundle(folder.get())) return openBundleLibrary(canonical, std::move(folder), error);
  return readFolderLibrary(canonical, std::move(folder), options, error);
}

std::optional<HostMedia> openHostMedia(int folder, const std::string& path, ErrorPtr* error) {
  HostMedia media;
  struct stat status = {};
  const int failure = openRegularBeneath(folder, path, &media.file, &status);
  if (failure != 0) {
    setError(error, posixError(failure, "a file of the host"));
    return std::nullopt;
  }
  media.sizeBytes = status.st_size;
  media.modifiedSeconds = status.st_mtim.tv_sec;
  media.modifiedNanoseconds = static_cast<std::int32_t>(status.st_mtim.tv_nsec);
  media.path = path;
  return media;
}

}  // namespace kx
