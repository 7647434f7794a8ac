#include "daemon/TransferLoop.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <stdexcept>

#include "tests/daemon/Support.h"

namespace kx::test {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

// The plug-in of these tests asks its platform for nothing.
class BarePlatform : public Platform {
 public:
  [[noreturn]] static void none() { throw std::logic_error("not part of this test"); }
  Clock& clock() override { none(); }
  FileSystem& files() override { none(); }
  KXPhotoLibraryFramework& photoLibrary() override { none(); }
  KXAssetsSaver& sharedAssetsSaver() override { none(); }
  KXPorterClient& porterClient() override { none(); }
  std::unique_ptr<QBManager> newBackupManager() override { none(); }
  LogSinks logs() override { none(); }
  std::unique_ptr<MemoryPressureSource> newMemoryPressureSource() override { none(); }
  bool isMainThread() override { none(); }
  std::string mobileHomeDirectory() override { none(); }
};

class StillHealth : public DeviceHealth {
 public:
  void reset() override { failure_ = nullptr; }
  void noteFailure(std::string, ErrorPtr error) override { failure_ = std::move(error); }
  void noteImportFailure(std::string, ErrorPtr) override {}
  bool anyFailure() const override { return failure_ != nullptr; }
  std::vector<ImportFailure> importFailures() const override { return {}; }
  ErrorPtr firstFailure() const override { return failure_; }

 private:
  ErrorPtr failure_;
};

class TransferLoopTest : public testing::Test {
 protected:
  void SetUp() override {
    std::filesystem::create_directory(work.at("device"));
    ErrorPtr error;
    staging = Staging::open(work.at("device"), &error);
    ASSERT_TRUE(staging);
    useScript(&script);
    plugin = std::make_unique<PluginHost>(scriptedPlugin(), platform);
    ASSERT_FALSE(plugin->createClient());
  }
  void add(const std::string& uuid, const std::string& content) {
    work.write("media/" + uuid, content);
    script.outstanding.push_back(downloadRequest(uuid));
  }
  TransferLoop& run() {
    loop = std::make_unique<TransferLoop>(
        TransferLoop::Context{link, *staging, *plugin, health, cancel, progress}, result);
    loop->run(script.outstanding);
    return *loop;
  }
  std::size_t stagedFiles() const {
    const auto entries =
        std::filesystem::directory_iterator(work.at("device/var/mobile/Media/Photos/Sync/Staging"));
    return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
  }

  TempDirectory work;
  DirectoryLink link{work.at("media")};
  BarePlatform platform;
  StillHealth health;
  CancelToken cancel;
  SyncProgressCallback progress;
  PluginScript script;
  SyncResult result;
  std::unique_ptr<Staging> staging;
  std::unique_ptr<PluginHost> plugin;
  std::unique_ptr<TransferLoop> loop;
};

TEST_F(TransferLoopTest, ReportsEachRequestOnceWithThePathOfItsFile) {
  add("A", "first");
  add("B", "second");
  std::vector<std::string> contents;
  script.duringTransfer = [&](const FRAssetPtr& request) {
    contents.push_back(work.read("device/var/mobile/Media/" + request->path().value()));
  };
  EXPECT_TRUE(run().allArrived());
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer A arrived", "assetTransfer B arrived"));
  EXPECT_THAT(contents, ElementsAre("first", "second"));
  EXPECT_THAT(script.onMainThread, testing::Each(false));
  EXPECT_EQ(result.requested, 2U);
  EXPECT_TRUE(result.failed.empty());
}

TEST_F(TransferLoopTest, WorksOverACopyOfTheList) {
  add("A", "first");
  add("B", "second");
  script.duringTransfer = [&](const FRAssetPtr&) { script.outstanding.clear(); };
  EXPECT_TRUE(run().allArrived());
  EXPECT_EQ(script.calls.size(), 2U);
}

TEST_F(TransferLoopTest, LeavesRestoreRequestsUnreportedAndUncounted) {
  script.outstanding.push_back(restoreRequest("R"));
  add("A", "first");
  EXPECT_TRUE(run().allArrived());
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer A arrived"));
  EXPECT_EQ(result.requested, 1U);
  EXPECT_THAT(link.opened, ElementsAre("A"));
}

TEST_F(TransferLoopTest, AFileThatTheHostLacksFailsOnceWithCode2) {
  script.outstanding = {downloadRequest("missing")};
  EXPECT_FALSE(run().allArrived());
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer missing failed FRError 2"));
  EXPECT_THAT(link.opened, ElementsAre("missing"));
  ASSERT_EQ(result.failed.size(), 1U);
  EXPECT_EQ(result.failed[0].uuid, "missing");
  EXPECT_EQ(result.failed[0].domain, "FRError");
  EXPECT_EQ(result.failed[0].code, 2);
  EXPECT_EQ(result.failed[0].reason, "the host does not have the file");
}

TEST_F(TransferLoopTest, AnErrorOfTheHostIsTriedThreeTimesThenFailsWithCode4) {
  add("A", "first");
  link.failures["A"] = EIO;
  EXPECT_FALSE(run().allArrived());
  EXPECT_EQ(link.opened.size(), 3U);
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer A failed FRError 4"));
  EXPECT_THAT(result.failed[0].reason, HasSubstr("Input/output error"));
}

TEST_F(TransferLoopTest, TwoRecoverableFailuresAreRetriedUnseen) {
  add("A", "first");
  link.failures["A"] = EACCES;
  link.failTimes["A"] = 2;
  EXPECT_TRUE(run().allArrived());
  EXPECT_EQ(link.opened.size(), 3U);
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer A arrived"));
}

TEST_F(TransferLoopTest, LinksAndPipesAtTheHostFailWithCode4) {
  work.write("secret", "secret");
  std::filesystem::create_directory(work.at("media"));
  std::filesystem::create_symlink("../secret", work.at("media/link"));
  ASSERT_EQ(::mkfifo(work.at("media/fifo").c_str(), 0600), 0);
  script.outstanding = {downloadRequest("link"), downloadRequest("fifo")};
  EXPECT_FALSE(run().allArrived());
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer link failed FRError 4",
                                        "assetTransfer fifo failed FRError 4"));
  EXPECT_EQ(stagedFiles(), 0U);
}

TEST_F(TransferLoopTest, AFileThatKeepsChangingFailsAndOneThatSettlesArrives) {
  const std::string large(9U << 20, 'x');
  add("restless", large);
  add("settling", large);
  int changes = 0;
  progress = [&](const SyncProgress& seen) {
    if (seen.bytesDone % large.size() == 0) return;
    const std::string& name = link.opened.back();
    if (name == "settling" && ++changes > 1) return;
    const timespec times[2] = {{1000 + changes, 0}, {static_cast<time_t>(link.opened.size()), 0}};
    ::utimensat(AT_FDCWD, work.at("media/" + name).c_str(), times, 0);
  };
  EXPECT_FALSE(run().allArrived());
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer restless failed FRError 4",
                                        "assetTransfer settling arrived"));
  EXPECT_THAT(link.opened, ElementsAre("restless", "restless", "restless", "settling", "settling"));
  EXPECT_EQ(result.failed[0].reason, "the file changed while it was read");
}

TEST_F(TransferLoopTest, AFullDeviceStopsAskingButReportsTheRest) {
  add("A", "first");
  add("B", "second");
  add("C", "third");
  script.duringTransfer = [&](const FRAssetPtr& request) {
    if (request->identifier() == "A") {
      health.noteFailure("batch", Error::make(kPosixErrorDomain, ENOSPC, "full"));
    }
  };
  EXPECT_FALSE(run().allArrived());
  EXPECT_TRUE(loop->isDiskFull());
  EXPECT_THAT(script.calls,
              ElementsAre("assetTransfer A arrived", "assetTransfer B failed FRError 7",
                          "assetTransfer C failed FRError 7"));
  EXPECT_THAT(link.opened, ElementsAre("A"));
}

TEST_F(TransferLoopTest, ACancellationBetweenFilesStopsBeforeTheNext) {
  add("A", "first");
  add("B", "second");
  script.duringTransfer = [&](const FRAssetPtr&) { cancel.cancel(SIGINT); };
  EXPECT_FALSE(run().allArrived());
  EXPECT_TRUE(loop->wasCancelled());
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer A arrived"));
  EXPECT_THAT(link.opened, ElementsAre("A"));
}

TEST_F(TransferLoopTest, ACancellationInsideAFileLeavesItUnreported) {
  add("A", std::string(30U << 20, 'x'));
  progress = [&](const SyncProgress& seen) {
    if (seen.bytesDone > 0) cancel.cancel(SIGTERM);
  };
  EXPECT_FALSE(run().allArrived());
  EXPECT_TRUE(loop->wasCancelled());
  EXPECT_THAT(script.calls, ElementsAre());
  EXPECT_EQ(stagedFiles(), 0U);
}

TEST_F(TransferLoopTest, ARaisingReportFailsThatAssetAloneAndFreesItsFile) {
  add("A", "first");
  add("B", "second");
  script.raiseAt = "assetTransfer";
  EXPECT_FALSE(run().allArrived());
  EXPECT_EQ(script.calls.size(), 2U);
  ASSERT_EQ(result.failed.size(), 2U);
  EXPECT_EQ(result.failed[0].domain, kSyncErrorDomain);
  EXPECT_EQ(result.failed[0].reason, "InternalInconsistency: raised in assetTransfer");
  EXPECT_EQ(stagedFiles(), 0U);
}

TEST_F(TransferLoopTest, ARequestToSendIsNotServed) {
  script.outstanding = {FRAsset::uploadAssetWithIdentifier("A", "Photo", std::nullopt)};
  EXPECT_FALSE(run().allArrived());
  EXPECT_THAT(script.calls, ElementsAre("assetTransfer A failed FRError 4"));
  EXPECT_TRUE(link.opened.empty());
}

TEST_F(TransferLoopTest, ProgressCountsFilesBytesAndFailures) {
  add("A", std::string(10U << 20, 'x'));
  add("B", "0123456789");
  script.outstanding.push_back(downloadRequest("missing"));
  std::vector<SyncProgress> seen;
  progress = [&](const SyncProgress& now) { seen.push_back(now); };
  run();
  ASSERT_GE(seen.size(), 5U);
  EXPECT_EQ(seen.front().filesTotal, 3U);
  EXPECT_EQ(seen.front().filesDone, 0U);
  for (std::size_t i = 1; i < seen.size(); ++i) {
    EXPECT_GE(seen[i].bytesDone, seen[i - 1].bytesDone);
    EXPECT_GE(seen[i].filesDone, seen[i - 1].filesDone);
  }
  EXPECT_EQ(seen.back().filesDone, 3U);
  EXPECT_EQ(seen.back().bytesDone, (10U << 20) + 10U);
  EXPECT_EQ(seen.back().bytesTotal, (10U << 20) + 10U);
  EXPECT_EQ(seen.back().failures, 1U);
}

}  // namespace
}  // namespace kx::test
