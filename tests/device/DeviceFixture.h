#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "device/DeviceLayout.h"
#include "device/ReferenceDevice.h"
#include "platform/foundation/PropertyList.h"
#include "testing/CapturingLogs.h"

namespace kx {

// A directory of a test's own that goes with it.
class TemporaryDirectory {
 public:
  TemporaryDirectory() {
    std::string pattern = (std::filesystem::temp_directory_path() / "kxdevice-XXXXXX").string();
    path_ = ::mkdtemp(pattern.data());
  }
  ~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

// A device in a directory of its own.
class DeviceTest : public ::testing::Test {
 protected:
  using Result = std::pair<std::size_t, ErrorPtr>;

  void SetUp() override { open(); }
  void TearDown() override { close(); }

  DeviceOptions options() {
    DeviceOptions options;
    options.root = directory_.path();
    options.create = true;
    options.logs = logs_.sinks();
    return options;
  }
  void open() { open(options()); }
  void open(const DeviceOptions& wanted) {
    ErrorPtr error;
    device_ = ReferenceDevice::open(wanted, &error);
    ASSERT_NE(device_, nullptr) << (error ? error->description() : "");
  }
  void close() {
    library_.reset();
    if (device_) device_->drain();
    device_.reset();
  }
  void reopen() {
    close();
    open();
  }

  ReferenceDevice& device() { return *device_; }
  Platform& platform() { return device_->platform(); }
  KXPhotoLibrary& library() {
    if (!library_) library_ = platform().photoLibrary().newPhotoLibrary();
    return *library_;
  }
  void transaction(const Block& block) {
    const auto group = std::make_shared<DispatchGroup>();
    library().withDispatchGroupPerformTransaction(group, block);
    group->wait();
  }
  void read(const Block& block) {
    const auto group = std::make_shared<DispatchGroup>();
    library().withDispatchGroupPerformBlock(group, block);
    group->wait();
  }
  DeviceDump dump(bool hash = false) {
    ErrorPtr error;
    DeviceDump all = device().dump(hash, &error);
    EXPECT_EQ(error, nullptr) << (error ? error->description() : "");
    return all;
  }

  // Where a device path is on the host.
  std::string at(const std::string& devicePath) const { return directory_.path() + devicePath; }
  void putFile(const std::string& devicePath, const std::string& content) {
    std::filesystem::create_directories(std::filesystem::path(at(devicePath)).parent_path());
    std::ofstream(at(devicePath), std::ios::binary) << content;
  }
  bool exists(const std::string& devicePath) const {
    return std::filesystem::exists(std::filesystem::symlink_status(at(devicePath)));
  }
  std::string content(const std::string& devicePath) const {
    std::ifstream file(at(devicePath), std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
  }
  // Device paths of the files below the synced-assets directory.
  std::vector<std::string> mediaFiles() const {
    std::vector<std::string> found;
    for (const auto& entry :
         std::filesystem::recursive_directory_iterator(at(device_paths::kSyncedAssets))) {
      if (!entry.is_directory())
        found.push_back(entry.path().string().substr(directory_.path().size()));
    }
    std::sort(found.begin(), found.end());
    return found;
  }

  // A job that imports a file, which is put into staging.
  KXSyncSaveJobPtr importJob(const std::string& uuid, const std::string& bytes,
                             std::vector<std::string> albumURIs = {}) {
    const std::string path = std::string(device_paths::kStaging) + "/" + std::to_string(++staged_);
    putFile(path, bytes);
    const KXSyncSaveJobPtr job = platform().sharedAssetsSaver().newSyncSaveJob();
    job->setOriginalAssetURL(path);
    job->setUuid(uuid);
    job->setIsVideo(false);
    job->setModificationDate(Date{100.0});
    job->setCreationDate(Date{50.0});
    job->setAlbumURIs(std::move(albumURIs));
    return job;
  }
  KXSyncSaveJobPtr sealJob() {
    const KXSyncSaveJobPtr job = platform().sharedAssetsSaver().newSyncSaveJob();
    job->setIsSyncComplete(true);
    job->setOriginalAssetURL(device_paths::kSnapshot);
    return job;
  }
  KXSyncSaveJobPtr cleanupJob(std::optional<Date> before) {
    const KXSyncSaveJobPtr job = platform().sharedAssetsSaver().newSyncSaveJob();
    job->setCleanupSyncState(true);
    job->setCleanupBeforeDate(before);
    return job;
  }
  Result save(const std::vector<KXSyncSaveJobPtr>& jobs) {
    std::vector<DataPtr> serialized;
    for (const KXSyncSaveJobPtr& job : jobs) serialized.push_back(job->serializedData());
    return saveData(std::move(serialized));
  }
  Result saveData(std::vector<DataPtr> jobs) {
    DispatchSemaphore done(0);
    Result result;
    platform().sharedAssetsSaver().saveSyncedAssets(
        std::move(jobs), [&](std::size_t imported, const ErrorPtr& outcome) {
          result = {imported, outcome};
          done.signal();
        });
    done.wait();
    device().drain();
    return result;
  }
  // A synced container of the kind, saved; gives its URI.
  std::string makeContainer(const std::string& uuid, int kind = kKXAlbumKindSyncedAlbum,
                            std::uint32_t pending = 0) {
    KXGenericAlbumPtr made;
    transaction([&] {
      made = kind == kKXAlbumKindSyncedAlbum   ? library().insertNewAlbum()
             : kind == kKXAlbumKindSyncedEvent ? library().insertNewSyncedEvent()
                                               : library().insertNewFaceAlbum();
      made->setUuid(uuid);
      made->setTitle(uuid);
      made->setKindValue(kind);
      made->setPendingItemsType(kKXPendingItemsSync);
      made->setPendingItemsCount(pending);
    });
    std::string uri;
    read([&] { uri = made->objectID().URIRepresentation(); });
    return uri;
  }
  // A snapshot file that lists these assets, all modified at 100 seconds after the reference date.
  void putSnapshot(const std::vector<std::string>& uuids, double modified = 100.0) {
    Array updates;
    for (const std::string& uuid : uuids) {
      updates.push_back(
          Value::dictionary({{"uuid", Value::string(uuid)},
                             {"itemType", Value::string("Asset")},
                             {"modificationDate", Value::real(3061152000.0 + modified)}}));
    }
    const Value root = Value::dictionary(
        {{"libraryUUID", Value::string("LIBRARY")}, {"updates", Value::array(std::move(updates))}});
    const auto bytes = writePropertyList(root, PropertyListFormat::kBinary, nullptr);
    ASSERT_TRUE(platform().files().writeFileAtomically(device_paths::kSnapshot, bytes, nullptr));
  }
  DeviceError failureOf(const std::string& uuid) {
    for (const auto& failure : device().health().importFailures()) {
      if (failure.uuid == uuid) return static_cast<DeviceError>(failure.error->code());
    }
    return static_cast<DeviceError>(0);
  }

  TemporaryDirectory directory_;
  CapturingLogs logs_;
  std::unique_ptr<ReferenceDevice> device_;
  KXPhotoLibraryPtr library_;
  int staged_ = 0;
};

inline const std::string kJpeg = std::string("\xFF\xD8\xFF\xE0") + "picture";
inline const std::string kUUID1 = "11111111-1111-4111-8111-111111111111";
inline const std::string kUUID2 = "22222222-2222-4222-8222-222222222222";
inline const std::string kUUID3 = "33333333-3333-4333-8333-333333333333";
inline const std::string kUUID4 = "44444444-4444-4444-8444-444444444444";

}  // namespace kx
