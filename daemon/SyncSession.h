#pragma once

#include <future>
#include <memory>
#include <optional>
#include <set>
#include <string>

#include "daemon/DeviceChecks.h"
#include "daemon/FileTransfer.h"
#include "daemon/LibrarySwitch.h"
#include "daemon/PluginHost.h"
#include "daemon/SnapshotChecker.h"
#include "daemon/SyncPlan.h"
#include "daemon/SyncRunner.h"

namespace kx {

// A host's snapshot. It is checked before a device is touched, but for one that may be the very
// bytes that the device sealed last: that one the session checks when it turns out to be another.
struct HostSnapshot {
  DataPtr bytes;
  std::optional<CheckedSnapshot> checked;
};
std::optional<HostSnapshot> readHostSnapshot(HostLink& host, const std::string& deviceRoot,
                                             ErrorPtr* error);

// One run of a sync over an open device: the phases in order, each on top of what the ones before
// found. Made for one run and used on one thread.
class SyncSession {
 public:
  struct Context {
    HostLink& host;
    ReferenceDevice& device;
    const SyncOptions& options;
    const SyncProgressCallback& progress;
    const CancelToken& cancel;
    SyncPlan* plan = nullptr;  // set: the device keeps nothing, and no file is moved
  };
  SyncSession(const Context& context, HostSnapshot snapshot);

  SyncResult run();

 private:
  // Files that name the library that the device had.
  struct LibraryNames {
    DataPtr sealed;   // the snapshot of the last whole sync
    DataPtr current;  // the plug-in's own
  };

  // The phases; false ends the run with what `result_` says by then.
  bool checkBeforeFirstEffect();
  void readMeanwhile();
  bool putSnapshotInPlace();
  bool prepare();
  bool reconcile();
  void transferAndEnd();
  bool transfer();  // true when every file arrived
  bool planTransfers(const std::vector<FRAssetPtr>& outstanding);

  bool callPrepare();
  bool callReconcile(ErrorPtr* error);
  bool stopIfCancelled();
  void endWithoutTransfers();
  void settleLibrarySwitch(bool reconciled);
  void conclude();
  void collectChanges(const LibraryChanges& changes);
  void judge();
  static bool isOther(const LibraryNames& before, const std::string& libraryUUID);
  bool matchesSeal();
  ErrorPtr checkAgainstDevice();
  void sayWhenTooSmall(const std::vector<FRAssetPtr>& outstanding);
  void concludePlan(const LibraryChanges& changes);
  void enter(SyncPhase phase);
  // Ends the run: notes the first error and the exit code that goes with it.
  void fail(const ErrorPtr& error);
  void failCall(SyncErrorCode code, const std::string& call, const ErrorPtr& error);

  Context context_;
  HostSnapshot snapshot_;    // until the plug-in has read it
  std::string libraryUUID_;  // of a snapshot that was not sealed
  std::optional<bool> matchesSeal_;
  FileSystem& files_;
  LibrarySwitch librarySwitch_;
  std::unique_ptr<PluginHost> plugin_;
  std::unique_ptr<Staging> staging_;
  SyncResult result_;
  std::set<std::string> requested_;  // identifiers of the sync requests
  double startedAt_;
  std::future<DataPtr> sealed_;  // the bytes of the snapshot before, null when there is none
  std::future<bool> isResync_;
  bool isNull_ = false;
  bool cancelled_ = false;
  bool diskFull_ = false;
  bool ended_ = false;  // the two end calls of a sync were made
};

}  // namespace kx
