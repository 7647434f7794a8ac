#pragma once

#include <string>

#include "cli/Command.h"
#include "cli/HostOpening.h"

namespace kx::cli {

// What `sync` and `plan` are told.
struct SyncArguments {
  std::string host;
  std::string device;
  bool allowDeletes = false;
  bool dryRun = false;  // plan instead
  bool all = false;     // a plan's every action
  FolderReading reading;
};

// HOST, DEVICE and the options that both commands have.
void addSyncArguments(CLI::App& command, SyncArguments& arguments);

// Says what a sync would do; the exit code is that of the sync, as far as it can be told.
int runPlan(Context& context, const SyncArguments& arguments);

}  // namespace kx::cli
