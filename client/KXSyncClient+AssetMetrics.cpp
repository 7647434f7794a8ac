#include <algorithm>
#include <exception>
#include <system_error>
#include <unordered_set>

#include "client/CameraFolderName.h"
#include "client/KXSyncClient.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr const char* kAssetMetricsSource = "KXSyncClient+AssetMetrics";
constexpr const char* kBackupLockPath = "/tmp/BackupRunning";
constexpr const char* kIsolationQueueLabel = "com.veltro.photoSyncClient.isolation";
constexpr std::uint32_t kDefaultBlockSize = 4096;
constexpr std::int64_t kNoSuchFile = 2;  // POSIX
constexpr std::string_view kShoebox = "Shoebox";
constexpr std::string_view kPhysicalSize = "_PhysicalSize";
constexpr std::string_view kCount = "_Count";

// Blocks of one file; 32-bit arithmetic throughout, wrapping.
std::uint64_t blocksOf(std::int64_t size, std::uint32_t blockSize) {
  if (blockSize == 0) return 0;
  return (static_cast<std::uint32_t>(size) + blockSize - 1U) / blockSize;
}

AssetPredicate predicateFor(bool synced) {
  AssetPredicate predicate;
  predicate.comparison = synced ? AssetPredicate::Comparison::kSavedAssetTypeEquals
                                : AssetPredicate::Comparison::kSavedAssetTypeDiffers;
  return predicate;
}

bool isNoSuchFile(const Error& error) {
  if (error.domain() == kPosixErrorDomain && error.code() == kNoSuchFile) return true;
  const Value underlying = error.userInfo()[kUnderlyingErrorKey];
  return underlying["domain"] == Value::string(kPosixErrorDomain) &&
         underlying["code"] == Value::integer(kNoSuchFile);
}

bool isAllDigits(const std::string& name) {
  return std::all_of(name.begin(), name.end(), [](char c) { return c >= '0' && c <= '9'; });
}

Value metrics(std::uint64_t bytes, std::uint64_t count) {
  return Value::dictionary(
      {{kPhysicalSize, Value::unsignedInteger(bytes)}, {kCount, Value::unsignedInteger(count)}});
}

bool backupIsRunning(FileSystem& files) {
  const FileSystem::LockAttempt attempt = files.tryLock(kBackupLockPath);
  return attempt.outcome == FileSystem::LockOutcome::kHeldElsewhere;
}

DispatchQueuePtr isolationQueue(Platform& platform) {
  return platform.once().value<DispatchQueuePtr>(
      kIsolationQueueLabel, [] { return DispatchQueue::serial(kIsolationQueueLabel); });
}

}  // namespace

Value KXSyncClient::installedAssetMetrics() {
  constexpr const char* kFunction = "installedAssetMetrics";
  KX_LOG(kAssetMetricsSource, kFunction, LogLevel::kInfo, "installedAssetMetrics");
  if (backupIsRunning(platform_.files())) {
    KX_LOG(kAssetMetricsSource, kFunction, LogLevel::kInfo,
           "Restore in progress, returning empty metrics");
    return Value::dictionary({});
  }
  Value result;
  isolationQueue(platform_)->sync([this, &result] {
    const KXPhotoLibraryPtr library = platform_.photoLibrary().newPhotoLibrary();
    const auto done = std::make_shared<DispatchSemaphore>(0);
    std::exception_ptr exception;
    library->performBlock([this, &result, &library, done, &exception] {
      try {
        result = measureAssets(library->managedObjectContext());
      } catch (...) {
        exception = std::current_exception();
      }
      done->signal();
    });
    done->wait();
    if (exception) std::rethrow_exception(exception);
  });
  return result;
}

Value KXSyncClient::measureAssets(KXManagedObjectContext& context) {
  const std::uint64_t syncedCount = _assetCountInManagedObjectContext(context, true);
  const std::uint64_t otherCount = _assetCountInManagedObjectContext(context, false);
  const std::uint64_t total = syncedCount + otherCount;
  const std::uint64_t syncedBlocks = _imageFileBlockCountInManagedObjectContext(context, true);
  const std::uint64_t otherBlocks = _imageFileBlockCountInManagedObjectContext(context, false);
  const std::uint64_t extra = _extraFileBlockCount();
  // Whole quotients on purpose: the extra blocks go to a kind that is alone, else to neither.
  const std::uint64_t syncedShare = total == 0 ? 0 : syncedCount / total;
  const std::uint64_t otherShare = total == 0 ? 0 : otherCount / total;
  const std::uint64_t blockSize = _fileSystemBlockSize();
  Value result = Value::dictionary(
      {{kKXPhotoDataclass, metrics(blockSize * (syncedBlocks + syncedShare * extra), syncedCount)},
       {kShoebox, metrics(blockSize * (otherShare * extra + otherBlocks), otherCount)}});
  KX_LOG(kAssetMetricsSource, "installedAssetMetrics", LogLevel::kInfo,
         "Installed Asset Metrics (Photos): %@", result);
  return result;
}

std::uint64_t KXSyncClient::_assetCountInManagedObjectContext(KXManagedObjectContext& context,
                                                              bool synced) {
  ErrorPtr error;
  const std::optional<std::uint64_t> count = context.countAssets(predicateFor(synced), &error);
  if (count) return *count;
  KX_LOG(kAssetMetricsSource, "_assetCountInManagedObjectContext", LogLevel::kError,
         "Error getting asset count: %@", error);
  return 0;
}

std::uint64_t KXSyncClient::_imageFileBlockCountInManagedObjectContext(
    KXManagedObjectContext& context, bool synced) {
  const std::uint32_t blockSize = _fileSystemBlockSize();
  const AssetPredicate predicate = predicateFor(synced);
  std::uint64_t blocks = 0;
  for (const auto& sizes : {context.originalFileSizes(predicate, nullptr),
                            context.sidecarFileSizes(predicate, nullptr)}) {
    if (!sizes) continue;
    for (const std::int64_t size : *sizes) blocks += blocksOf(size, blockSize);
  }
  return blocks;
}

StringList KXSyncClient::_allAssetDirectoryURLs() {
  KXPhotoLibraryFramework& framework = platform_.photoLibrary();
  StringList directories = {framework.dcimDirectory()};
  const std::string cascades = framework.cascadesDataDirectory();
  for (const std::string& name : platform_.files().contentsOfDirectory(cascades, nullptr)) {
    if (isAllDigits(name)) directories.push_back(pathByAppending(cascades, name));
  }
  directories.push_back(framework.tesselSyncedAssetsDirectory());
  return directories;
}

StringList KXSyncClient::_allAssetMetricBaseURLs() {
  KXPhotoLibraryFramework& framework = platform_.photoLibrary();
  return {framework.dcimDirectory(), framework.cascadesDataDirectory(),
          framework.photoDataDirectory()};
}

std::uint64_t KXSyncClient::_extraFileBlockCount() {
  constexpr const char* kFunction = "_extraFileBlockCount";
  FileSystem& files = platform_.files();
  const std::uint32_t blockSize = _fileSystemBlockSize();
  std::unordered_set<std::string> assetDirectories;
  for (const std::string& directory : _allAssetDirectoryURLs()) {
    std::string identifier = files.resourceIdentifier(directory);
    if (!identifier.empty()) assetDirectories.insert(std::move(identifier));
  }

  std::uint64_t total = 0;
  const auto onEntry = [&](const FileProperties& entry) {
    if (entry.error) {
      KX_LOG(kAssetMetricsSource, kFunction, LogLevel::kWarning,
             "Error getting properties of file \"%@\": %@", entry.path, entry.error);
      return EnumerationChoice::kDescend;
    }
    total += blocksOf(entry.fileSize, blockSize);
    // The files of camera folders are counted from the library.
    const bool isCameraFolder = entry.isDirectory &&
                                assetDirectories.contains(entry.parentResourceIdentifier) &&
                                isCameraFolderName(entry.name);
    return isCameraFolder ? EnumerationChoice::kSkipDescendants : EnumerationChoice::kDescend;
  };
  for (const std::string& base : _allAssetMetricBaseURLs()) {
    files.enumerate(base, onEntry, [&base](const std::string& /*path*/, const ErrorPtr& error) {
      if (error && isNoSuchFile(*error)) return;
      KX_LOG(kAssetMetricsSource, kFunction, LogLevel::kError,
             "Error enumerating files inside \"%@\": %@", base, error);
    });
  }
  return total;
}

std::uint32_t KXSyncClient::_fileSystemBlockSize() {
  Platform& platform = platform_;
  return platform.once().value<std::uint32_t>("KXSyncClient._fileSystemBlockSize", [&platform] {
    ErrorPtr error;
    const std::uint32_t size = platform.files().blockSize(platform.mobileHomeDirectory(), &error);
    if (!error) return size;
    // For the sync log alone, and from the framework's facility.
    const LogSite site{kAssetMetricsSource, "_fileSystemBlockSize", __LINE__, kLogFacility};
    const auto number = static_cast<int>(error->code());
    writeSyncLog(site, LogLevel::kError,
                 "statfs(2) failed. Unable to get file system block size: %s (%d)",
                 {std::generic_category().message(number), number});
    return kDefaultBlockSize;
  });
}

}  // namespace kx
