#include "client/CameraFolderName.h"
#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class AssetMetricsTest : public ClientTest {
 protected:
  static constexpr const char* kMetricsSource = "KXSyncClient+AssetMetrics";
  void addAsset(std::int32_t type, std::optional<std::int64_t> size,
                std::vector<std::int64_t> sidecars = {}) {
    AssetSeed seed;
    seed.uuid = "U" + std::to_string(next_++);
    seed.savedAssetType = type;
    seed.originalFilesize = size;
    seed.sidecarSizes = std::move(sidecars);
    platform.library.addAsset(seed);
  }
  static Value metrics(std::uint64_t photoBytes, std::uint64_t photoCount,
                       std::uint64_t shoeboxBytes, std::uint64_t shoeboxCount) {
    const auto one = [](std::uint64_t bytes, std::uint64_t count) {
      return Value::dictionary({{"_PhysicalSize", Value::unsignedInteger(bytes)},
                                {"_Count", Value::unsignedInteger(count)}});
    };
    return Value::dictionary(
        {{"Photo", one(photoBytes, photoCount)}, {"Shoebox", one(shoeboxBytes, shoeboxCount)}});
  }
  std::uint64_t extraBlocks() { return client->_extraFileBlockCount(); }

 private:
  int next_ = 0;
};

TEST_F(AssetMetricsTest, CountsBlocksOfBothKinds) {
  addAsset(256, 1, {4097});
  addAsset(256, std::nullopt);
  addAsset(0, 4096);
  EXPECT_EQ(client->installedAssetMetrics(), metrics(3 * 4096, 2, 4096, 1));
  EXPECT_TRUE(logged(LogLevel::kInfo, "installedAssetMetrics"));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Installed Asset Metrics (Photos): " +
                                          metrics(3 * 4096, 2, 4096, 1).description()));
  EXPECT_EQ(platform.captured.firstWithPrefix("installedAssetMetrics").source, kMetricsSource);
  drain();
  EXPECT_EQ(platform.library.openLibraries(), 0U);
  EXPECT_EQ(client->library(), nullptr);
}

TEST_F(AssetMetricsTest, ABackupThatHoldsTheLockGivesNothing) {
  platform.memoryFiles.putText("/tmp/BackupRunning", "");
  platform.memoryFiles.setLockedElsewhere("/tmp/BackupRunning", true);
  EXPECT_EQ(client->installedAssetMetrics(), Value::dictionary({}));
  EXPECT_TRUE(logged(LogLevel::kInfo, "Restore in progress, returning empty metrics"));
  EXPECT_EQ(platform.library.openedLibraries(), 0U);
  platform.memoryFiles.setLockedElsewhere("/tmp/BackupRunning", false);
  EXPECT_EQ(client->installedAssetMetrics(), metrics(0, 0, 0, 0));
  platform.memoryFiles.removeItem("/tmp/BackupRunning", nullptr);
  EXPECT_EQ(client->installedAssetMetrics(), metrics(0, 0, 0, 0));
}

TEST_F(AssetMetricsTest, ExtraBlocksGoToAKindThatIsAlone) {
  platform.memoryFiles.putSize("/var/mobile/Media/PhotoData/extra", 5000);
  EXPECT_EQ(client->installedAssetMetrics(), metrics(0, 0, 0, 0));
  addAsset(256, 1);
  EXPECT_EQ(client->installedAssetMetrics(), metrics(3 * 4096, 1, 0, 0));
  addAsset(0, 1);
  EXPECT_EQ(client->installedAssetMetrics(), metrics(4096, 1, 4096, 1));
  platform.library.perform([](InMemoryLibraryState& state) {
    state.store.removeAsset(state.store.assetWithUUID("U0"));
  });
  EXPECT_EQ(client->installedAssetMetrics(), metrics(0, 0, 3 * 4096, 1));
}

TEST_F(AssetMetricsTest, BlocksAreCountedInThirtyTwoBits) {
  struct Row {
    std::int64_t size;
    std::uint64_t blocks;
  };
  const std::vector<Row> rows = {{0, 0},
                                 {1, 1},
                                 {4096, 1},
                                 {4097, 2},
                                 {4294963200, 1048575},
                                 {4294963201, 0},  // the sum wraps
                                 {4294967296 + 1, 1},
                                 {-1, 0}};
  const std::string file = "/var/mobile/Media/PhotoData/extra";
  for (const Row& row : rows) {
    platform.memoryFiles.putSize(file, row.size);
    EXPECT_EQ(extraBlocks(), row.blocks) << row.size;
  }
}

TEST_F(AssetMetricsTest, FailedFetchesCountNothing) {
  addAsset(256, 1, {1});
  platform.library.setFault([](std::string_view operation) {
    return operation == "countAssets" ? Error::make("Store", 3) : nullptr;
  });
  EXPECT_EQ(client->installedAssetMetrics(), metrics(2 * 4096, 0, 0, 0));
  EXPECT_EQ(platform.captured.count(LogLevel::kError,
                                    "Error getting asset count: Error Domain=Store Code=3"),
            2U);
  platform.library.setFault([](std::string_view operation) {
    return operation == "originalFileSizes" ? Error::make("Store", 3) : nullptr;
  });
  EXPECT_EQ(client->installedAssetMetrics(), metrics(4096, 1, 0, 0));
}

TEST_F(AssetMetricsTest, TheBlockSizeIsAskedForOncePerPlatform) {
  platform.memoryFiles.setBlockSize(512);
  EXPECT_EQ(client->_fileSystemBlockSize(), 512U);
  platform.memoryFiles.setBlockSize(1024);
  EXPECT_EQ(client->_fileSystemBlockSize(), 512U);
  EXPECT_EQ(KXSyncClient(platform)._fileSystemBlockSize(), 512U);
  TestPlatform other;
  other.memoryFiles.setBlockSize(2048);
  EXPECT_EQ(KXSyncClient(other)._fileSystemBlockSize(), 2048U);
}

TEST_F(AssetMetricsTest, ABlockSizeThatCannotBeHadIsTheDefaultAndLoggedInTheSyncLogAlone) {
  platform.faultyFiles.setFault([](std::string_view operation, const std::string& path) {
    return operation == "blockSize" && path == "/var/mobile" ? posixError(5) : nullptr;
  });
  EXPECT_EQ(client->_fileSystemBlockSize(), 4096U);
  const CapturedMessage message = platform.captured.firstWithPrefix("statfs(2) failed.");
  EXPECT_EQ(message.text,
            "statfs(2) failed. Unable to get file system block size: Input/output error (5)");
  EXPECT_EQ(message.level, LogLevel::kError);
  EXPECT_EQ(message.facility, kLogFacility);
  EXPECT_EQ(message.source, kMetricsSource);
  for (const CapturedMessage& other : platform.captured.libraryMessages()) {
    EXPECT_FALSE(other.text.starts_with("statfs"));
  }
}

TEST_F(AssetMetricsTest, ABlockSizeOfZeroCountsNothing) {
  platform.memoryFiles.setBlockSize(0);
  addAsset(256, 5000);
  EXPECT_EQ(client->installedAssetMetrics(), metrics(0, 1, 0, 0));
}

TEST_F(AssetMetricsTest, CameraFoldersArePrunedInAssetDirectoriesAlone) {
  struct Row {
    const char* path;
    std::uint64_t blocks;
  };
  const std::vector<Row> rows = {{"/var/mobile/Media/DCIM/100AB/f", 0},
                                 {"/var/mobile/Media/DCIM/100ABCDE/f", 0},
                                 {"/var/mobile/Media/DCIM/999AB/f", 0},
                                 {"/var/mobile/Media/DCIM/100ABCDEF/f", 1},
                                 {"/var/mobile/Media/DCIM/100A/f", 1},
                                 {"/var/mobile/Media/DCIM/99AB/f", 1},
                                 {"/var/mobile/Media/DCIM/1000AB/f", 1},
                                 {"/var/mobile/Media/DCIM/x/100AB/f", 1},
                                 {"/var/mobile/Media/PhotoData/100AB/f", 1},
                                 {"/var/mobile/Media/PhotoData/Sync/100AB/f", 0},
                                 {"/var/mobile/Media/CascadesData/100AB/f", 1},
                                 {"/var/mobile/Media/CascadesData/12/100AB/f", 0},
                                 {"/var/mobile/Media/CascadesData/12a/100AB/f", 1},
                                 {"/var/mobile/Media/Elsewhere/f", 0}};
  for (const Row& row : rows) {
    platform.memoryFiles.putSize(row.path, 1);
    EXPECT_EQ(extraBlocks(), row.blocks) << row.path;
    platform.memoryFiles.removeItem(row.path, nullptr);
  }
}

TEST_F(AssetMetricsTest, DirectoriesCountToo) {
  platform.memoryFiles.setDirectorySize(4096);
  platform.memoryFiles.putSize("/var/mobile/Media/DCIM/100AB/f", 1);
  EXPECT_EQ(extraBlocks(), 1U);  // the pruned folder itself
}

TEST_F(AssetMetricsTest, TheDirectoriesAreListedInOrder) {
  for (const char* name : {"12/x", "7/x", "abc/x"}) {
    platform.memoryFiles.putText(std::string("/var/mobile/Media/CascadesData/") + name, "");
  }
  EXPECT_EQ(client->_allAssetDirectoryURLs(),
            (Texts{"/var/mobile/Media/DCIM", "/var/mobile/Media/CascadesData/12",
                   "/var/mobile/Media/CascadesData/7", "/var/mobile/Media/PhotoData/Sync"}));
  EXPECT_EQ(client->_allAssetMetricBaseURLs(),
            (Texts{"/var/mobile/Media/DCIM", "/var/mobile/Media/CascadesData",
                   "/var/mobile/Media/PhotoData"}));
  platform.faultyFiles.setFault([](std::string_view operation, const std::string&) {
    return operation == "contentsOfDirectory" ? posixError(5) : nullptr;
  });
  EXPECT_EQ(client->_allAssetDirectoryURLs().size(), 2U);
}

TEST_F(AssetMetricsTest, AnEntryThatCannotBeReadIsLoggedAndLeftOut) {
  const std::string bad = "/var/mobile/Media/DCIM/bad";
  platform.memoryFiles.putSize(bad, 1);
  platform.memoryFiles.putSize("/var/mobile/Media/DCIM/good", 1);
  platform.faultyFiles.setFault([bad](std::string_view operation, const std::string& path) {
    return operation == "fileProperties" && path == bad ? posixError(13) : nullptr;
  });
  EXPECT_EQ(extraBlocks(), 1U);
  EXPECT_TRUE(logged(LogLevel::kWarning, "Error getting properties of file \"" + bad +
                                             "\": Error Domain=POSIX Code=13"));
}

TEST_F(AssetMetricsTest, EnumerationErrorsAreLoggedExceptForWhatIsGone) {
  const ErrorPtr wrapped = std::make_shared<const Error>(
      "Store", 9,
      Value::dictionary(
          {{kUnderlyingErrorKey, Value::dictionary({{"domain", Value::string(kPosixErrorDomain)},
                                                    {"code", Value::integer(2)}})}}));
  struct Row {
    ErrorPtr error;
    bool isLogged;
  };
  const std::vector<Row> rows = {{posixError(2), false},
                                 {wrapped, false},
                                 {posixError(13), true},
                                 {Error::make("S", 2), true}};
  for (const Row& row : rows) {
    platform.captured.clear();
    platform.faultyFiles.setFault([&row](std::string_view operation, const std::string& path) {
      return operation == "enumerate" && path == "/var/mobile/Media/DCIM" ? row.error : nullptr;
    });
    platform.memoryFiles.putSize("/var/mobile/Media/PhotoData/f", 1);
    EXPECT_EQ(extraBlocks(), 1U);
    EXPECT_EQ(logged(LogLevel::kError,
                     "Error enumerating files inside "
                     "\"/var/mobile/Media/DCIM\": " +
                         row.error->description()),
              row.isLogged);
    EXPECT_EQ(platform.captured.texts().size(), row.isLogged ? 1U : 0U);
  }
}

TEST(CameraFolderNameTest, AreThreeDigitsAndAShortWord) {
  struct Row {
    const char* name;
    bool expected;
  };
  const std::vector<Row> rows = {{"100AB", true},
                                 {"100ABCDE", true},
                                 {"999zz", true},
                                 {"100ABCDEF", false},
                                 {"100A", false},
                                 {"99AB", false},
                                 {"1000AB", false},
                                 {"AB", false},
                                 {"", false},
                                 {" 100AB", true},
                                 {"\t\n100AB", true},
                                 {"+100AB", true},
                                 {"-100AB", false},
                                 {"0100AB", true},
                                 {"100AB1", false},
                                 {"100AB ", false},
                                 {"100_AB", false},
                                 {"99999999999999999999AB", false},
                                 {"100\xC3\xA4\xC3\xB6", true},
                                 {"100\xF0\x90\x90\x80", true},
                                 {"100\xE2\x82\xAC\xE2\x82\xAC", false},
                                 {"100\xC3", false},
                                 {"100\x80\x80", false}};
  for (const Row& row : rows) EXPECT_EQ(isCameraFolderName(row.name), row.expected) << row.name;
}

}  // namespace
}  // namespace kx
