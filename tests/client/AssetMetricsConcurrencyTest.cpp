#include <atomic>
#include <thread>

#include "tests/client/ClientFixture.h"

namespace kx {
namespace {

class AssetMetricsConcurrencyTest : public ClientTest {};

TEST_F(AssetMetricsConcurrencyTest, RequestsNeverOverlapWhicheverClientMakesThem) {
  constexpr int kPatience = 200;
  KXSyncClient other(platform);
  std::thread second;
  std::atomic<bool> started{false};
  platform.faultyFiles.setFault([&](std::string_view operation, const std::string&) {
    // In the middle of the first measuring a second request is made, as far as it comes.
    if (operation != "enumerate" || started.exchange(true)) return ErrorPtr();
    second = std::thread([&] { other.installedAssetMetrics(); });
    while (platform.captured.count(LogLevel::kInfo, "installedAssetMetrics") < 2) {
      std::this_thread::yield();
    }
    for (int i = 0; i < kPatience; ++i) std::this_thread::yield();
    EXPECT_EQ(platform.library.openedLibraries(), 1U);
    return ErrorPtr();
  });
  client->installedAssetMetrics();
  second.join();
  EXPECT_EQ(platform.library.openedLibraries(), 2U);
  EXPECT_EQ(platform.captured.count(LogLevel::kInfo, "installedAssetMetrics"), 2U);
}

TEST_F(AssetMetricsConcurrencyTest, TheBlockSizeIsAskedForOnceOnAllThreads) {
  std::atomic<int> asked{0};
  platform.faultyFiles.setFault([&](std::string_view operation, const std::string&) {
    if (operation == "blockSize") ++asked;
    return ErrorPtr();
  });
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([this] { KXSyncClient(platform)._fileSystemBlockSize(); });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(asked, 1);
}

}  // namespace
}  // namespace kx
