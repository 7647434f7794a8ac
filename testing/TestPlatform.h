#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/Platform.h"
#include "testing/CapturingLogs.h"
#include "testing/FakeClock.h"
#include "testing/FaultyFileSystem.h"
#include "testing/InMemoryFileSystem.h"
#include "testing/InMemoryLibrary.h"
#include "testing/ManualMemoryPressureSource.h"
#include "testing/RecordingPorter.h"
#include "testing/RecordingSaver.h"

namespace kx {

// A whole device in memory: every platform service is a double that a test can look into. Made and
// destroyed on one thread, after every client made with it.
class TestPlatform final : public Platform {
 public:
  TestPlatform();
  ~TestPlatform() override;

  Clock& clock() override { return fakeClock; }
  FileSystem& files() override { return faultyFiles; }
  KXPhotoLibraryFramework& photoLibrary() override { return library; }
  KXAssetsSaver& sharedAssetsSaver() override { return saver; }
  KXPorterClient& porterClient() override { return porter; }
  std::unique_ptr<QBManager> newBackupManager() override;
  LogSinks logs() override { return captured.sinks(); }
  std::unique_ptr<MemoryPressureSource> newMemoryPressureSource() override {
    return memoryPressure.newSource();
  }
  bool isMainThread() override { return onMainThread; }
  std::string mobileHomeDirectory() override { return "/var/mobile"; }
  std::shared_ptr<KXSTransportDecoder> snapshotDecoder(
      std::shared_ptr<KXSTransportDecoder> own) override {
    return decoder ? decoder : own;
  }

  // What the backup manager answers: a list of paths or none, and an error or none.
  struct BackupAnswer {
    std::optional<std::vector<std::string>> paths = std::vector<std::string>();
    ErrorPtr error;
  };

  CapturingLogs captured;
  FakeClock fakeClock;
  InMemoryFileSystem memoryFiles;
  FaultyFileSystem faultyFiles{memoryFiles};
  InMemoryPhotoLibraryFramework library{memoryFiles};
  RecordingSaver saver{library, memoryFiles};
  RecordingPorter porter;
  ManualMemoryPressure memoryPressure;
  BackupAnswer backup;
  bool onMainThread = false;
  std::shared_ptr<KXSTransportDecoder> decoder;  // null: the plug-in's own
};

}  // namespace kx
