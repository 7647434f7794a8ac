#include "host/FolderLibrary.h"

#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <exception>
#include <optional>
#include <span>
#include <system_error>
#include <thread>
#include <tuple>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include "host/FolderSnapshot.h"
#include "host/HostFiles.h"
#include "host/HostLimits.h"
#include "host/PreviousSnapshot.h"
#include "platform/foundation/PropertyList.h"

namespace kx {

namespace {

constexpr std::size_t kFilesPerProgress = 64;
constexpr unsigned kMaxThreads = 64;

// What became of one file.
struct Reading {
  std::optional<FolderAsset> asset;
  std::vector<std::string> problems;
  std::string unread;  // why its bytes could not be had, "" when they could
};

// Reads the files of a listing on several threads.
class Reader {
 public:
  Reader(int folder, const HostOptions& options, const std::vector<ScannedFile>& files)
      : folder_(folder), options_(options), files_(files), readings_(files.size()) {}

  // False when it was cancelled. An exception of any thread is thrown again here.
  bool run() {
    const unsigned helpers = std::clamp(options_.threads, 1U, kMaxThreads) - 1;
    std::vector<std::thread> threads;
    try {
      for (unsigned i = 0; i < helpers; ++i) threads.emplace_back([this] { work(nullptr); });
    } catch (const std::system_error&) {
      // No more threads to be had: those that are there do the work.
    }
    work(&options_.progress);
    for (std::thread& thread : threads) thread.join();
    // The other threads may have read the last files, or all of them.
    if (!stop_ && options_.progress) report(options_.progress);
    if (failure_) std::rethrow_exception(failure_);
    return !cancelled_;
  }

  std::vector<Reading>& readings() { return readings_; }

 private:
  void work(const HostProgressCallback* progress) {
    try {
      for (std::size_t index = next_++; index < files_.size() && !stop_; index = next_++) {
        readings_[index] = read(files_[index]);
        ++done_;
        if (progress != nullptr && *progress && done_ >= nextProgress_) report(*progress);
      }
    } catch (...) {
      if (!failed_.exchange(true)) failure_ = std::current_exception();
      stop_ = true;
    }
  }

  // On the thread that called run alone.
  void report(const HostProgressCallback& progress) {
    nextProgress_ = done_ + kFilesPerProgress;
    HostProgress state;
    state.phase = HostProgress::Phase::kReading;
    state.filesDone = done_;
    state.filesTotal = files_.size();
    if (progress(state)) return;
    cancelled_ = true;
    stop_ = true;
  }

  Reading read(const ScannedFile& file) const {
    Reading reading;
    FileHandle handle;
    struct stat status = {};
    const int error = openRegularBeneath(folder_, file.path, &handle, &status);
    if (error != 0) {
      const std::string text = "it cannot be read: " + systemErrorText(error);
      if (isNoLongerThere(error)) {
        reading.problems.push_back(text);
      } else {
        keepUnread(file, contentTypeOfName(file.path), text, &reading);
      }
      return reading;
    }
    ContentType type = contentTypeOfName(file.path);
    try {
      const ByteSource source(handle.get(), static_cast<std::uint64_t>(status.st_size));
      type = contentTypeOf(source.head(kContentTypeBytes));
      if (!type.isMedia()) {
        if (hasMediaExtension(file.path))
          reading.problems.emplace_back("its content is no photo or video");
        return reading;
      }
      MetadataRequest request{type, sideFile(file, &reading.problems),
                              options_.timezoneOffsetMinutes};
      FolderAsset asset{file, type, readPhotoMetadata(source, request), std::nullopt};
      reading.problems.insert(reading.problems.end(), asset.metadata.problems.begin(),
                              asset.metadata.problems.end());
      reading.asset = std::move(asset);
    } catch (const ReadError& failure) {
      reading.problems.clear();
      keepUnread(file, type, std::string("it ") + failure.what(), &reading);
    }
    return reading;
  }

  // Gone, or replaced by what is no regular file, since it was listed.
  static bool isNoLongerThere(int error) {
    return error == ENOENT || error == ENOTDIR || error == ELOOP || error == EINVAL;
  }

  // A file whose bytes cannot be had just now stays in the library, or its copies would be deleted
  // on every device: with its name, size and time of change, which the listing knows, and what its
  // side file says.
  void keepUnread(const ScannedFile& file, const ContentType& type, const std::string& problem,
                  Reading* reading) const {
    reading->unread = problem;
    if (!type.isMedia()) {
      reading->problems.push_back(problem);
      return;
    }
    reading->problems.push_back(problem + "; it stays in the library, without its metadata");
    ContentType unread = type;
    unread.container = Container::kNone;
    const MetadataRequest request{unread, sideFile(file, &reading->problems),
                                  options_.timezoneOffsetMinutes};
    const ByteSource nothing{std::span<const std::uint8_t>()};
    FolderAsset asset{file, type, readPhotoMetadata(nothing, request), std::nullopt};
    reading->problems.insert(reading->problems.end(), asset.metadata.problems.begin(),
                             asset.metadata.problems.end());
    reading->asset = std::move(asset);
  }

  std::optional<std::string> sideFile(const ScannedFile& file,
                                      std::vector<std::string>* problems) const {
    if (file.sidePath.empty()) return std::nullopt;
    FileHandle handle;
    struct stat status = {};
    std::vector<std::uint8_t> bytes;
    int error = openRegularBeneath(folder_, file.sidePath, &handle, &status);
    if (error == 0) error = readWhole(handle.get(), hostlimits::kXmpBytes, &bytes);
    if (error == 0) return std::string(bytes.begin(), bytes.end());
    problems->push_back("its side file cannot be read: " + systemErrorText(error));
    return std::nullopt;
  }

  int folder_;
  const HostOptions& options_;
  const std::vector<ScannedFile>& files_;
  std::vector<Reading> readings_;  // each element is written by one thread
  std::atomic<std::size_t> next_{0};
  std::atomic<std::size_t> done_{0};
  std::atomic<bool> stop_{false};
  std::atomic<bool> failed_{false};
  std::exception_ptr failure_;  // read after the threads are joined
  std::size_t nextProgress_ = 0;
  bool cancelled_ = false;
};

class FolderLibrary final : public HostLibrary {
 public:
  FolderLibrary(std::string path, FileHandle folder, const HostIdentity& identity)
      : path_(std::move(path)), folder_(std::move(folder)), identity_(identity) {}

  bool read(const HostOptions& options, ErrorPtr* error) {
    FolderListing listing;
    if (!scanFolder(folder_.get(), options, &listing, error)) return false;
    problems_ = std::move(listing.problems);
    std::vector<FolderAsset> assets;
    if (!readFiles(listing.files, options, &assets, error)) return false;
    if (assets.empty()) {
      setError(error, hostError(HostError::kEmpty, emptyText()));
      return false;
    }
    keepMedia(assets);
    ErrorPtr failure;
    snapshot_ = std::make_shared<Data>(writePropertyList(
        folderSnapshotRoot(identity_, options, assets), PropertyListFormat::kBinary, &failure));
    if (failure == nullptr) return true;
    setError(error, hostError(HostError::kUnreadable,
                              "its snapshot cannot be made: " + failure->message()));
    return false;
  }

  Form form() const override { return Form::kFolder; }
  const std::string& path() const override { return path_; }
  std::string libraryUUID() const override { return identity_.library(); }
  std::string libraryKind() const override { return "Folder"; }
  DataPtr snapshotBytes() const override { return snapshot_; }
  DataPtr takeSnapshotBytes() override { return std::move(snapshot_); }
  const std::vector<HostProblem>& problems() const override { return problems_; }

  std::optional<HostMedia> openMedia(std::string_view uuid, ErrorPtr* error) const override {
    const auto found = media_.find(std::string(uuid));
    if (found == media_.end()) {
      setError(error, posixError(ENOENT, "no file of the host"));
      return std::nullopt;
    }
    return openHostMedia(folder_.get(), found->second.path, error);
  }

  std::optional<std::int64_t> mediaSize(std::string_view uuid) const override {
    const std::optional<HostMedia> media = openMedia(uuid, nullptr);
    return media ? std::optional(media->sizeBytes) : std::nullopt;
  }

  std::vector<MediaName> mediaNames() const override {
    std::vector<MediaName> names;
    for (const auto& [uuid, media] : media_)
      names.push_back({uuid, uuid + "." + std::string(media.extension)});
    std::sort(names.begin(), names.end(),
              [](const MediaName& a, const MediaName& b) { return a.bundleName < b.bundleName; });
    return names;
  }

 private:
  struct Media {
    std::string path;
    std::string_view extension;
  };

  bool readFiles(const std::vector<ScannedFile>& files, const HostOptions& options,
                 std::vector<FolderAsset>* assets, ErrorPtr* error) {
    Reader reader(folder_.get(), options, files);
    if (!reader.run()) {
      setError(error, hostError(HostError::kCancelled, "cancelled"));
      return false;
    }
    recallUnread(files, options, &reader.readings());
    for (std::size_t index = 0; index < files.size(); ++index) {
      Reading& reading = reader.readings()[index];
      for (std::string& text : reading.problems)
        problems_.push_back({files[index].path, std::move(text)});
      if (reading.asset) assets->push_back(std::move(*reading.asset));
    }
    std::stable_sort(problems_.begin(), problems_.end(),
                     [](const HostProblem& a, const HostProblem& b) { return a.path < b.path; });
    return true;
  }

  // Files that could not be read, but were once, stay just as they were.
  void recallUnread(const std::vector<ScannedFile>& files, const HostOptions& options,
                    std::vector<Reading>* readings) const {
    if (!options.previousSnapshot) return;
    std::unordered_set<std::string> unread;
    for (std::size_t index = 0; index < files.size(); ++index) {
      if (!(*readings)[index].unread.empty()) unread.insert(identity_.asset(files[index].path));
    }
    if (unread.empty()) return;
    const PreviousSnapshot previous(options.previousSnapshot(), identity_.library(), unread);
    for (std::size_t index = 0; index < files.size(); ++index) {
      Reading& reading = (*readings)[index];
      if (reading.unread.empty()) continue;
      auto asset = previous.asset(identity_.asset(files[index].path), files[index]);
      if (!asset) continue;
      reading.asset = std::move(asset);
      reading.problems = {reading.unread + "; it stays in the library as it was"};
    }
  }

  std::string emptyText() const {
    std::string text = "there is no photo or video in the folder";
    if (!problems_.empty())
      text += " (" + std::to_string(problems_.size()) + " entries were passed over)";
    return text;
  }

  void keepMedia(const std::vector<FolderAsset>& assets) {
    media_.reserve(assets.size());
    for (const FolderAsset& asset : assets)
      media_.emplace(identity_.asset(asset.file.path),
                     Media{asset.file.path, asset.type.extension});
  }

  std::string path_;
  FileHandle folder_;
  HostIdentity identity_;
  std::unordered_map<std::string, Media> media_;
  DataPtr snapshot_;
  std::vector<HostProblem> problems_;
};

}  // namespace

std::unique_ptr<HostLibrary> readFolderLibrary(const std::string& path, FileHandle folder,
                                               const HostOptions& options, ErrorPtr* error) {
  const std::optional<UUIDBytes> library = options.libraryID.empty()
                                               ? HostIdentity::libraryOfFolder(path)
                                               : uuidFromText(options.libraryID);
  if (!library) {
    setError(error, hostError(HostError::kUsage, "the library identifier is no UUID"));
    return nullptr;
  }
  auto result = std::make_unique<FolderLibrary>(path, std::move(folder), HostIdentity(*library));
  return result->read(options, error) ? std::move(result) : nullptr;
}

}  // namespace kx
