#include "daemon/SyncRunner.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <csignal>
#include <filesystem>

#include "daemon/LibrarySwitch.h"
#include "platform/foundation/PropertyList.h"
#include "tests/daemon/FakeDevice.h"
#include "tests/daemon/Support.h"

namespace kx::test {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr const char* kLibrary = "11111111-1111-1111-1111-111111111111";

class SyncRunnerTest : public testing::Test {
 protected:
  void SetUp() override {
    std::filesystem::create_directory(work.at("device"));
    options.deviceRoot = work.at("device");
    options.plugin = scriptedPlugin();
    options.reserveBytes = 0;
    useScript(&script);
    host({"A", "B"});
    // What a whole sync leaves behind.
    device.memory.memoryFiles.putText(KXPreviousMetadataSyncFilePath, "sealed");
  }
  // A host that lists these assets and has their files.
  void host(const std::vector<std::string>& uuids) {
    std::vector<Value> updates;
    for (const std::string& uuid : uuids) {
      updates.push_back(assetItem(uuid));
      work.write("media/" + uuid, "bytes of " + uuid);
    }
    link.snapshotBytes = plistBytes(snapshotRoot(updates));
  }
  void ask(const std::vector<std::string>& uuids) {
    for (const std::string& uuid : uuids) script.outstanding.push_back(downloadRequest(uuid));
  }
  void seedAssets(std::size_t count, const std::string& prefix = "old") {
    for (std::size_t i = 0; i < count; ++i) {
      AssetSeed seed;
      seed.uuid = prefix + std::to_string(i);
      device.memory.library.addAsset(seed);
    }
  }
  SyncResult run() { return SyncRunner().run(link, device, options, progress, cancel); }
  // Nothing was called, written or removed: what a check that stops a sync must leave.
  void expectUntouched(const std::string& before) {
    EXPECT_THAT(script.calls, testing::AnyOf(IsEmpty(), ElementsAre("destroy")));
    EXPECT_EQ(work.fingerprint("device"), before);
    EXPECT_THAT(device.memory.memoryFiles.files(), ElementsAre(KXPreviousMetadataSyncFilePath));
  }
  std::string currentLibrary() {
    const Value uuid =
        readDevicePropertyList(device.memory.memoryFiles, kKXCurrentLibraryUUIDPath)["libraryUUID"];
    return uuid.isString() ? std::string(uuid.stringValue()) : "none";
  }
  void nameLibrary(const std::string& uuid) {
    const DataPtr bytes =
        plistBytes(Value::dictionary(Dictionary{{"libraryUUID", Value::string(uuid)}}));
    device.memory.memoryFiles.writeFileAtomically(kKXCurrentLibraryUUIDPath, bytes->span(),
                                                  nullptr);
  }

  TempDirectory work;
  FakeDevice device;
  DirectoryLink link{work.at("media")};
  PluginScript script;
  SyncOptions options;
  SyncProgressCallback progress;
  CancelToken cancel;
};

// What a sync will need of host and device is begun early, but not for one that may be null.
TEST_F(SyncRunnerTest, WhatWillBeNeededIsBegunEarly) {
  const auto begun = [this] {
    run();
    return std::pair(std::exchange(device.readsAhead, 0), std::exchange(link.filesExpected, 0));
  };
  const auto seal = [this] {
    device.memory.memoryFiles.writeFileAtomically(KXPreviousMetadataSyncFilePath,
                                                  link.snapshotBytes->span(), nullptr);
  };
  EXPECT_EQ(begun(), std::pair(1, 1));
  seal();
  EXPECT_EQ(begun(), std::pair(1, 0));
  link.snapshotBytes = plistBytes(snapshotRoot(
      {assetItem("A", {{"latitude", Value::real(1.0)}, {"longitude", Value::real(2.0)}})}));
  EXPECT_EQ(begun(), std::pair(1, 1));
  seal();
  EXPECT_EQ(begun(), std::pair(0, 0));
}

TEST_F(SyncRunnerTest, MakesTheCallsOfAWholeSyncInOrderOffTheMainThread) {
  ask({"A", "B"});
  const SyncResult result = run();
  EXPECT_THAT(script.calls,
              ElementsAre("prepareForSync", "reconcileSync", "outstandingAssetTransfers",
                          "assetTransfer A arrived", "assetTransfer B arrived",
                          "assetTransferEnded true", "syncEnded true", "destroy"));
  EXPECT_THAT(script.onMainThread, testing::Each(false));
  EXPECT_EQ(result.exitCode, kExitDone);
  EXPECT_FALSE(result.error);
}

TEST_F(SyncRunnerTest, PrepareAnsweringFalseEndsWithoutTransfers) {
  script.prepareResult = false;
  const SyncResult result = run();
  EXPECT_THAT(script.calls, ElementsAre("prepareForSync", "syncEnded false", "destroy"));
  EXPECT_EQ(result.outcome, SyncOutcome::kFailed);
  EXPECT_EQ(result.exitCode, kExitFailed);
  EXPECT_THAT(result.error->message(), HasSubstr("preparing the sync failed"));
}

TEST_F(SyncRunnerTest, PrepareRaisingEndsWithoutTransfers) {
  script.raiseAt = "prepareForSync";
  const SyncResult result = run();
  EXPECT_THAT(script.calls, ElementsAre("prepareForSync", "syncEnded false", "destroy"));
  EXPECT_EQ(result.exitCode, kExitFailed);
  EXPECT_THAT(result.error->message(),
              HasSubstr("InternalInconsistency: raised in prepareForSync"));
}

TEST_F(SyncRunnerTest, ReconcileAnsweringFalseEndsWithoutTransfersAndKeepsItsError) {
  script.reconcileResult = false;
  script.reconcileError = Error::make("com.veltro.kxsyncbundle", -2);
  const SyncResult result = run();
  EXPECT_THAT(script.calls,
              ElementsAre("prepareForSync", "reconcileSync", "syncEnded false", "destroy"));
  EXPECT_EQ(result.exitCode, kExitFailed);
  EXPECT_EQ(result.error->domain(), "com.veltro.kxsyncbundle");
  EXPECT_EQ(result.error->code(), -2);
}

TEST_F(SyncRunnerTest, ReconcileRaisingEndsWithoutTransfers) {
  script.raiseAt = "reconcileSync";
  const SyncResult result = run();
  EXPECT_THAT(script.calls,
              ElementsAre("prepareForSync", "reconcileSync", "syncEnded false", "destroy"));
  EXPECT_EQ(result.exitCode, kExitFailed);
  EXPECT_THAT(result.error->message(), HasSubstr("raised in reconcileSync"));
}

TEST_F(SyncRunnerTest, ReconcileWithoutRoomEndsWithCode6) {
  script.reconcileResult = false;
  script.duringReconcile = [&] {
    device.noted.noteFailure("transaction", Error::make(kPosixErrorDomain, ENOSPC, "full"));
  };
  const SyncResult result = run();
  EXPECT_EQ(result.exitCode, kExitNoSpace);
  EXPECT_THAT(result.error->message(), testing::StartsWith("no space left on the device"));
}

TEST_F(SyncRunnerTest, AFailedTransactionClearsTheFlagThoughEverythingArrived) {
  ask({"A"});
  script.duringReconcile = [&] {
    device.noted.noteFailure("transaction", Error::make("store", 9, "the transaction failed"));
  };
  const SyncResult result = run();
  EXPECT_THAT(script.calls, ElementsAre("prepareForSync", "reconcileSync",
                                        "outstandingAssetTransfers", "assetTransfer A arrived",
                                        "assetTransferEnded false", "syncEnded false", "destroy"));
  EXPECT_EQ(result.outcome, SyncOutcome::kFailed);
  EXPECT_THAT(result.error->message(), HasSubstr("the transaction failed"));
}

TEST_F(SyncRunnerTest, AFailedImportClearsTheFlagAndIsNamed) {
  ask({"A"});
  script.duringTransfer = [&](const FRAssetPtr&) {
    device.noted.noteImportFailure("A", Error::make(kDeviceErrorDomain, 8, "bad file"));
  };
  const SyncResult result = run();
  EXPECT_THAT(script.calls, testing::Contains("assetTransferEnded false"));
  EXPECT_EQ(result.outcome, SyncOutcome::kPartial);
  EXPECT_EQ(result.exitCode, kExitPartial);
  ASSERT_EQ(result.failed.size(), 1U);
  EXPECT_EQ(result.failed[0].uuid, "A");
  EXPECT_EQ(result.failed[0].reason, "bad file");
}

TEST_F(SyncRunnerTest, AFileMissingAtTheHostMakesItPartial) {
  ask({"A", "gone"});
  const SyncResult result = run();
  EXPECT_THAT(script.calls, testing::Contains("assetTransferEnded false"));
  EXPECT_EQ(result.outcome, SyncOutcome::kPartial);
  EXPECT_EQ(result.requested, 2U);
  EXPECT_EQ(result.failed[0].code, 2);
  EXPECT_EQ(result.error->message(), "1 photo did not make it");
}

TEST_F(SyncRunnerTest, ListingTransfersRaisingStillEndsBothWays) {
  script.raiseAt = "outstandingAssetTransfers";
  const SyncResult result = run();
  EXPECT_THAT(script.calls,
              ElementsAre("prepareForSync", "reconcileSync", "outstandingAssetTransfers",
                          "assetTransferEnded false", "syncEnded false", "destroy"));
  EXPECT_EQ(result.exitCode, kExitFailed);
}

TEST_F(SyncRunnerTest, TheTransferEndRaisingStillEndsTheSync) {
  script.raiseAt = "assetTransferEnded";
  const SyncResult result = run();
  EXPECT_THAT(script.calls,
              ElementsAre("prepareForSync", "reconcileSync", "outstandingAssetTransfers",
                          "assetTransferEnded true", "syncEnded false", "destroy"));
  EXPECT_EQ(result.exitCode, kExitFailed);
}

TEST_F(SyncRunnerTest, RestoreRequestsCountNeitherForTheFlagNorTheResult) {
  script.outstanding = {restoreRequest("R")};
  const SyncResult result = run();
  EXPECT_THAT(script.calls, testing::Contains("assetTransferEnded true"));
  EXPECT_EQ(result.requested, 0U);
  EXPECT_EQ(result.exitCode, kExitDone);
}

TEST_F(SyncRunnerTest, ASyncThatTheDeviceDidNotSealIsNoSuccess) {
  script.duringReconcile = [&] {
    device.memory.memoryFiles.removeItem(KXPreviousMetadataSyncFilePath, nullptr);
  };
  const SyncResult result = run();
  EXPECT_EQ(result.outcome, SyncOutcome::kFailed);
  EXPECT_EQ(result.error->code(), static_cast<std::int64_t>(SyncErrorCode::kNotSealed));
}

TEST_F(SyncRunnerTest, ASealThatOutlivesTheReconcileMeansNothingToDo) {
  EXPECT_EQ(run().outcome, SyncOutcome::kNull);
  script.duringReconcile = [&] {
    device.memory.memoryFiles.removeItem(KXPreviousMetadataSyncFilePath, nullptr);
  };
  ask({"A"});
  script.duringTransfer = [&](const FRAssetPtr&) {
    device.memory.memoryFiles.putText(KXPreviousMetadataSyncFilePath, "sealed");
  };
  EXPECT_EQ(run().outcome, SyncOutcome::kSynced);
}

TEST_F(SyncRunnerTest, ASignalBeforeTheReconcileStopsThere) {
  script.duringPrepare = [&] { cancel.cancel(SIGINT); };
  const SyncResult result = run();
  EXPECT_THAT(script.calls, ElementsAre("prepareForSync", "syncEnded false", "destroy"));
  EXPECT_EQ(result.outcome, SyncOutcome::kStopped);
  EXPECT_EQ(result.exitCode, 130);
}

TEST_F(SyncRunnerTest, ASignalDuringTransfersEndsBothWaysWithFalse) {
  ask({"A", "B"});
  script.duringTransfer = [&](const FRAssetPtr&) { cancel.cancel(SIGTERM); };
  const SyncResult result = run();
  EXPECT_THAT(script.calls, ElementsAre("prepareForSync", "reconcileSync",
                                        "outstandingAssetTransfers", "assetTransfer A arrived",
                                        "assetTransferEnded false", "syncEnded false", "destroy"));
  EXPECT_EQ(result.outcome, SyncOutcome::kStopped);
  EXPECT_EQ(result.exitCode, 143);
}

TEST_F(SyncRunnerTest, SumsTheChangesByIdentifier) {
  ask({"A", "gone"});
  script.duringReconcile = [&] {
    device.changes.importedAssets = {"A"};
    device.changes.deletedAssets = {"A", "gone", "x", "y"};
    device.changes.updatedAssets = {"A", "x", "u"};
    device.changes.createdContainers = {"made", "both"};
    device.changes.deletedContainers = {"both", "taken", "taken too"};
    device.changes.renamedContainers = {"made", "taken", "named"};
  };
  const SyncResult result = run();
  EXPECT_EQ(result.imported, 1U);
  EXPECT_EQ(result.deletedAssets, 2U);
  EXPECT_EQ(result.updatedAssets, 1U);
  EXPECT_EQ(result.albumsCreated, 1U);
  EXPECT_EQ(result.albumsDeleted, 2U);
  EXPECT_EQ(result.albumsRenamed, 1U);
}

TEST_F(SyncRunnerTest, PutsTheSnapshotInPlaceOnce) {
  run();
  const DataPtr there = device.memory.memoryFiles.readFile(kKXSnapshotPath, nullptr);
  ASSERT_TRUE(there);
  EXPECT_TRUE(there->isEqualToData(*link.snapshotBytes));
  nameLibrary(kLibrary);
  const std::size_t writes = device.memory.memoryFiles.writes();
  run();
  EXPECT_EQ(device.memory.memoryFiles.writes(), writes);
}

TEST_F(SyncRunnerTest, EmptiesStagingBeforeAndAfter) {
  const std::string staging = "device/var/mobile/Media/Photos/Sync/Staging";
  work.write(staging + "/t00000099", "left over");
  ask({"A"});
  run();
  EXPECT_TRUE(std::filesystem::is_empty(work.at(staging)));
}

// What ends a sync before its first effect.

TEST_F(SyncRunnerTest, AHostThatIsAwayChangesNothing) {
  link.snapshotBytes = nullptr;
  const std::string before = work.fingerprint("device");
  const SyncResult result = run();
  EXPECT_EQ(result.exitCode, kExitFailed);
  EXPECT_EQ(result.error->message(), "the host is away");
  expectUntouched(before);
}

TEST_F(SyncRunnerTest, ARefusedSnapshotChangesNothing) {
  link.snapshotBytes =
      plistBytes(snapshotRoot({assetItem("A", {{"latitude", Value::string("north")}})}));
  const std::string before = work.fingerprint("device");
  EXPECT_EQ(run().exitCode, kExitFailed);
  expectUntouched(before);
}

TEST_F(SyncRunnerTest, AContainerWithADeviceMadeAlbumsIdentifierChangesNothing) {
  AlbumSeed seed;
  seed.uuid = "MINE";
  seed.kind = 2;
  device.memory.library.addAlbum(seed);
  link.snapshotBytes = plistBytes(snapshotRoot({albumItem("MINE")}));
  const std::string before = work.fingerprint("device");
  const SyncResult result = run();
  EXPECT_EQ(result.exitCode, kExitFailed);
  EXPECT_THAT(result.error->message(), HasSubstr("album or event MINE"));
  expectUntouched(before);
}

TEST_F(SyncRunnerTest, AMissingPluginChangesNothing) {
  options.plugin = nullptr;
  options.pluginPath = work.at("none.so");
  const std::string before = work.fingerprint("device");
  const SyncResult result = run();
  EXPECT_EQ(result.exitCode, kExitFailed);
  EXPECT_THAT(result.error->message(), HasSubstr("cannot find the plug-in"));
  expectUntouched(before);
}

TEST_F(SyncRunnerTest, APluginOfAnotherInterfaceChangesNothing) {
  script.refusesVersion = true;
  const std::string before = work.fingerprint("device");
  EXPECT_THAT(run().error->message(), HasSubstr("does not know interface version 1"));
  expectUntouched(before);
}

TEST_F(SyncRunnerTest, APluginThatLacksAnOperationChangesNothing) {
  script.lacksOperations = true;
  const std::string before = work.fingerprint("device");
  EXPECT_THAT(run().error->message(), HasSubstr("lacks an operation"));
  expectUntouched(before);
}

TEST_F(SyncRunnerTest, FilesThatCannotFitChangeNothing) {
  link.sizes["B"] = std::int64_t{60} << 30;
  options.reserveBytes = std::uint64_t{1} << 62;
  const std::string before = work.fingerprint("device");
  const SyncResult result = run();
  EXPECT_EQ(result.exitCode, kExitNoSpace);
  EXPECT_THAT(result.error->message(), HasSubstr("64424509450 bytes needed"));
  EXPECT_THAT(result.error->message(), HasSubstr(" missing"));
  expectUntouched(before);
}

TEST_F(SyncRunnerTest, SaysWhatIsNeededFreeAndMissingForPeopleToo) {
  link.sizes["B"] = std::int64_t{60} << 30;
  options.reserveBytes = std::uint64_t{1} << 62;
  const std::string message = run().error->message();
  EXPECT_THAT(message, HasSubstr("64424509450 bytes needed (64.4 GB)"));
  EXPECT_THAT(message, HasSubstr("4611686018427387904 bytes kept free (4.6 EB)"));
  EXPECT_THAT(message, testing::ContainsRegex("[0-9]+ bytes free"));
  EXPECT_THAT(message, testing::ContainsRegex("[0-9]+ bytes missing \\("));
}

TEST_F(SyncRunnerTest, FilesThatGoMakeRoomAndChangedOnesAreWarnedOf) {
  seedAssets(1);
  DeviceDump::Asset gone;
  gone.uuid = "old0";
  gone.savedAssetType = kKXSavedAssetTypeSynced;
  gone.size = std::int64_t{1} << 62;
  link.sizes["B"] = std::int64_t{60} << 30;
  options.reserveBytes = std::uint64_t{1} << 61;
  EXPECT_EQ(run().exitCode, kExitNoSpace);
  device.content.assets = {gone};
  EXPECT_EQ(run().exitCode, kExitDone);
  // What a reconcile asks for beyond the new files is told of before the first is moved.
  ask({"A"});
  link.sizes["A"] = std::int64_t{1} << 60;
  std::vector<std::string> notices;
  options.notice = [&](const std::string& text) {
    EXPECT_TRUE(link.opened.empty());
    notices.push_back(text);
  };
  link.opened.clear();
  run();
  ASSERT_EQ(notices.size(), 1U);
  EXPECT_THAT(notices[0], HasSubstr("1152921504606846976 bytes needed (1.2 EB)"));
  EXPECT_FALSE(link.opened.empty());
}

TEST_F(SyncRunnerTest, NothingNewNeedsNoRoom) {
  seedAssets(1, "A");
  host({"A0"});
  options.reserveBytes = std::uint64_t{1} << 62;
  EXPECT_EQ(run().exitCode, kExitDone);
}

// The guard: synced assets on the device, of these listed by the host, and whether it stops.
struct GuardCase {
  std::size_t synced;
  std::size_t listed;
  bool stops;
};

class GuardTest : public SyncRunnerTest, public testing::WithParamInterface<GuardCase> {};

TEST_P(GuardTest, StopsAboveHalfAndFiftyOrAtNone) {
  const auto [synced, listed, stops] = GetParam();
  seedAssets(synced);
  std::vector<std::string> uuids;
  for (std::size_t i = 0; i < listed; ++i) uuids.push_back("old" + std::to_string(i));
  host(uuids);
  const std::string before = work.fingerprint("device");
  const SyncResult result = run();
  EXPECT_EQ(result.exitCode, stops ? kExitGuard : kExitDone);
  if (stops) {
    EXPECT_EQ(result.outcome, SyncOutcome::kStopped);
    EXPECT_THAT(result.error->message(), HasSubstr("--allow-deletes"));
    expectUntouched(before);
    options.allowDeletes = true;
    EXPECT_EQ(run().exitCode, kExitDone);
  }
}

INSTANTIATE_TEST_SUITE_P(Counts, GuardTest,
                         testing::Values(GuardCase{51, 0, true}, GuardCase{1, 0, true},
                                         GuardCase{0, 0, false}, GuardCase{51, 1, false},
                                         GuardCase{52, 1, true}, GuardCase{50, 1, false},
                                         GuardCase{102, 51, false}, GuardCase{102, 50, true},
                                         GuardCase{103, 52, false}, GuardCase{103, 51, true},
                                         GuardCase{200, 149, false}),
                         [](const auto& row) {
                           return "Synced" + std::to_string(row.param.synced) + "Listed" +
                                  std::to_string(row.param.listed);
                         });

TEST_F(SyncRunnerTest, TheGuardSaysHowManyOfWhichKindAndWhy) {
  seedAssets(60);
  EXPECT_THAT(run().error->message(),
              testing::AllOf(HasSubstr("60 of 60 synced photos would be deleted, more than half"),
                             HasSubstr("more than 50"), HasSubstr("--allow-deletes lets it pass")));
  for (int i = 0; i < 61; ++i) {
    DeviceDump::Asset asset;
    asset.uuid = "old" + std::to_string(i);
    asset.savedAssetType = i < 60 ? kKXSavedAssetTypeSynced : 0;
    asset.isVideo = i < 1;
    device.content.assets.push_back(asset);
  }
  EXPECT_THAT(run().error->message(), HasSubstr("would be deleted (59 photos, 1 video), more"));
  host({});
  EXPECT_THAT(run().error->message(),
              HasSubstr("lists no photo at all, so all 60 synced ones would be deleted "
                        "(59 photos, 1 video); --allow-deletes"));
}

TEST_F(SyncRunnerTest, TheSealedSnapshotItselfIsNotComparedAgain) {
  seedAssets(60);
  device.memory.memoryFiles.writeFileAtomically(KXPreviousMetadataSyncFilePath,
                                                link.snapshotBytes->span(), nullptr);
  const std::size_t opened = device.memory.library.openedLibraries();
  EXPECT_EQ(run().exitCode, kExitDone);
  EXPECT_EQ(device.memory.library.openedLibraries(), opened);
  // One byte more makes it another snapshot, with all the checks.
  link.snapshotBytes = plistBytes(snapshotRoot({assetItem("A"), assetItem("C")}));
  EXPECT_EQ(run().exitCode, kExitGuard);
}

TEST_F(SyncRunnerTest, TheGuardCountsSyncedAssetsAlone) {
  for (int i = 0; i < 100; ++i) {
    AssetSeed seed;
    seed.uuid = "camera" + std::to_string(i);
    seed.savedAssetType = 0;
    device.memory.library.addAsset(seed);
  }
  EXPECT_EQ(run().exitCode, kExitDone);
}

// A change of library that is cut off.

TEST_F(SyncRunnerTest, AFinishedReconcileKeepsTheNewLibrarysName) {
  nameLibrary("old");
  script.duringReconcile = [&] { nameLibrary(kLibrary); };
  const SyncResult result = run();
  EXPECT_TRUE(result.resync);
  EXPECT_EQ(currentLibrary(), kLibrary);
  EXPECT_FALSE(device.memory.memoryFiles.fileExists(kLibraryMarkerPath));
}

TEST_F(SyncRunnerTest, AFailedReconcileGetsTheOldLibrarysNameBack) {
  nameLibrary("old");
  script.duringReconcile = [&] { nameLibrary(kLibrary); };
  script.reconcileResult = false;
  run();
  EXPECT_EQ(currentLibrary(), "old");
}

TEST_F(SyncRunnerTest, AFailedTransactionGetsTheOldLibrarysNameBack) {
  nameLibrary("old");
  script.duringReconcile = [&] {
    nameLibrary(kLibrary);
    device.noted.noteFailure("transaction", Error::make("store", 9, "failed"));
  };
  run();
  EXPECT_EQ(currentLibrary(), "old");
}

TEST_F(SyncRunnerTest, AnInterruptedChangeOfLibraryIsTakenBackAtTheNextStart) {
  nameLibrary("old");
  EXPECT_FALSE(LibrarySwitch(device.memory.memoryFiles).begin(kLibrary));
  nameLibrary(kLibrary);
  std::string seen;
  script.duringPrepare = [&] { seen = currentLibrary(); };
  EXPECT_TRUE(run().resync);
  EXPECT_EQ(seen, "old");
}

TEST_F(SyncRunnerTest, ForgetsOldFailuresBeforePreparing) {
  device.noted.noteFailure("transaction", Error::make("store", 9, "of the run before"));
  EXPECT_EQ(run().exitCode, kExitDone);
}

TEST_F(SyncRunnerTest, KnowsAResyncByTheFilesOfTheDevice) {
  nameLibrary(kLibrary);
  device.memory.memoryFiles.removeItem(KXPreviousMetadataSyncFilePath, nullptr);
  script.duringPrepare = [&] {
    device.memory.memoryFiles.putText(KXPreviousMetadataSyncFilePath, "sealed");
  };
  EXPECT_FALSE(run().resync);
  const DataPtr other =
      plistBytes(snapshotRoot({}, {{"libraryUUID", Value::string("another library")}}));
  device.memory.memoryFiles.writeFileAtomically(KXPreviousMetadataSyncFilePath, other->span(),
                                                nullptr);
  script.duringPrepare = {};
  EXPECT_TRUE(run().resync);
}

}  // namespace
}  // namespace kx::test
