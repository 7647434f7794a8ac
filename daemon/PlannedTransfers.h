#pragma once

#include <vector>

#include "daemon/HostLink.h"
#include "daemon/PluginHost.h"
#include "daemon/SyncPlan.h"

namespace kx {

// Stands in for the transfers of a sync that is only planned: every request that the host can serve
// counts as arrived, without a byte moved, and every other one as failed. One thread; the plug-in
// is called on its own queue meanwhile.
class PlannedTransfers {
 public:
  struct Context {
    HostLink& host;
    PluginHost& plugin;
    const CancelToken& cancel;
    const SyncProgressCallback& progress;
  };
  PlannedTransfers(const Context& context, SyncResult& result, SyncPlan& plan)
      : context_(context), result_(result), plan_(plan) {}

  // Over the requests that are no restores. Appends to the result's failures.
  void run(const std::vector<FRAssetPtr>& outstanding);

  // Of the last run.
  bool allArrived() const { return result_.failed.empty() && !cancelled_; }
  bool wasCancelled() const { return cancelled_; }

 private:
  // Null when the file could be had.
  ErrorPtr look(SyncPlan::Request* request);
  void report(const FRAssetPtr& request, const ErrorPtr& failure);

  Context context_;
  SyncResult& result_;
  SyncPlan& plan_;
  std::size_t counter_ = 0;
  bool cancelled_ = false;
};

}  // namespace kx
