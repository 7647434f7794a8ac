// Writes a host bundle beside its place and puts it there in one step.
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <utility>
#include <vector>

#include "host/BundleLibrary.h"
#include "host/FolderScan.h"
#include "host/HostFiles.h"
#include "host/HostLibrary.h"
#include "platform/foundation/Text.h"

namespace kx {

namespace {

// A system call that failed while the bundle was written.
struct WriteFailure {
  int error = 0;
  std::string what;
};

void check(int error, const std::string& what) {
  if (error != 0) throw WriteFailure{error, what};
}

int errnoOf(int result) { return result == 0 ? 0 : errno; }

// What stands at the target's place.
enum class Target { kNothing, kReplaceable, kForeign };

// A directory that is empty, or a bundle that holds nothing else.
Target targetAt(int parent, const std::string& name) {
  struct stat status = {};
  if (::fstatat(parent, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
    check(errno == ENOENT ? 0 : errno, "the target");
    return Target::kNothing;
  }
  FileHandle folder;
  std::vector<std::string> names;
  if (!S_ISDIR(status.st_mode)) return Target::kForeign;
  check(openBeneath(parent, name, O_RDONLY | O_DIRECTORY, &folder), "the target");
  check(listNames(folder.get(), &names), "the target");
  if (names.empty()) return Target::kReplaceable;
  const std::vector<std::string> ofBundle{kBundleSnapshotName, kBundleMediaName};
  return names == ofBundle && isHostBundle(folder.get()) ? Target::kReplaceable : Target::kForeign;
}

// Removes a bundle's files, and then what is empty: never more than a bundle's own.
void removeBundle(int parent, const std::string& name) {
  FileHandle folder;
  FileHandle media;
  if (openBeneath(parent, name, O_RDONLY | O_DIRECTORY, &folder) != 0) return;
  std::vector<std::string> names;
  if (openBeneath(folder.get(), kBundleMediaName, O_RDONLY | O_DIRECTORY, &media) == 0 &&
      listNames(media.get(), &names) == 0) {
    for (const std::string& file : names) (void)::unlinkat(media.get(), file.c_str(), 0);
  }
  (void)::unlinkat(folder.get(), kBundleMediaName, AT_REMOVEDIR);
  (void)::unlinkat(folder.get(), kBundleSnapshotName, 0);
  (void)::unlinkat(parent, name.c_str(), AT_REMOVEDIR);
}

std::string temporaryName(const std::string& name) {
  std::uint64_t random = 0;
  check(::getrandom(&random, sizeof random, 0) == sizeof random ? 0 : errno, "a random name");
  std::array<char, 32> text = {};
  std::snprintf(text.data(), text.size(), "%016llx", static_cast<unsigned long long>(random));
  return "." + name.substr(0, 200) + "." + text.data() + ".kxsync-tmp";
}

// Copies `size` bytes: shared where the file system can, else in the kernel, else through us.
// Gives the number of bytes that arrived.
std::int64_t copyBytes(int from, int to, std::int64_t size) {
  if (::ioctl(to, FICLONE, from) == 0) return size;
  std::int64_t done = 0;
  bool inKernel = true;
  std::vector<std::uint8_t> buffer;
  while (done < size) {
    if (inKernel) {
      const ssize_t copied =
          ::copy_file_range(from, nullptr, to, nullptr, static_cast<std::size_t>(size - done), 0);
      if (copied > 0) done += copied;
      if (copied < 0 && errno != EINTR) {
        // Of an EIO it is not known which side it is on; the copy through memory tells.
        if (errno == ENOSPC || errno == EDQUOT) throw WriteFailure{errno, "a file"};
        inKernel = false;
      }
      if (copied != 0) continue;
      return done;
    }
    buffer.resize(1U << 20);
    const ssize_t got = ::pread(from, buffer.data(), buffer.size(), done);
    if (got < 0 && errno == EINTR) continue;
    if (got <= 0) return done;
    check(writeAll(to, buffer.data(), static_cast<std::size_t>(got)), "a file");
    done += got;
  }
  return done;
}

class Writer {
 public:
  Writer(const HostLibrary& library, const HostOptions& options, std::vector<HostProblem>* problems)
      : library_(library), options_(options), problems_(problems) {}

  // False when it was cancelled.
  bool write(int bundle) {
    check(errnoOf(::mkdirat(bundle, kBundleMediaName, 0700)), kBundleMediaName);
    FileHandle media;
    check(openBeneath(bundle, kBundleMediaName, O_RDONLY | O_DIRECTORY, &media), kBundleMediaName);
    const std::vector<HostLibrary::MediaName> names = library_.mediaNames();
    HostProgress progress;
    progress.phase = HostProgress::Phase::kCopying;
    progress.filesTotal = names.size();
    for (const HostLibrary::MediaName& name : names) {
      if (options_.progress && !options_.progress(progress)) return false;
      progress.bytesDone += copy(media.get(), name);
      ++progress.filesDone;
    }
    writeSnapshot(bundle);
    // One call for all files, and only then the directories' turn.
    check(errnoOf(::syncfs(bundle)), "the bundle");
    return true;
  }

 private:
  FileHandle create(int folder, const std::string& name) const {
    const int fd =
        ::openat(folder, name.c_str(), O_CREAT | O_EXCL | O_WRONLY | O_CLOEXEC | O_NOFOLLOW, 0600);
    check(fd < 0 ? errno : 0, name);
    return FileHandle(fd);
  }

  std::uint64_t copy(int folder, const HostLibrary::MediaName& name) {
    ErrorPtr error;
    const std::optional<HostMedia> media = library_.openMedia(name.uuid, &error);
    if (!media) {
      note(name.bundleName, error->message());
      return 0;
    }
    FileHandle file = create(folder, name.bundleName);
    if (copyBytes(media->file.get(), file.get(), media->sizeBytes) != media->sizeBytes) {
      check(errnoOf(::unlinkat(folder, name.bundleName.c_str(), 0)), name.bundleName);
      note(media->path, "it changed while it was copied");
      return 0;
    }
    const std::array<timespec, 2> times{
        timespec{0, UTIME_OMIT}, timespec{media->modifiedSeconds, media->modifiedNanoseconds}};
    check(errnoOf(::futimens(file.get(), times.data())), name.bundleName);
    check(errnoOf(::close(file.release())), name.bundleName);
    return static_cast<std::uint64_t>(media->sizeBytes);
  }

  void note(const std::string& path, const std::string& text) {
    if (problems_ != nullptr) problems_->push_back({path, text});
  }

  void writeSnapshot(int bundle) const {
    FileHandle file = create(bundle, kBundleSnapshotName);
    const DataPtr bytes = library_.snapshotBytes();
    check(writeAll(file.get(), bytes->bytes(), bytes->length()), kBundleSnapshotName);
    check(errnoOf(::fsync(file.get())), kBundleSnapshotName);
    check(errnoOf(::close(file.release())), kBundleSnapshotName);
  }

  const HostLibrary& library_;
  const HostOptions& options_;
  std::vector<HostProblem>* problems_;
};

int renameTo(int parent, const std::string& from, const std::string& to, unsigned flags) {
  return errnoOf(::renameat2(parent, from.c_str(), parent, to.c_str(), flags));
}

// Not every file system knows the flags of a rename; then the old bundle steps aside first.
void putInPlace(int parent, const std::string& temporary, const std::string& name, Target target) {
  if (target == Target::kNothing) {
    int error = renameTo(parent, temporary, name, RENAME_NOREPLACE);
    if (error == EINVAL) error = renameTo(parent, temporary, name, 0);
    return check(error, "the bundle");
  }
  const int error = renameTo(parent, temporary, name, RENAME_EXCHANGE);
  if (error == 0) return removeBundle(parent, temporary);  // the old one
  if (error != EINVAL) check(error, "the bundle");
  const std::string aside = temporaryName(name);
  check(renameTo(parent, name, aside, 0), "the old bundle");
  const int second = renameTo(parent, temporary, name, 0);
  if (second != 0) (void)renameTo(parent, aside, name, 0);
  check(second, "the bundle");
  removeBundle(parent, aside);
}

// The directory that holds the target, and the target's name in it.
struct Place {
  std::string parent;
  std::string name;
};

Place placeOf(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return {".", path};
  return {slash == 0 ? "/" : path.substr(0, slash), path.substr(slash + 1)};
}

// Whether the target would lie in the library that it is made of, or be it.
bool liesInside(const Place& place, const std::string& library) {
  char* resolved = ::realpath(place.parent.c_str(), nullptr);
  if (resolved == nullptr) return false;
  const std::string target = std::string(resolved) + "/" + place.name + "/";
  std::free(resolved);
  return target.starts_with(library + "/");
}

bool writeBeside(int parent, const Place& place, Writer* writer) {
  const Target target = targetAt(parent, place.name);
  if (target == Target::kForeign) throw WriteFailure{EEXIST, "the target"};
  const std::string temporary = temporaryName(place.name);
  check(errnoOf(::mkdirat(parent, temporary.c_str(), 0700)), "the bundle");
  try {
    FileHandle bundle;
    check(openBeneath(parent, temporary, O_RDONLY | O_DIRECTORY, &bundle), "the bundle");
    if (!writer->write(bundle.get())) {
      removeBundle(parent, temporary);
      return false;
    }
    putInPlace(parent, temporary, place.name, target);
  } catch (...) {
    removeBundle(parent, temporary);
    throw;
  }
  check(errnoOf(::fsync(parent)), "the bundle's folder");
  return true;
}

}  // namespace

bool writeHostBundle(const HostLibrary& library, const std::string& bundlePath,
                     const HostOptions& options, std::vector<HostProblem>* problems,
                     ErrorPtr* error) {
  const Place place = placeOf(bundlePath);
  FileHandle parent;
  try {
    if (!isOneComponent(place.name) || liesInside(place, library.path())) {
      setError(error, hostError(HostError::kUsage, "a bundle cannot be written there"));
      return false;
    }
    check(openFolder(place.parent, &parent), "the bundle's folder");
    Writer writer(library, options, problems);
    if (writeBeside(parent.get(), place, &writer)) return true;
    setError(error, hostError(HostError::kCancelled, "cancelled"));
  } catch (const WriteFailure& failure) {
    if (failure.error == EEXIST && failure.what == "the target") {
      setError(error, hostError(HostError::kNotABundle, "there is something else in its place"));
      return false;
    }
    const std::string text =
        escapeControlCharacters(failure.what) + ": " + systemErrorText(failure.error);
    setError(error, std::make_shared<Error>(
                        kHostErrorDomain, static_cast<std::int64_t>(HostError::kWrite),
                        Value::dictionary(Dictionary{{kErrorMessageKey, Value::string(text)},
                                                     {"errno", Value::integer(failure.error)}})));
  }
  return false;
}

}  // namespace kx
