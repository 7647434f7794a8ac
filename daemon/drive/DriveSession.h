#pragma once

#include <functional>
#include <map>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>

#include "daemon/PluginHost.h"
#include "daemon/drive/DriveArguments.h"
#include "daemon/drive/DriveLogs.h"
#include "daemon/drive/DrivePlatform.h"
#include "device/ReferenceDevice.h"
#include "device/SystemClock.h"
#include "testing/FaultScript.h"
#include "testing/StandingClock.h"

namespace kx {

// What one call is answered with.
struct DriveAnswer {
  nlohmann::ordered_json result;
  ErrorPtr error;
};

// Where a call runs.
enum class DriveLane {
  kPlugin,   // on the plug-in queue
  kConsole,  // on the console's own thread
};

struct DriveCall {
  DriveLane lane = DriveLane::kConsole;
  std::function<DriveAnswer(const DriveArguments&)> run;
  // Whether it waits for batches of the saver.
  bool waitsForSaver = false;
  // Whether it takes "onMainThread".
  bool mayRunOnMainThread = false;

  bool isForMainThread(const DriveArguments& arguments) const {
    return mayRunOnMainThread && arguments.boolean("onMainThread", false);
  }
};
using DriveCallTable = std::map<std::string, DriveCall, std::less<>>;

// What the calls of a console work on: one device, the plug-in with its client, logs, faults and
// the clock. Made and destroyed on the main thread.
class DriveSession {
 public:
  // Opens, and makes when missing, the device. Null and an error.
  static std::unique_ptr<DriveSession> open(const std::string& deviceRoot, ErrorPtr* error);
  // Lets everything go that a script holds back, destroys the client, closes the device.
  ~DriveSession();
  DriveSession(const DriveSession&) = delete;
  DriveSession& operator=(const DriveSession&) = delete;

  ReferenceDevice& device() { return *device_; }
  DrivePlatform& platform() { return *platform_; }
  PluginHost& plugin() { return *plugin_; }
  // Raises DriveException when there is no client.
  FRClient& client();
  DriveLogs& logs() { return logs_; }
  FaultScript& faults() { return faults_; }
  StandingClock& clock() { return clock_; }

  // Destroys the client and makes a new one.
  void renewClient();
  // The library that the client works on; one of the session's own while it has none open.
  KXPhotoLibraryPtr library();
  // Runs the block on that library's queue, as a transaction or not, and waits; what it raises
  // comes to the caller.
  void inLibrary(bool transaction, const std::function<void(KXPhotoLibrary&)>& block);

 private:
  DriveSession() = default;

  DriveLogs logs_;
  FaultScript faults_;
  SystemClock systemClock_;
  StandingClock clock_{systemClock_};
  std::unique_ptr<ReferenceDevice> device_;
  std::unique_ptr<DrivePlatform> platform_;
  std::unique_ptr<PluginHost> plugin_;
  KXPhotoLibraryPtr ownLibrary_;
};

// The calls, by name. Each keeps what it needs of the session, which outlives the table.
void addClientCalls(DriveSession& session, DriveCallTable& table);
void addDeviceCalls(DriveSession& session, DriveCallTable& table);
void addDeviceFileCalls(DriveSession& session, DriveCallTable& table);
void addDeviceLibraryCalls(DriveSession& session, DriveCallTable& table);
void addFaultCalls(DriveSession& session, DriveCallTable& table);
void addRecordCalls(DriveCallTable& table);

}  // namespace kx
