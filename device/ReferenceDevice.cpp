#include "device/ReferenceDevice.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <mutex>
#include <stdexcept>

#include "device/CutOffCommit.h"
#include "device/DeviceErrors.h"
#include "device/DeviceFileSystem.h"
#include "device/DeviceLayout.h"
#include "device/DeviceLibrary.h"
#include "device/DeviceLock.h"
#include "device/DeviceRecovery.h"
#include "device/DumpReader.h"
#include "device/FileMediaStore.h"
#include "device/HealthRecord.h"
#include "device/KernelMemoryPressure.h"
#include "device/LibrarySchema.h"
#include "device/OverlayFileSystem.h"
#include "device/PlannedMediaStore.h"
#include "device/Quarryd.h"
#include "device/StoreAdmin.h"
#include "device/SystemClock.h"

namespace kx {
namespace {

constexpr const char* kPressureFile = "/proc/pressure/memory";
constexpr std::size_t kGlobalQueueThreads = 2;

class DeviceSaver : public KXAssetsSaver {
 public:
  explicit DeviceSaver(Quarryd* quarryd, DispatchQueuePtr refusals)
      : quarryd_(quarryd), refusals_(std::move(refusals)) {}
  KXSyncSaveJobPtr newSyncSaveJob() override { return std::make_shared<KXSyncSaveJob>(); }
  void saveSyncedAssets(std::vector<DataPtr> jobs, Completion completion) override {
    if (quarryd_ != nullptr) {
      quarryd_->save(std::move(jobs), std::move(completion));
      return;
    }
    refusals_->async([completion = std::move(completion)] {
      if (completion) completion(0, systemError("cannot write", "the library", EROFS));
    });
  }

 private:
  Quarryd* const quarryd_;  // null on a read-only device
  const DispatchQueuePtr refusals_;
};

class DevicePorter : public KXPorterClient {
 public:
  explicit DevicePorter(Quarryd* quarryd) : quarryd_(quarryd) {}
  void updateRestoredAssetWithUUID(const std::optional<std::string>& uuid,
                                   const std::vector<std::string>& paths) override {
    if (quarryd_ != nullptr) quarryd_->updateRestoredAsset(uuid, paths);
  }
  void finalizeOTARestoreRecreatingAlbums(bool recreateAlbums) override {
    if (quarryd_ != nullptr) quarryd_->finalizeRestore(recreateAlbums);
  }

 private:
  Quarryd* const quarryd_;
};

// The files that a restore is bringing back; outside of one there are none.
class RestoreFiles : public QBManager {
 public:
  explicit RestoreFiles(std::vector<QBFile> files) : files_(std::move(files)) {}
  std::optional<std::vector<QBFile>> restoreFilesForDomain(const std::string&, ErrorPtr*) override {
    return files_;
  }

 private:
  const std::vector<QBFile> files_;
};

// 0 when the directory could be made where it is missing, else the errno that this would give.
int whyNotMakeable(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  const std::size_t slash = path.rfind('/');
  const std::string parent = slash == std::string::npos ? "." : path.substr(0, slash + 1);
  struct stat status;
  if (::stat(parent.c_str(), &status) != 0) return errno;
  if (!S_ISDIR(status.st_mode)) return ENOTDIR;
  return ::access(parent.c_str(), W_OK | X_OK) == 0 ? 0 : errno;
}

class StoreDevice : public ReferenceDevice, public Platform {
 public:
  explicit StoreDevice(const DeviceOptions& options)
      : options_(options), log_(options.logs), health_(log_) {}
  ~StoreDevice() override;

  // Null, or why the device cannot be had.
  ErrorPtr start();

  // ReferenceDevice
  Platform& platform() override { return *this; }
  DeviceHealth& health() override { return health_; }
  LibraryChanges takeChanges() override { return store_->takeChanges(); }
  DeviceCounters takeCounters() override { return store_->takeCounters(); }
  DeviceAdmin& admin() override { return *admin_; }
  DeviceRoot& root() override { return *root_; }
  void setRestoreFiles(std::optional<std::vector<QBFile>> files) override;
  void drain() override;
  DeviceDump dump(bool hash, ErrorPtr* error) override;
  void readAhead() override { readAhead_->start(store_); }
  void stopReadingAhead() override { readAhead_->stop(*store_); }
  LibraryDifference difference(const LibraryChanges& changes, ErrorPtr* error) override;

  // Platform
  Clock& clock() override { return options_.clock != nullptr ? *options_.clock : systemClock_; }
  FileSystem& files() override { return *files_; }
  KXPhotoLibraryFramework& photoLibrary() override { return *framework_; }
  KXAssetsSaver& sharedAssetsSaver() override { return *saver_; }
  KXPorterClient& porterClient() override { return *porter_; }
  std::unique_ptr<QBManager> newBackupManager() override;
  LogSinks logs() override { return options_.logs; }
  std::unique_ptr<MemoryPressureSource> newMemoryPressureSource() override {
    return std::make_unique<KernelMemoryPressure>(globalQueue_, kPressureFile);
  }
  bool isMainThread() override { return ::syscall(SYS_gettid) == ::getpid(); }
  std::string mobileHomeDirectory() override { return device_paths::kMobileHome; }

 private:
  ErrorPtr openRoot();
  ErrorPtr openForReading();
  ErrorPtr openForWriting();
  ErrorPtr openForPlanning();
  ErrorPtr makeTree();
  void startQuarryd(std::unique_ptr<MediaStore> media);
  void makeStore(OpenedLibrary library);

  const DeviceOptions options_;
  const DeviceLog log_;
  HealthRecord health_;
  SystemClock systemClock_;
  std::shared_ptr<DeviceRoot> root_;
  std::unique_ptr<DeviceLock> lock_;
  std::shared_ptr<LibraryStore> store_;
  std::unique_ptr<DeviceFileSystem> realFiles_;
  std::unique_ptr<OverlayFileSystem> plannedFiles_;  // of a device for planning
  FileSystem* files_ = nullptr;                      // the ones in use
  std::unique_ptr<SqliteDatabase> before_;           // of a device for planning that is there
  const std::shared_ptr<ReadAhead> readAhead_ = std::make_shared<ReadAhead>();
  std::unique_ptr<DeviceLibraryFramework> framework_;
  std::unique_ptr<StoreAdmin> admin_;
  std::unique_ptr<Quarryd> quarryd_;
  std::unique_ptr<DeviceSaver> saver_;
  std::unique_ptr<DevicePorter> porter_;
  std::atomic<bool> isUnsealed_{false};
  DispatchQueuePtr globalQueue_;
  std::mutex restoreMutex_;
  std::vector<QBFile> restoreFiles_;
};

ErrorPtr StoreDevice::openRoot() {
  ErrorPtr error;
  const bool create = options_.create && !options_.readOnly && !options_.planOnly;
  root_ = DeviceRoot::open(options_.root, create, &error);
  if (root_ || !options_.planOnly) return error;
  if (error->code() != static_cast<std::int64_t>(DeviceError::kMissing)) return error;
  if (const int refused = whyNotMakeable(options_.root); refused != 0) {
    return systemError("cannot make", options_.root, refused);
  }
  root_ = DeviceRoot::ofMissing(options_.root);
  return nullptr;
}

ErrorPtr StoreDevice::start() {
  if (ErrorPtr failed = openRoot()) return failed;
  const bool reads = options_.readOnly || options_.planOnly;
  realFiles_ = std::make_unique<DeviceFileSystem>(root_, reads);
  files_ = realFiles_.get();
  if (options_.planOnly) {
    plannedFiles_ = std::make_unique<OverlayFileSystem>(*realFiles_);
    files_ = plannedFiles_.get();
  }
  globalQueue_ = DispatchQueue::concurrent("com.veltro.global.default", kGlobalQueueThreads);
  if (ErrorPtr failed = options_.planOnly   ? openForPlanning()
                        : options_.readOnly ? openForReading()
                                            : openForWriting()) {
    return failed;
  }
  framework_ = std::make_unique<DeviceLibraryFramework>(store_, readAhead_);
  admin_ = std::make_unique<StoreAdmin>(root_, store_);
  saver_ = std::make_unique<DeviceSaver>(quarryd_.get(), globalQueue_);
  porter_ = std::make_unique<DevicePorter>(quarryd_.get());
  return nullptr;
}

ErrorPtr StoreDevice::openForReading() {
  struct stat status;
  const int failed = root_->status(device_paths::kDatabase, &status);
  if (failed == ENOENT || failed == ENOTDIR) {
    return deviceError(DeviceError::kNotOurs, options_.root + " holds no photo library");
  }
  if (failed != 0) return systemError("cannot open", device_paths::kDatabase, failed);
  ErrorPtr error;
  OpenedLibrary library =
      openLibraryForReading(root_->hostPath() + device_paths::kDatabase, &error);
  if (!library.database) return error;
  makeStore(std::move(library));
  return nullptr;
}

ErrorPtr StoreDevice::makeTree() {
  using namespace device_paths;
  for (const char* path : {kTemporary, kDcim, kPhotoData, kCaches, kCascades, kSyncedAssets,
                           kFaceThumbnails, kSync, kStaging}) {
    ErrorPtr error;
    if (!files_->createDirectoryWithIntermediates(path, &error)) {
      return systemError("cannot make", path, static_cast<int>(error->code()));
    }
  }
  return nullptr;
}

ErrorPtr StoreDevice::openForWriting() {
  struct stat status;
  const int present = root_->status(device_paths::kDatabase, &status);
  if (present != 0 && present != ENOENT && present != ENOTDIR) {
    return systemError("cannot open", device_paths::kDatabase, present);
  }
  if (present != 0 && !options_.create) {
    return deviceError(DeviceError::kNotOurs, options_.root + " holds no photo library");
  }
  if (ErrorPtr failed = makeTree()) return failed;
  ErrorPtr error;
  lock_ = DeviceLock::take(root_, &error);
  if (!lock_) return error;
  if (const int failed = lock_->markInUse(); failed != 0) {
    return systemError("cannot write", device_paths::kLock, failed);
  }
  if (options_.beforeLibrary) {
    if (ErrorPtr failed = options_.beforeLibrary(root_)) return failed;
  }
  OpenedLibrary library =
      openLibraryForWriting(root_->hostPath() + device_paths::kDatabase, &error);
  if (!library.database) return error;
  if (library.isNew) {
    const int failed = root_->remove(device_paths::kLastSynced);
    if (failed != 0 && failed != ENOENT) {
      return systemError("cannot remove", device_paths::kLastSynced, failed);
    }
  }
  makeStore(std::move(library));
  // The store is used by this thread alone until its queue gets its first block.
  const std::optional<CleanState> last = options_.beforeLibrary ? std::nullopt : lock_->lastState();
  if (ErrorPtr failed = DeviceRecovery(root_, *files_, *store_).run(last)) return failed;
  health_.reset();
  startQuarryd(std::make_unique<FileMediaStore>(root_));
  return nullptr;
}

ErrorPtr StoreDevice::openForPlanning() {
  ErrorPtr error;
  lock_ = DeviceLock::share(root_, &error);
  if (error) return error;
  if (ErrorPtr failed = makeTree()) return failed;
  struct stat status;
  const int present = root_->status(device_paths::kDatabase, &status);
  if (present != 0 && present != ENOENT && present != ENOTDIR) {
    return systemError("cannot open", device_paths::kDatabase, present);
  }
  PlannedLibrary planned;
  if (present == 0 && hasCutOffCommit(*root_)) {
    if (const int failed = readBeforeCutOffCommit(*root_, &planned.bytes); failed != 0) {
      return systemError("cannot read", device_paths::kDatabase, failed);
    }
  } else if (present == 0) {
    planned.hostPath = root_->hostPath() + device_paths::kDatabase;
  }
  OpenedLibrary library = openLibraryForPlanning(planned, &error);
  if (!library.database) return error;
  if (library.isNew) {
    files_->removeItem(device_paths::kLastSynced, nullptr);
  } else {
    before_ = openLibraryBeforePlan(planned, &error);
    if (!before_) return error;
  }
  makeStore(std::move(library));
  const std::optional<CleanState> last = lock_ ? lock_->lastState() : std::nullopt;
  if (ErrorPtr failed = DeviceRecovery(root_, *files_, *store_).run(last)) return failed;
  health_.reset();
  startQuarryd(std::make_unique<PlannedMediaStore>());
  return nullptr;
}

void StoreDevice::startQuarryd(std::unique_ptr<MediaStore> media) {
  if (options_.decorateMedia) media = options_.decorateMedia(std::move(media));
  Quarryd::Parts parts;
  parts.root = root_;
  parts.store = store_;
  parts.media = std::move(media);
  parts.files = files_;
  parts.filesPerFolder = options_.filesPerFolder;
  quarryd_ = std::make_unique<Quarryd>(std::move(parts));
  // With the first commit after the seal is gone the worst throng of a sync is over.
  realFiles_->setOnRemoved([this](const std::string& path) {
    if (path == device_paths::kLastSynced) isUnsealed_ = true;
  });
  store_->setOnCommit([this] {
    if (isUnsealed_.exchange(false)) quarryd_->expectSeal();
  });
  store_->setFileReleaser(
      [this](std::vector<std::string> paths) { quarryd_->removeFiles(std::move(paths)); });
}

void StoreDevice::makeStore(OpenedLibrary library) {
  LibraryStore::Parts parts;
  parts.database = std::move(library.database);
  parts.files = files_;
  parts.planOnly = options_.planOnly;
  parts.health = &health_;
  parts.log = &log_;
  parts.readOnly = options_.readOnly;
  store_ = std::make_shared<LibraryStore>(std::move(parts));
}

void StoreDevice::setRestoreFiles(std::optional<std::vector<QBFile>> files) {
  if (quarryd_) quarryd_->setRestoring(files.has_value());
  const std::lock_guard<std::mutex> lock(restoreMutex_);
  restoreFiles_ = files ? std::move(*files) : std::vector<QBFile>();
}

std::unique_ptr<QBManager> StoreDevice::newBackupManager() {
  const std::lock_guard<std::mutex> lock(restoreMutex_);
  return std::make_unique<RestoreFiles>(restoreFiles_);
}

void StoreDevice::drain() {
  // Work of the library may give work to quarryd and the other way round.
  store_->queue().drain();
  if (quarryd_) quarryd_->drain();
  store_->queue().drain();
  if (quarryd_) quarryd_->drain();
}

DeviceDump StoreDevice::dump(bool hash, ErrorPtr* error) {
  DeviceDump dump;
  ErrorPtr failure;
  const auto read = [&] {
    try {
      dump = readDump(store_->database());
    } catch (const SqliteError& problem) {
      failure = problem.asError();
    }
  };
  if (store_->queue().isCurrent()) {
    read();
  } else {
    store_->queue().sync(read);
  }
  if (failure) {
    setError(error, failure);
    return {};
  }
  addFilesToDump(*root_, hash, &dump);
  return dump;
}

LibraryDifference StoreDevice::difference(const LibraryChanges& changes, ErrorPtr* error) {
  LibraryDifference difference;
  ErrorPtr failure;
  store_->queue().sync([&] {
    try {
      difference = differenceOf(before_.get(), store_->database(), changes);
    } catch (const SqliteError& problem) {
      failure = problem.asError();
    }
  });
  if (failure) setError(error, failure);
  return difference;
}

StoreDevice::~StoreDevice() {
  if (!store_) return;
  stopReadingAhead();
  drain();
  const bool filesLeft = !quarryd_ || quarryd_->leftFilesBehind();
  store_->queue().sync([this] {
    store_->setFileReleaser(nullptr);
    store_->setOnCommit(nullptr);
  });
  realFiles_->setOnRemoved(nullptr);
  porter_.reset();
  saver_.reset();
  quarryd_.reset();
  store_->queue().drain();
  framework_.reset();
  admin_.reset();
  // Libraries that are still held keep the store, and with it the database, open.
  const bool lastUser = store_.use_count() == 1;
  store_.reset();
  if (!lock_ || filesLeft || !lastUser || options_.planOnly) return;
  if (const int failed = lock_->markClean(CleanState::of(*root_)); failed != 0) {
    log_.failure("the device is not marked as clean",
                 systemError("cannot write", device_paths::kLock, failed));
  }
}

}  // namespace

std::unique_ptr<ReferenceDevice> ReferenceDevice::open(const DeviceOptions& options,
                                                       ErrorPtr* error) {
  try {
    auto device = std::make_unique<StoreDevice>(options);
    ErrorPtr failure = device->start();
    if (!failure) return device;
    setError(error, std::move(failure));
  } catch (const SqliteError& problem) {
    setError(error, problem.asError());
  } catch (const std::exception& problem) {
    setError(error, deviceError(DeviceError::kIo, problem.what()));
  }
  return nullptr;
}

}  // namespace kx
