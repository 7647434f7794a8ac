#include "host/FolderScan.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <string_view>
#include <tuple>
#include <unordered_map>
#include <utility>

#include "host/HostFiles.h"
#include "host/HostLimits.h"
#include "platform/foundation/Text.h"

namespace kx {

namespace {

constexpr int kAttempts = 3;

FileTime fileTime(const struct timespec& time) {
  return {time.tv_sec, static_cast<std::int32_t>(time.tv_nsec)};
}

// What tells whether a directory is still the one that was listed.
struct DirectoryState {
  FileTime modified;
  FileTime changed;
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  friend bool operator==(const DirectoryState&, const DirectoryState&) = default;
};

DirectoryState stateOf(const struct stat& status) {
  return {fileTime(status.st_mtim), fileTime(status.st_ctim), status.st_dev, status.st_ino};
}

struct Directory {
  std::string path;
  std::size_t depth = 0;
};

bool isSideFileName(std::string_view name) {
  return name.size() > 4 && (name.ends_with(".xmp") || name.ends_with(".XMP"));
}

std::string joined(const std::string& folder, const std::string& name) {
  return folder.empty() ? name : folder + "/" + name;
}

class Scan {
 public:
  Scan(int root, const HostOptions& options) : root_(root), options_(options) {}

  // Goes over the whole tree once. False with an error, or without one when the tree changed.
  bool run(FolderListing* listing, ErrorPtr* error) {
    listing_ = listing;
    *listing = {};
    seen_.clear();
    std::vector<Directory> waiting{{"", 0}};
    while (!waiting.empty()) {
      const Directory next = std::move(waiting.back());
      waiting.pop_back();
      if (!readDirectory(next, &waiting, error)) return false;
      HostProgress progress;
      progress.filesDone = listing->files.size();
      if (options_.progress && !options_.progress(progress))
        return fail(error, HostError::kCancelled, "cancelled");
    }
    for (const auto& [path, state] : seen_) {
      if (!isUnchanged(path, state)) return false;
    }
    std::sort(listing->files.begin(), listing->files.end(),
              [](const ScannedFile& a, const ScannedFile& b) { return a.path < b.path; });
    std::sort(listing->problems.begin(), listing->problems.end(),
              [](const HostProblem& a, const HostProblem& b) {
                return std::tie(a.path, a.text) < std::tie(b.path, b.text);
              });
    return true;
  }

 private:
  static bool fail(ErrorPtr* error, HostError code, const std::string& text) {
    setError(error, hostError(code, text));
    return false;
  }
  static std::string quoted(const std::string& path) {
    return path.empty() ? "the folder" : "\"" + escapeControlCharacters(path) + "\"";
  }

  bool readDirectory(const Directory& directory, std::vector<Directory>* waiting, ErrorPtr* error) {
    if (directory.depth > hostlimits::kFolderDepth)
      return fail(error, HostError::kLimit, quoted(directory.path) + " lies too deep");
    FileHandle handle;
    struct stat status = {};
    std::vector<std::string> names;
    int failure = openBeneath(root_, directory.path, O_RDONLY | O_DIRECTORY, &handle);
    if (failure == 0 && ::fstat(handle.get(), &status) != 0) failure = errno;
    if (failure == 0) failure = listNames(handle.get(), &names);
    // Gone, or replaced by something else, since its parent was listed.
    if (failure == ENOENT || failure == ELOOP || failure == ENOTDIR) return false;
    if (failure != 0)
      return fail(error, HostError::kUnreadable,
                  quoted(directory.path) + " cannot be read: " + systemErrorText(failure));
    seen_.emplace_back(directory.path, stateOf(status));
    return readEntries(directory, handle.get(), names, {waiting, error});
  }

  struct Outcome {
    std::vector<Directory>* waiting;
    ErrorPtr* error;
  };

  bool readEntries(const Directory& directory, int handle, const std::vector<std::string>& names,
                   const Outcome& outcome) {
    std::unordered_map<std::string, FileTime> sideFiles;
    const std::size_t firstFile = listing_->files.size();
    for (const std::string& name : names) {
      if (name.front() == '.') continue;
      const std::string path = joined(directory.path, name);
      if (path.size() > hostlimits::kPathBytes)
        return fail(outcome.error, HostError::kLimit, quoted(path) + " has too long a path");
      struct stat status = {};
      if (::fstatat(handle, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        if (errno == ENOENT) return false;
        return fail(outcome.error, HostError::kUnreadable,
                    quoted(path) + " cannot be read: " + systemErrorText(errno));
      }
      if (S_ISDIR(status.st_mode)) {
        outcome.waiting->push_back({path, directory.depth + 1});
      } else if (S_ISLNK(status.st_mode)) {
        listing_->problems.push_back({path, "it is a link, which is not followed"});
      } else if (!S_ISREG(status.st_mode)) {
        listing_->problems.push_back({path, "it is no regular file"});
      } else if (isSideFileName(name)) {
        sideFiles.emplace(path, fileTime(status.st_mtim));
      } else if (listing_->files.size() == hostlimits::kFiles) {
        return fail(outcome.error, HostError::kLimit, "there are too many files in it");
      } else {
        listing_->files.push_back({path, status.st_size, fileTime(status.st_mtim), "", {}});
      }
    }
    for (std::size_t i = firstFile; i < listing_->files.size(); ++i)
      findSideFile(sideFiles, &listing_->files[i]);
    return true;
  }

  static void findSideFile(const std::unordered_map<std::string, FileTime>& sideFiles,
                           ScannedFile* file) {
    if (sideFiles.empty()) return;
    const std::string name(pathByDeletingExtension(file->path));
    for (const std::string& candidate :
         {file->path + ".xmp", file->path + ".XMP", name + ".xmp", name + ".XMP"}) {
      const auto found = sideFiles.find(candidate);
      if (found == sideFiles.end()) continue;
      file->sidePath = found->first;
      file->sideModified = found->second;
      return;
    }
  }

  bool isUnchanged(const std::string& path, const DirectoryState& state) const {
    FileHandle handle;
    struct stat status = {};
    return openBeneath(root_, path, O_PATH | O_DIRECTORY, &handle) == 0 &&
           ::fstat(handle.get(), &status) == 0 && stateOf(status) == state;
  }

  int root_;
  const HostOptions& options_;
  FolderListing* listing_ = nullptr;
  std::vector<std::pair<std::string, DirectoryState>> seen_;
};

}  // namespace

bool scanFolder(int folder, const HostOptions& options, FolderListing* listing, ErrorPtr* error) {
  Scan scan(folder, options);
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    ErrorPtr failure;
    if (scan.run(listing, &failure)) return true;
    if (failure != nullptr) {
      setError(error, failure);
      return false;
    }
  }
  setError(error, hostError(HostError::kChanged, "the folder keeps changing while it is read"));
  return false;
}

ErrorPtr hostError(HostError code, const std::string& text) {
  return Error::make(kHostErrorDomain, static_cast<std::int64_t>(code), text);
}

}  // namespace kx
