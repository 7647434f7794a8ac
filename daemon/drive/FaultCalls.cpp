#include <fcntl.h>
#include <sys/file.h>
#include <array>
#include <cerrno>

#include <algorithm>
#include <memory>
#include <string_view>

#include "daemon/drive/DriveSession.h"
#include "device/DeviceLayout.h"

namespace kx {
namespace {

constexpr std::array<std::string_view, 17> kPoints = {
    "fetchAssets", "assetCount",      "sizeFetch",       "transaction",     "saver",
    "saverHold",   "serialize",       "cleanupError",    "cleanupNever",    "import",
    "statfs",      "removeThumbnail", "removeAgentInfo", "writeAssetOrder", "enumerate",
    "decoder",     "fileProperties"};

DriveAnswer armFault(DriveSession& session, const DriveArguments& arguments) {
  FaultScript::Fault fault;
  fault.point = arguments.string("point");
  if (std::find(kPoints.begin(), kPoints.end(), fault.point) == kPoints.end()) {
    throw DriveException(kBadArgument, "unknown fault point \"" + fault.point + "\"");
  }
  fault.times = static_cast<unsigned long>(arguments.integerWithin("times", 1, INT32_MAX, 1));
  fault.skip = static_cast<unsigned long>(arguments.integerWithin("skip", 0, INT32_MAX, 0));
  fault.error = arguments.optionalError("error");
  fault.kind = arguments.optionalString("kind").value_or("");
  if (fault.point == "import" && fault.kind != "noSpace" && fault.kind != "badFile") {
    throw DriveException(kBadArgument, "argument \"kind\": expected \"noSpace\" or \"badFile\"");
  }
  if (arguments.has("errno")) {
    fault.error =
        Error::make(kPosixErrorDomain, arguments.integerWithin("errno", 1, INT32_MAX, EIO));
  }
  if (!session.faults().arm(std::move(fault))) {
    throw DriveException("TooManyFaults", "device.clearFaults makes room for more");
  }
  return {};
}

DriveAnswer backupFiles(DriveSession& session, const DriveArguments& arguments) {
  ScriptedBackup& backup = session.platform().backup();
  const std::optional<std::vector<std::string>> paths = arguments.optionalStrings("paths");
  const ErrorPtr error = arguments.optionalError("error");
  const std::lock_guard<std::mutex> lock(backup.mutex);
  backup.scripted = true;
  backup.error = error;
  backup.files = std::nullopt;
  if (!paths) return {};
  backup.files.emplace();
  for (const std::string& path : *paths) backup.files->push_back({path});
  return {};
}

// A lock of its own on the backup service's lock file, as another process would hold it.
class BackupLock {
 public:
  void set(DeviceRoot& root, bool held) {
    file_.reset();
    if (!held) return;
    const std::string path = std::string(device_paths::kTemporary) + "/BackupRunning";
    int failure = root.makeDirectories(device_paths::kTemporary);
    if (failure == 0) failure = root.openFile(path, O_RDWR | O_CREAT, &file_);
    if (failure == 0 && ::flock(file_.get(), LOCK_EX | LOCK_NB) != 0) failure = errno;
    if (failure == 0) return;
    file_.reset();
    throw DriveException("FileError", path + ": errno " + std::to_string(failure));
  }

 private:
  UniqueFd file_;
};

DriveAnswer raiseMemoryPressure(DriveSession& session) {
  ManualMemoryPressure& pressure = session.platform().pressure();
  const std::size_t sources = pressure.listening();
  std::size_t registered = 0;
  session.inLibrary(false, [&](KXPhotoLibrary& library) {
    registered = library.managedObjectContext().registeredObjects().size();
  });
  pressure.raise();
  session.device().drain();
  return {{{"sources", sources}, {"registered", registered}}, nullptr};
}

}  // namespace

void addFaultCalls(DriveSession& session, DriveCallTable& table) {
  table["device.fault"] = {DriveLane::kConsole, [&session](const DriveArguments& arguments) {
                             return armFault(session, arguments);
                           }};
  table["device.clearFaults"] = {DriveLane::kConsole, [&session](const DriveArguments&) {
                                   session.faults().clear();
                                   return DriveAnswer();
                                 }};
  table["device.releaseSaver"] = {DriveLane::kConsole, [&session](const DriveArguments&) {
                                    session.platform().saver().release();
                                    return DriveAnswer();
                                  }};
  table["device.backupFiles"] = {DriveLane::kConsole, [&session](const DriveArguments& arguments) {
                                   return backupFiles(session, arguments);
                                 }};
  const auto lock = std::make_shared<BackupLock>();
  table["device.backupLock"] = {
      DriveLane::kConsole, [&session, lock](const DriveArguments& arguments) {
        lock->set(session.device().root(), arguments.boolean("held", true));
        return DriveAnswer();
      }};
  table["device.memoryPressure"] = {DriveLane::kConsole, [&session](const DriveArguments&) {
                                      return raiseMemoryPressure(session);
                                    }};
  table["device.setClock"] = {DriveLane::kConsole, [&session](const DriveArguments& arguments) {
                                session.clock().setNow(Date{arguments.real("now")});
                                return DriveAnswer();
                              }};
  table["device.advanceClock"] = {
      DriveLane::kConsole, [&session](const DriveArguments& arguments) {
        if (!session.clock().stands()) {
          throw DriveException(kBadArgument, "the clock runs: device.setClock makes it stand");
        }
        session.clock().advance(arguments.real("seconds"));
        return DriveAnswer();
      }};
}

}  // namespace kx
