#pragma once

#include <cstddef>
#include <deque>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "device/MediaStore.h"
#include "device/ReferenceDevice.h"
#include "testing/FaultScript.h"
#include "testing/FaultyFileSystem.h"
#include "testing/FaultyPhotoLibrary.h"
#include "testing/FaultySaver.h"
#include "testing/ManualMemoryPressureSource.h"
#include "testing/StandingClock.h"

namespace kx {

// The asset daemon's services with a record of the calls. Any thread.
class ObservedPorter final : public KXPorterClient {
 public:
  struct Call {
    bool isUpdate = false;
    std::optional<std::string> uuid;  // of an update
    std::vector<std::string> paths;   // of an update
    bool recreateAlbums = false;      // of a finalisation
  };

  explicit ObservedPorter(KXPorterClient& inner) : inner_(inner) {}
  void updateRestoredAssetWithUUID(const std::optional<std::string>& uuid,
                                   const std::vector<std::string>& paths) override;
  void finalizeOTARestoreRecreatingAlbums(bool recreateAlbums) override;
  // The record keeps this many calls that nobody takes; older ones leave it.
  static constexpr std::size_t kMostCallsKept = 20'000;
  struct Record {
    std::deque<Call> calls;
    std::size_t forgotten = 0;  // before them
  };
  Record takeCalls();  // since the last call

 private:
  void keep(Call call);

  KXPorterClient& inner_;
  std::mutex mutex_;
  Record record_;
};

// What the backup manager answers: the platform's own answer until a script says another.
struct ScriptedBackup {
  std::mutex mutex;
  bool scripted = false;
  std::optional<std::vector<QBFile>> files;
  ErrorPtr error;
};

// The reference device's platform with every service wrapped, so that a script can make steps fail,
// move the clock and see what is handed over. Made on the main thread; outlives its clients.
class DrivePlatform final : public Platform {
 public:
  DrivePlatform(ReferenceDevice& device, StandingClock& clock, FaultScript& script, LogSinks logs);

  Clock& clock() override { return clock_; }
  FileSystem& files() override { return files_; }
  KXPhotoLibraryFramework& photoLibrary() override { return library_; }
  KXAssetsSaver& sharedAssetsSaver() override { return saver_; }
  KXPorterClient& porterClient() override { return porter_; }
  std::unique_ptr<QBManager> newBackupManager() override;
  LogSinks logs() override { return logs_; }
  std::unique_ptr<MemoryPressureSource> newMemoryPressureSource() override {
    return pressure_.newSource();
  }
  bool isMainThread() override { return inner_.isMainThread(); }
  std::string mobileHomeDirectory() override { return inner_.mobileHomeDirectory(); }
  std::shared_ptr<KXSTransportDecoder> snapshotDecoder(
      std::shared_ptr<KXSTransportDecoder> own) override;

  FaultyPhotoLibraryFramework& library() { return library_; }
  FaultySaver& saver() { return saver_; }
  ObservedPorter& porter() { return porter_; }
  ManualMemoryPressure& pressure() { return pressure_; }
  ScriptedBackup& backup() { return *backup_; }

 private:
  ErrorPtr fileFault(std::string_view operation, const std::string& path);

  Platform& inner_;
  StandingClock& clock_;
  FaultScript& script_;
  LogSinks logs_;
  FaultyFileSystem files_;
  FaultyPhotoLibraryFramework library_;
  FaultySaver saver_;
  ObservedPorter porter_;
  ManualMemoryPressure pressure_;
  std::shared_ptr<ScriptedBackup> backup_ = std::make_shared<ScriptedBackup>();
};

// The media store with the point "import" (kind "noSpace" or "badFile"). The script outlives it.
MediaStoreDecorator faultyMediaStore(FaultScript& script);

}  // namespace kx
