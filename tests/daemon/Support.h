#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "daemon/HostLink.h"
#include "daemon/PluginHost.h"
#include "platform/foundation/Value.h"
#include "platform/sync/FRClient.h"

namespace kx::test {

// A directory of its own, removed with everything in it.
class TempDirectory {
 public:
  TempDirectory();
  ~TempDirectory();
  const std::string& path() const { return path_; }
  std::string at(const std::string& name) const { return path_ + "/" + name; }
  // Makes the directories on the way.
  void write(const std::string& name, const std::string& text) const;
  std::string read(const std::string& name) const;
  bool exists(const std::string& name) const;
  // Every entry below, with kind, size and content: equal texts mean nothing changed.
  std::string fingerprint(const std::string& name) const;

 private:
  std::string path_;
};

DataPtr plistBytes(const Value& root);
Value assetItem(const std::string& uuid, const std::map<std::string, Value>& more = {});
Value albumItem(const std::string& uuid, const std::vector<std::string>& assets = {});
// A snapshot of the library "11111111-1111-1111-1111-111111111111" with these updates.
Value snapshotRoot(const std::vector<Value>& updates,
                   const std::map<std::string, Value>& more = {});

// A host of files in a directory, opened with the daemon's usual flags, that counts what it is
// asked and can be told to fail.
class DirectoryLink : public HostLink {
 public:
  explicit DirectoryLink(std::string directory) : directory_(std::move(directory)) {}

  std::string description() const override { return directory_; }
  DataPtr snapshot(ErrorPtr* error) override;
  std::optional<std::int64_t> mediaSize(std::string_view identifier) override;
  FileDescriptor openMedia(std::string_view identifier, ErrorPtr* error) override;
  void expectFiles() override { ++filesExpected; }

  int filesExpected = 0;
  DataPtr snapshotBytes;
  std::map<std::string, int, std::less<>> failures;        // errno by identifier, for every opening
  std::map<std::string, int, std::less<>> failTimes;       // how many openings fail; absent: all
  std::map<std::string, std::int64_t, std::less<>> sizes;  // what mediaSize says, if not the truth
  std::function<void(const std::string& identifier)> onOpen;
  std::vector<std::string> opened;

 private:
  std::string directory_;
};

// What the plug-in of PluginScript does, and what was done to it. Threads: set before the calls,
// read after them; the calls are made one at a time on the plug-in queue.
struct PluginScript {
  bool prepareResult = true;
  bool reconcileResult = true;
  ErrorPtr reconcileError;
  std::string raiseAt;  // the name of the call that raises
  std::vector<FRAssetPtr> outstanding;
  std::function<void()> duringReconcile;
  std::function<void()> duringPrepare;
  std::function<void(const FRAssetPtr&)> duringTransfer;
  bool lacksOperations = false;
  bool refusesVersion = false;

  std::vector<std::string> calls;
  std::vector<bool> onMainThread;
};

// The script of the clients that scriptedPlugin makes from now on.
void useScript(PluginScript* script);
std::shared_ptr<PluginModule> scriptedPlugin();

FRAssetPtr downloadRequest(const std::string& uuid);
FRAssetPtr restoreRequest(const std::string& uuid);

}  // namespace kx::test
