#include "daemon/BackupRunner.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include "backup/BackupErrors.h"
#include "backup/BackupReader.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

const std::string kCamera = "/var/mobile/Media/DCIM/100AB/";

// A sync log that looks at something when a message begins so.
class WatchingLog : public FRLog {
 public:
  WatchingLog(std::string prefix, std::function<void()> look)
      : prefix_(std::move(prefix)), look_(std::move(look)) {}
  bool takes(LogLevel) override { return true; }
  void write(const LogSite&, LogLevel, std::string_view message) override {
    if (message.starts_with(prefix_)) look_();
  }

 private:
  const std::string prefix_;
  const std::function<void()> look_;
};

// The plug-in's module on a real device that nobody else holds.
class BackupRunnerTest : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    putFile(kCamera + "1.JPG", "one");
    close();
  }
  void addAsset(const std::string& uuid, std::int32_t type, std::vector<std::int64_t> sidecars) {
    NewDeviceAsset asset;
    asset.uuid = uuid;
    asset.path = kCamera + "1.JPG";
    asset.savedAssetType = type;
    asset.originalFileSize = 5000;
    asset.sidecarSizes = std::move(sidecars);
    ASSERT_TRUE(device().admin().addAsset(asset, nullptr));
  }
  std::optional<DeviceMetrics> metrics(const LogSinks& logs = {}) {
    ErrorPtr error;
    auto found = readMetrics(directory_.path(), logs, &error);
    EXPECT_TRUE(found) << error->description();
    return found;
  }
  BackupOptions backupOptions() {
    BackupOptions options;
    options.deviceRoot = directory_.path();
    options.backupPath = other_.path() + "/backup";
    return options;
  }

  TemporaryDirectory other_;
  CancelToken cancel_;
};

TEST_F(BackupRunnerTest, TakesWhatThePlugInNames) {
  const BackupResult result = backUpDevice(backupOptions(), {}, {}, cancel_);
  ASSERT_EQ(result.error, nullptr) << result.error->description();
  EXPECT_EQ(result.manifest.paths, std::vector<std::string>{"DCIM"});
  EXPECT_EQ(result.manifest.files.size(), 1U);
  EXPECT_EQ(readBackupPaths(directory_.path(), {}, nullptr), std::vector<std::string>{"DCIM"});
}

TEST_F(BackupRunnerTest, TheDeviceIsHeldAndHasToBeFree) {
  open();
  const BackupResult refused = backUpDevice(backupOptions(), {}, {}, cancel_);
  ASSERT_NE(refused.error, nullptr);
  EXPECT_EQ(exitCodeForBackup(refused.error, false, cancel_), 7);
  EXPECT_NE(refused.error->message().find("pid " + std::to_string(::getpid())), std::string::npos);
  close();
  bool looked = false;
  const BackupResult result = backUpDevice(
      backupOptions(), {},
      [&](const BackupProgress&) {
        ErrorPtr error;
        EXPECT_EQ(ReferenceDevice::open(options(), &error), nullptr);
        EXPECT_EQ(error->code(), static_cast<std::int64_t>(DeviceError::kLocked));
        looked = true;
        return true;
      },
      cancel_);
  EXPECT_EQ(result.error, nullptr);
  EXPECT_TRUE(looked);
}

TEST_F(BackupRunnerTest, ASignalEndsIt) {
  cancel_.cancel(15);
  const BackupResult result = backUpDevice(backupOptions(), {}, {}, cancel_);
  ASSERT_NE(result.error, nullptr);
  EXPECT_EQ(exitCodeForBackup(result.error, false, cancel_), 143);
}

TEST_F(BackupRunnerTest, APlugInThatCannotBeLoadedIsNamed) {
  BackupOptions options = backupOptions();
  options.pluginPath = "/nowhere/plug-in.so";
  const BackupResult result = backUpDevice(options, {}, {}, cancel_);
  ASSERT_NE(result.error, nullptr);
  EXPECT_NE(result.error->message().find("/nowhere/plug-in.so"), std::string::npos);
  EXPECT_EQ(exitCodeForBackup(result.error, false, cancel_), 1);
}

TEST_F(BackupRunnerTest, EveryEndHasItsExitCode) {
  const std::vector<std::pair<BackupError, int>> rows = {
      {BackupError::kMissing, 1},  {BackupError::kNotOurs, 1},     {BackupError::kUnusable, 1},
      {BackupError::kInUse, 7},    {BackupError::kNoSpace, 6},     {BackupError::kIo, 1},
      {BackupError::kGuard, 4},    {BackupError::kDamagedFile, 1}, {BackupError::kNewerForm, 1},
      {BackupError::kCancelled, 1}};
  for (const auto& [error, code] : rows) {
    EXPECT_EQ(exitCodeForBackup(backupError(error, ""), true, cancel_), code);
  }
  EXPECT_EQ(exitCodeForBackup(nullptr, true, cancel_), 3);
  EXPECT_EQ(exitCodeForBackup(nullptr, false, cancel_), 0);
}

TEST_F(BackupRunnerTest, FiguresComeFromTheLibrary) {
  open();
  addAsset(kUUID1, 256, {1, 9000});
  addAsset(kUUID2, 256, {});
  addAsset(kUUID3, 0, {1});
  const std::uint64_t block = platform().files().blockSize("/var/mobile", nullptr);
  close();
  const auto blocks = [block](std::uint64_t bytes) { return (bytes + block - 1) / block * block; };
  const auto found = metrics();
  EXPECT_FALSE(found->backupRunning);
  EXPECT_EQ(found->photo.count, 2U);
  EXPECT_EQ(found->photo.physicalSize, 2 * blocks(5000) + blocks(1) + blocks(9000));
  EXPECT_EQ(found->shoebox.count, 1U);
  EXPECT_EQ(found->shoebox.physicalSize, blocks(5000) + blocks(1));
  EXPECT_GT(found->capacity, found->free);
}

TEST_F(BackupRunnerTest, TheLockIsLetGoBeforeMeasuring) {
  putFile("/tmp/BackupRunning", "");
  bool looked = false;
  const auto look = [&] {
    const int fd = ::open(at("/tmp/BackupRunning").c_str(), O_RDONLY | O_CLOEXEC);
    EXPECT_EQ(::flock(fd, LOCK_EX | LOCK_NB), 0);
    ::close(fd);
    looked = true;
  };
  LogSinks logs;
  logs.sync = std::make_shared<WatchingLog>("Installed Asset Metrics (Photos): ", look);
  EXPECT_FALSE(metrics(logs)->backupRunning);
  EXPECT_TRUE(looked);
}

TEST_F(BackupRunnerTest, WhileABackupRunsThereAreNoFigures) {
  bool looked = false;
  const BackupResult result = backUpDevice(
      backupOptions(), {},
      [&](const BackupProgress&) {
        const auto found = metrics();
        EXPECT_TRUE(found && found->backupRunning);
        looked = true;
        return true;
      },
      cancel_);
  EXPECT_EQ(result.error, nullptr);
  EXPECT_TRUE(looked);
  EXPECT_FALSE(metrics()->backupRunning);
}

}  // namespace
}  // namespace kx
