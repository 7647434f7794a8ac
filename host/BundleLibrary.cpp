#include "host/BundleLibrary.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <future>
#include <mutex>
#include <system_error>
#include <utility>

#include "host/FolderScan.h"
#include "host/HostFiles.h"
#include "host/HostLimits.h"
#include "platform/foundation/PropertyList.h"
#include "records/TransportKeys.h"

namespace kx {

namespace {

class BundleLibrary final : public HostLibrary {
 public:
  BundleLibrary(std::string path, FileHandle folder)
      : path_(std::move(path)), folder_(std::move(folder)) {}

  bool open(ErrorPtr* error) {
    FileHandle file;
    struct stat status = {};
    std::vector<std::uint8_t> bytes;
    int failure = openRegularBeneath(folder_.get(), kBundleSnapshotName, &file, &status);
    if (failure == 0) failure = readWhole(file.get(), hostlimits::kSnapshotBytes, &bytes);
    if (failure != 0) return fail(failure, kBundleSnapshotName, error);
    snapshot_ = std::make_shared<Data>(std::move(bytes));
    failure = openBeneath(folder_.get(), kBundleMediaName, O_RDONLY | O_DIRECTORY, &media_);
    return failure == 0 || fail(failure, kBundleMediaName, error);
  }

  Form form() const override { return Form::kBundle; }
  const std::string& path() const override { return path_; }
  std::string libraryUUID() const override { return rootText(kKXSTransportLibraryUUIDKey); }
  std::string libraryKind() const override { return rootText(kKXSTransportLibraryKindKey); }
  DataPtr snapshotBytes() const override { return snapshot_; }
  DataPtr takeSnapshotBytes() override { return std::move(snapshot_); }
  const std::vector<HostProblem>& problems() const override { return problems_; }

  void expectMedia() const override {
    if (!listing_.valid()) listing_ = std::async(std::launch::async, [this] { names(); });
  }

  std::optional<HostMedia> openMedia(std::string_view uuid, ErrorPtr* error) const override {
    const std::string name = nameOf(uuid);
    if (name.empty()) {
      const int failure = names().failure;
      setError(error, posixError(failure != 0 ? failure : ENOENT, "no file of the host"));
      return std::nullopt;
    }
    std::optional<HostMedia> media = openHostMedia(media_.get(), name, error);
    if (media) media->path = std::string(kBundleMediaName) + "/" + name;
    return media;
  }

  std::optional<std::int64_t> mediaSize(std::string_view uuid) const override {
    const std::string name = nameOf(uuid);
    struct stat status = {};
    if (name.empty() || ::fstatat(media_.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 ||
        !S_ISREG(status.st_mode))
      return std::nullopt;
    return status.st_size;
  }

  // A name's UUID is what stands before its first dot.
  std::vector<MediaName> mediaNames() const override {
    if (names().failure != 0) {
      throw std::system_error(names().failure, std::generic_category(), kBundleMediaName);
    }
    std::vector<MediaName> result;
    for (const Name& listed : names().names) {
      const std::string_view name = names().at(listed);
      if (name.front() == '.') continue;
      std::string uuid(name.substr(0, name.find('.')));
      if (nameOf(uuid) == name) result.push_back({std::move(uuid), std::string(name)});
    }
    return result;
  }

 private:
  static bool fail(int failure, const std::string& name, ErrorPtr* error) {
    setError(error, hostError(HostError::kUnreadable,
                              "\"" + name + "\" cannot be read: " + systemErrorText(failure)));
    return false;
  }

  struct Name {
    std::uint64_t head;  // the first bytes, which mostly tell two names apart
    std::size_t start;   // in the text
  };
  // Very many names, in one text.
  struct Names {
    std::string text;         // each with its NUL
    std::vector<Name> names;  // sorted by bytes
    int failure = 0;          // errno when they could not be listed

    std::string_view at(const Name& name) const { return text.c_str() + name.start; }
  };

  static std::uint64_t headOf(std::string_view name) {
    std::uint64_t head = 0;
    for (std::size_t i = 0; i < sizeof(head); ++i) {
      head = head << 8 | (i < name.size() ? static_cast<std::uint8_t>(name[i]) : 0U);
    }
    return head;
  }

  // The names in media/, listed when first asked for: a sync without new files never does.
  const Names& names() const {
    std::call_once(listed_, [this] {
      names_.failure = forEachName(media_.get(), [this](std::string_view name) {
        names_.names.push_back({headOf(name), names_.text.size()});
        names_.text.append(name).push_back('\0');
      });
      std::sort(names_.names.begin(), names_.names.end(), [this](const Name& a, const Name& b) {
        return a.head != b.head ? a.head < b.head : names_.at(a) < names_.at(b);
      });
    });
    return names_;
  }

  // The name of the asset's file in media/, "" when there is none.
  std::string nameOf(std::string_view uuid) const {
    if (!isOneComponent(uuid)) return {};
    const Names& names = this->names();
    const auto atLeast = [&names](std::string_view wanted) -> std::string_view {
      const std::uint64_t head = headOf(wanted);
      const auto found =
          std::lower_bound(names.names.begin(), names.names.end(), wanted,
                           [&names, head](const Name& name, std::string_view text) {
                             return name.head != head ? name.head < head : names.at(name) < text;
                           });
      return found == names.names.end() ? std::string_view() : names.at(*found);
    };
    if (atLeast(uuid) == uuid) return std::string(uuid);
    const std::string prefix = std::string(uuid) + ".";
    const std::string_view next = atLeast(prefix);
    return next.starts_with(prefix) ? std::string(next) : std::string();
  }

  std::string rootText(std::string_view key) const {
    std::call_once(decoded_, [this] {
      if (snapshot_) root_ = readPropertyList(snapshot_, nullptr);
    });
    const Value value = root_[key];
    return value.isString() ? std::string(value.stringValue()) : std::string();
  }

  std::string path_;
  FileHandle folder_;
  FileHandle media_;
  DataPtr snapshot_;
  std::vector<HostProblem> problems_;
  mutable std::once_flag listed_;
  mutable Names names_;
  mutable std::once_flag decoded_;
  mutable Value root_;
  mutable std::future<void> listing_;  // last: it uses the rest
};

}  // namespace

bool isHostBundle(int folder) {
  struct stat snapshot = {};
  struct stat media = {};
  return ::fstatat(folder, kBundleSnapshotName, &snapshot, AT_SYMLINK_NOFOLLOW) == 0 &&
         ::fstatat(folder, kBundleMediaName, &media, AT_SYMLINK_NOFOLLOW) == 0 &&
         S_ISDIR(media.st_mode);
}

std::unique_ptr<HostLibrary> openBundleLibrary(const std::string& path, FileHandle folder,
                                               ErrorPtr* error) {
  auto result = std::make_unique<BundleLibrary>(path, std::move(folder));
  return result->open(error) ? std::move(result) : nullptr;
}

}  // namespace kx
