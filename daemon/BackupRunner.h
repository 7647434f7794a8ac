#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backup/BackupTaker.h"
#include "backup/BackupVerifier.h"
#include "daemon/SyncRunner.h"

namespace kx {

struct BackupOptions {
  std::string deviceRoot;
  std::string backupPath;
  bool withLibrary = false;
  bool allowLosses = false;  // lets a backup pass that the guard would stop
  // As SyncOptions has them.
  std::string pluginPath;
  std::shared_ptr<PluginModule> plugin;
};

// Opens the device, which has to be there, asks the plug-in what to back up, and takes the backup.
// The device is held meanwhile: no sync, restore or other backup can run. Nothing leaves it as an
// exception. Any thread; the token ends it early.
BackupResult backUpDevice(const BackupOptions& options, const LogSinks& logs,
                          const BackupProgressCallback& progress, const CancelToken& cancel);

// The exit code for the end of a backup or a verification: `partial` says that some files are not
// as they should be.
int exitCodeForBackup(const ErrorPtr& error, bool partial, const CancelToken& cancel);

// What the plug-in answers to pathsToBackup; works while a sync holds the device.
std::optional<std::vector<std::string>> readBackupPaths(const std::string& deviceRoot,
                                                        const LogSinks& logs, ErrorPtr* error);

// The storage figures of a device: the plug-in's answer and the device's disk, in bytes.
struct DeviceMetrics {
  struct Kind {
    std::uint64_t physicalSize = 0;
    std::uint64_t count = 0;
  };
  bool backupRunning = false;  // then there are no figures of the kinds
  Kind photo, shoebox;         // synced; the device's own
  std::uint64_t capacity = 0;  // of the file system that holds the device
  std::uint64_t free = 0;      // as far as it is to be had without privileges
};

// Works while a sync or a backup holds the device, and changes nothing.
std::optional<DeviceMetrics> readMetrics(const std::string& deviceRoot, const LogSinks& logs,
                                         ErrorPtr* error);

}  // namespace kx
