#pragma once

#include <string>
#include <vector>

#include "daemon/FileTransfer.h"
#include "daemon/HostLink.h"
#include "daemon/PluginHost.h"
#include "daemon/SyncRunner.h"

namespace kx {

// One try and two more.
inline constexpr int kTransferAttempts = 3;

// Moves the files that the plug-in asks for into staging and reports each request once. Used on one
// thread; the plug-in is called on its own queue meanwhile.
class TransferLoop {
 public:
  // What a transfer run works with and on; everything outlives it.
  struct Context {
    HostLink& host;
    Staging& staging;
    PluginHost& plugin;
    DeviceHealth& health;
    const CancelToken& cancel;
    const SyncProgressCallback& progress;
  };
  TransferLoop(const Context& context, SyncResult& result) : context_(context), result_(result) {}

  // Over the requests that are no restores; those stay unreported. Appends to the result's
  // failures.
  void run(const std::vector<FRAssetPtr>& outstanding);

  // Of the last run.
  bool allArrived() const { return allArrived_; }
  bool wasCancelled() const { return cancelled_; }
  bool isDiskFull() const { return diskFull_; }

 private:
  void transfer(const FRAssetPtr& request);
  Staging::Result fetch(const FRAsset& request);
  Staging::Result fetchOnce(const FRAsset& request);
  void report(const FRAssetPtr& request, const Staging::Result& fetched);
  void fail(const FRAsset& request, std::string domain, std::int64_t code, std::string reason);
  void tell();

  Context context_;
  SyncResult& result_;
  SyncProgress progress_;
  bool allArrived_ = true;
  bool cancelled_ = false;
  bool diskFull_ = false;
};

}  // namespace kx
