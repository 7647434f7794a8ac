#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "daemon/FileTransfer.h"
#include "daemon/PluginHost.h"
#include "daemon/RestoreRunner.h"
#include "device/LibraryReturn.h"
#include "device/RestoreMarker.h"

namespace kx {

// One run of a restore over an open device whose library has been seen to: the marker, the
// plug-in's plan, its files, the end. Made for one run and used on one thread.
class RestoreSession {
 public:
  struct Context {
    const BackupReader& backup;
    ReferenceDevice& device;
    const RestoreOptions& options;
    const SyncProgressCallback& progress;
    const CancelToken& cancel;
  };
  // `library`: what became of the backup's library; nothing when it has none.
  RestoreSession(const Context& context, std::optional<LibraryReturnResult> library);

  RestoreResult run();

 private:
  // The phases; false ends the run with what `result_` says by then.
  bool begin();
  bool putMarkerInPlace();
  bool plan(std::vector<FRAssetPtr>* requests);
  void transferAndEnd();

  void noteLibrary(const LibraryReturnResult& library);
  std::vector<RestoredAlbum> albumsOfBackup();
  bool call(const char* what, const std::function<void(FRClient&)>& body);
  void endWell();
  void endEarly();
  void conclude();
  void judge();
  bool isNothing() const;
  void enter(SyncPhase phase);
  void stop(int signal);
  void fail(const ErrorPtr& error);

  Context context_;
  std::unique_ptr<PluginHost> plugin_;
  std::unique_ptr<Staging> staging_;
  RestoreResult result_;
  double startedAt_;
  bool libraryChanged_ = false;
  bool ended_ = false;  // the plug-in was told of the end
};

}  // namespace kx
