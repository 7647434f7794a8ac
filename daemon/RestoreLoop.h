#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "backup/BackupReader.h"
#include "daemon/FileTransfer.h"
#include "daemon/PluginHost.h"
#include "daemon/RestoreRunner.h"
#include "platform/files/Clock.h"

namespace kx {

// Codes of "FRError" that a restore gives beside those of a sync; none of them is recoverable.
inline constexpr int kFRErrorDamagedInBackup = 5;
inline constexpr int kFRErrorOtherFileThere = 6;

// Brings files of a backup to their places on the device and reports each request once. Files are
// worked in batches: all of a batch are copied into staging and checked against the manifest, then
// made durable, then given their names, and only then reported. Used on one thread; the plug-in is
// called on its own queue meanwhile.
class RestoreLoop {
 public:
  // What a restore works with; everything outlives it.
  struct Context {
    const BackupReader& backup;
    ReferenceDevice& device;
    Staging& staging;
    PluginHost& plugin;
    const RestoreOptions& options;
    const CancelToken& cancel;
    const SyncProgressCallback& progress;
  };
  RestoreLoop(const Context& context, RestoreResult& result) : context_(context), result_(result) {}

  // Over the restore requests. Appends to the result's failures. Null, or why nothing was begun: no
  // space for all of it.
  ErrorPtr run(const std::vector<FRAssetPtr>& outstanding);
  // Then over the files of the backup that nobody asked for and that are not on the device.
  void bringRest();

  bool wasCancelled() const { return cancelled_; }
  bool isDiskFull() const { return diskFull_; }
  // The device's own files fail: what ended the work.
  const ErrorPtr& deviceFailure() const { return deviceFailure_; }

 private:
  struct Item {
    FRAssetPtr request;  // null for a file that nobody asked for
    std::string path;
    const BackupFile* file = nullptr;  // null: not in the backup
    std::string staged;                // device path, "" when nothing was copied
    bool present = false;              // the same file was there
    ErrorPtr error;
  };
  enum class Presence { kMissing, kSame, kOther };

  void work(std::vector<Item> items);
  void fetch(Item& item);
  ErrorPtr refusalOf(const Item& item) const;
  ErrorPtr fetchOnce(Item& item);
  ErrorPtr checkStaged(const Item& item) const;
  Presence presenceOf(const BackupFile& file) const;
  bool isSame(int file, const BackupFile& wanted) const;
  void settle(std::vector<Item>& batch);
  ErrorPtr makeContentsDurable(const std::vector<Item>& batch) const;
  void place(Item& item);
  void syncDirectories(std::vector<Item>& batch);
  void report(const Item& item);
  void fail(const Item& item, const ErrorPtr& error);
  ErrorPtr refuseWithoutSpace(const std::vector<Item>& items) const;
  void tell();

  Context context_;
  RestoreResult& result_;
  SyncProgress progress_;
  std::set<std::string> asked_;
  bool cancelled_ = false;
  bool diskFull_ = false;
  ErrorPtr deviceFailure_;
};

}  // namespace kx
