#include "daemon/drive/DrivePlatform.h"

#include <cerrno>
#include <utility>

#include "testing/FaultyDecoder.h"

namespace kx {

void ObservedPorter::updateRestoredAssetWithUUID(const std::optional<std::string>& uuid,
                                                 const std::vector<std::string>& paths) {
  keep({true, uuid, paths, false});
  inner_.updateRestoredAssetWithUUID(uuid, paths);
}

void ObservedPorter::finalizeOTARestoreRecreatingAlbums(bool recreateAlbums) {
  keep({false, std::nullopt, {}, recreateAlbums});
  inner_.finalizeOTARestoreRecreatingAlbums(recreateAlbums);
}

void ObservedPorter::keep(Call call) {
  const std::lock_guard<std::mutex> lock(mutex_);
  record_.calls.push_back(std::move(call));
  if (record_.calls.size() <= kMostCallsKept) return;
  record_.calls.pop_front();
  ++record_.forgotten;
}

ObservedPorter::Record ObservedPorter::takeCalls() {
  const std::lock_guard<std::mutex> lock(mutex_);
  return std::exchange(record_, {});
}

namespace {

class ScriptedBackupManager final : public QBManager {
 public:
  ScriptedBackupManager(std::shared_ptr<ScriptedBackup> script, std::unique_ptr<QBManager> inner)
      : script_(std::move(script)), inner_(std::move(inner)) {}

  std::optional<std::vector<QBFile>> restoreFilesForDomain(const std::string& domain,
                                                           ErrorPtr* error) override {
    {
      const std::lock_guard<std::mutex> lock(script_->mutex);
      if (script_->scripted) {
        if (script_->error) setError(error, script_->error);
        return script_->files;
      }
    }
    return inner_->restoreFilesForDomain(domain, error);
  }

 private:
  std::shared_ptr<ScriptedBackup> script_;
  std::unique_ptr<QBManager> inner_;
};

class FaultyMediaStore final : public MediaStore {
 public:
  FaultyMediaStore(std::unique_ptr<MediaStore> inner, FaultScript& script)
      : inner_(std::move(inner)), script_(script) {}

  std::optional<Arrived> inspect(const std::string& path, ErrorPtr* error) override {
    const auto fault = script_.take("import");
    if (!fault) return inner_->inspect(path, error);
    const DeviceError code =
        fault->kind == "noSpace" ? DeviceError::kNoSpace : DeviceError::kBadFile;
    setError(error, Error::make(kDeviceErrorDomain, static_cast<std::int64_t>(code),
                                "made to fail: import of " + path));
    return std::nullopt;
  }
  bool place(const std::string& from, const std::string& to, ErrorPtr* error) override {
    return inner_->place(from, to, error);
  }
  bool makeDurable(const std::vector<std::string>& paths, ErrorPtr* error) override {
    return inner_->makeDurable(paths, error);
  }
  bool remove(const std::string& path, ErrorPtr* error) override {
    return inner_->remove(path, error);
  }

 private:
  std::unique_ptr<MediaStore> inner_;
  FaultScript& script_;
};

}  // namespace

DrivePlatform::DrivePlatform(ReferenceDevice& device, StandingClock& clock, FaultScript& script,
                             LogSinks logs)
    : inner_(device.platform()),
      clock_(clock),
      script_(script),
      logs_(std::move(logs)),
      files_(inner_.files()),
      library_(inner_.photoLibrary(), script,
               [&device](const std::string& what, const ErrorPtr& error) {
                 device.health().noteFailure(what, error);
               }),
      saver_(inner_.sharedAssetsSaver(), script,
             [&device](const std::string& what, const ErrorPtr& error) {
               device.health().noteFailure(what, error);
             }),
      porter_(inner_.porterClient()) {
  files_.setFault([this](std::string_view operation, const std::string& path) {
    return fileFault(operation, path);
  });
  clock_.setGivesUp([this] { return saver_.isKeepingBack(); });
}

ErrorPtr DrivePlatform::fileFault(std::string_view operation, const std::string& path) {
  const char* point = nullptr;
  if (operation == "removeItem") {
    const std::string thumbnails = inner_.photoLibrary().tesselSyncedFaceAlbumThumbnailsDirectory();
    if (path.starts_with(thumbnails + "/")) point = "removeThumbnail";
    if (path == inner_.photoLibrary().syncInfoPath()) point = "removeAgentInfo";
  } else if (operation == "writeFileAtomically") {
    if (path == inner_.photoLibrary().pathToAssetAlbumOrderStructure()) point = "writeAssetOrder";
  } else if (operation == "blockSize") {
    point = "statfs";
  } else if (operation == "enumerate") {
    point = "enumerate";
  } else if (operation == "fileProperties") {
    point = "fileProperties";
  }
  if (point == nullptr) return nullptr;
  const auto fault = script_.take(point);
  if (!fault) return nullptr;
  return fault->error ? fault->error : Error::make(kPosixErrorDomain, EACCES);
}

std::unique_ptr<QBManager> DrivePlatform::newBackupManager() {
  return std::make_unique<ScriptedBackupManager>(backup_, inner_.newBackupManager());
}

std::shared_ptr<KXSTransportDecoder> DrivePlatform::snapshotDecoder(
    std::shared_ptr<KXSTransportDecoder> own) {
  return std::make_shared<FaultyDecoder>(std::move(own), script_);
}

MediaStoreDecorator faultyMediaStore(FaultScript& script) {
  return [&script](std::unique_ptr<MediaStore> inner) -> std::unique_ptr<MediaStore> {
    return std::make_unique<FaultyMediaStore>(std::move(inner), script);
  };
}

}  // namespace kx
