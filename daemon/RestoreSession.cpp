#include "daemon/RestoreSession.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "daemon/RestoreLoop.h"
#include "daemon/RunErrors.h"
#include "device/DeviceLayout.h"

namespace kx {
namespace {

bool hasNeededOperations(const FRClient& client) {
  constexpr FROperation kNeeded[] = {
      FROperation::kOutstandingAssetTransfers,     FROperation::kAssetTransfer,
      FROperation::kAssetTransferEndedWithSuccess, FROperation::kSyncEndedWithSuccess,
      FROperation::kRestoreEndedWithError,
  };
  return std::all_of(std::begin(kNeeded), std::end(kNeeded),
                     [&](FROperation operation) { return client.respondsTo(operation); });
}

ListId listOf(BackupAlbumList list) {
  switch (list) {
    case BackupAlbumList::kEvents:
      return ListId::kEvents;
    case BackupAlbumList::kFaceAlbums:
      return ListId::kFaceAlbums;
    case BackupAlbumList::kAlbums:
      break;
  }
  return ListId::kAlbums;
}

RestoredAlbum restoredAlbum(const BackupAlbum& album) {
  RestoredAlbum restored;
  if (!album.uuid.empty()) restored.uuid = album.uuid;
  restored.title = album.title;
  restored.kind = album.kind;
  restored.list = listOf(album.list);
  restored.position = album.position;
  restored.members = album.members;
  return restored;
}

ErrorPtr systemFailure(const std::string& doing, int code) {
  return Error::make(kPosixErrorDomain, code, doing + ": " + std::strerror(code));
}

std::string count(std::size_t number, const char* one, const char* many) {
  return std::to_string(number) + " " + (number == 1 ? one : many);
}

}  // namespace

RestoreSession::RestoreSession(const Context& context, std::optional<LibraryReturnResult> library)
    : context_(context), startedAt_(context.device.platform().clock().absoluteTime()) {
  if (library) noteLibrary(*library);
}

void RestoreSession::noteLibrary(const LibraryReturnResult& library) {
  libraryChanged_ = library.changed;
  switch (library.outcome) {
    case LibraryReturn::kBroughtBack:
      result_.library = RestoreLibrary::kBroughtBack;
      return;
    case LibraryReturn::kKept:
      result_.library = RestoreLibrary::kKept;
      return;
    case LibraryReturn::kUnusable:
      break;
  }
  result_.library = RestoreLibrary::kDamaged;
  result_.failed.push_back(
      {"library.sqlite", library.why->domain(), library.why->code(), library.why->message()});
}

RestoreResult RestoreSession::run() {
  if (begin() && putMarkerInPlace()) transferAndEnd();
  conclude();
  result_.seconds = context_.device.platform().clock().absoluteTime() - startedAt_;
  return std::move(result_);
}

bool RestoreSession::begin() {
  ErrorPtr error;
  plugin_ = std::make_unique<PluginHost>(context_.options.plugin, context_.device.platform());
  error = plugin_->createClient();
  bool isComplete = false;
  if (!error &&
      !call("the plug-in", [&](FRClient& client) { isComplete = hasNeededOperations(client); })) {
    return false;
  }
  if (!error && !isComplete) {
    error =
        syncError(SyncErrorCode::kPlugin, "the plug-in lacks an operation that a restore needs");
  }
  if (!error) staging_ = Staging::open(context_.options.deviceRoot, &error);
  if (error) {
    fail(error);
    return false;
  }
  staging_->clear();
  context_.device.health().reset();
  context_.device.takeChanges();
  return true;
}

std::vector<RestoredAlbum> RestoreSession::albumsOfBackup() {
  std::vector<RestoredAlbum> restored;
  ErrorPtr error;
  const auto albums = context_.backup.albums(&error);
  if (!albums) {
    result_.failed.push_back({"albums.json", error->domain(), error->code(), error->message()});
    return restored;
  }
  for (const BackupAlbum& album : *albums) restored.push_back(restoredAlbum(album));
  return restored;
}

// The marker and the plug-in's own notes belong together: notes of another restore, or of none, go
// before the marker comes.
bool RestoreSession::putMarkerInPlace() {
  DeviceRoot& root = context_.device.root();
  const RestoreMarker marker{context_.backup.manifest().identity, albumsOfBackup()};
  const std::optional<RestoreMarker> present = readRestoreMarker(root);
  int failed = 0;
  if (!present || present->identity != marker.identity) {
    failed = root.remove(device_paths::kRestoreContext);
    if (failed == ENOENT || failed == ENOTDIR) failed = 0;
    if (failed == 0) failed = root.syncDirectory(device_paths::kCaches);
  }
  if (failed == 0) failed = writeRestoreMarker(root, marker);
  if (failed == 0) return true;
  fail(systemFailure("the restore cannot be marked on the device", failed));
  return false;
}

bool RestoreSession::call(const char* what, const std::function<void(FRClient&)>& body) {
  const auto raised = plugin_->call(body);
  if (raised) fail(raisedError(std::string(what) + " failed", *raised));
  return !raised;
}

bool RestoreSession::plan(std::vector<FRAssetPtr>* requests) {
  enter(SyncPhase::kPlanning);
  std::vector<QBFile> files;
  files.reserve(context_.backup.manifest().files.size());
  for (const BackupFile& file : context_.backup.manifest().files) files.push_back({file.path});
  context_.device.setRestoreFiles(std::move(files));
  return call("planning the restore",
              [&](FRClient& client) { *requests = client.outstandingAssetTransfers(); });
}

void RestoreSession::transferAndEnd() {
  std::vector<FRAssetPtr> requests;
  const bool planned = plan(&requests);
  const ErrorPtr noted = context_.device.health().firstFailure();
  if (planned && noted) fail(prefixed("planning the restore failed", *noted));
  if (result_.error) return endEarly();
  RestoreLoop loop({context_.backup, context_.device, *staging_, *plugin_, context_.options,
                    context_.cancel, context_.progress},
                   result_);
  if (const ErrorPtr refused = loop.run(requests)) {
    fail(refused);
    return endEarly();
  }
  const auto goesOn = [&] {
    return !loop.wasCancelled() && !loop.isDiskFull() && !loop.deviceFailure();
  };
  if (goesOn()) loop.bringRest();
  enter(SyncPhase::kFinishing);
  if (loop.isDiskFull()) {
    fail(syncError(SyncErrorCode::kNoSpace, std::string(kNoSpaceText) + ": " +
                                                count(result_.restored, "file was", "files were") +
                                                " brought"));
  }
  if (loop.deviceFailure()) fail(prefixed("the device failed", *loop.deviceFailure()));
  if (loop.wasCancelled() || context_.cancel.isCancelled()) stop(context_.cancel.signal());
  if (result_.error) return endEarly();
  endWell();
}

// Files that cannot be had do not keep the restore from its end.
void RestoreSession::endWell() {
  context_.device.drain();
  const bool flag = result_.failed.empty() && !context_.device.health().anyFailure();
  ended_ = call("ending the restore",
                [&](FRClient& client) { client.assetTransferEndedWithSuccess(flag); });
  const bool endedToo =
      call("ending the restore", [&](FRClient& client) { client.syncEndedWithSuccess(flag); });
  ended_ = ended_ && endedToo;
}

// The plug-in keeps its notes, and the marker stays: the next run goes on from here.
void RestoreSession::endEarly() {
  const ErrorPtr why = result_.error;
  call("ending the restore", [&](FRClient& client) {
    client.restoreEndedWithError(why);
    client.assetTransferEndedWithSuccess(false);
  });
}

void RestoreSession::conclude() {
  if (plugin_) {
    if (const auto raised = plugin_->destroyClient()) {
      fail(raisedError("the plug-in's end failed", *raised));
    }
  }
  context_.device.drain();
  context_.device.setRestoreFiles(std::nullopt);
  if (!staging_) return;
  staging_->clear();
  const LibraryChanges changes = context_.device.takeChanges();
  result_.registered = changes.importedAssets.size();
  result_.albumsCreated = changes.createdContainers.size();
  if (ended_) judge();
}

bool RestoreSession::isNothing() const {
  return result_.restored == 0 && result_.registered == 0 && result_.albumsCreated == 0 &&
         !libraryChanged_;
}

// The end of a run whose calls were all made.
void RestoreSession::judge() {
  if (const ErrorPtr failure = context_.device.health().firstFailure()) {
    fail(isNoSpaceError(failure) ? prefixed(kNoSpaceText, *failure)
                                 : prefixed("the device library failed", *failure));
  }
  if (result_.error) return;
  struct stat status;
  if (context_.device.root().status(device_paths::kRestoreMarker, &status) == 0) {
    return fail(syncError(SyncErrorCode::kDevice, "the device did not finish the restore"));
  }
  if (!result_.failed.empty()) {
    result_.outcome = RestoreOutcome::kPartial;
    result_.exitCode = kExitPartial;
    result_.error =
        syncError(SyncErrorCode::kMissingParts,
                  count(result_.failed.size(), "file", "files") + " could not be restored");
    return;
  }
  result_.outcome = isNothing() ? RestoreOutcome::kNothing : RestoreOutcome::kRestored;
  result_.exitCode = kExitDone;
}

void RestoreSession::enter(SyncPhase phase) {
  if (!context_.progress) return;
  SyncProgress progress;
  progress.phase = phase;
  context_.progress(progress);
}

void RestoreSession::stop(int signal) {
  result_.outcome = RestoreOutcome::kStopped;
  result_.exitCode = 128 + signal;
  result_.error = interruptedError(signal);
}

void RestoreSession::fail(const ErrorPtr& error) {
  if (result_.error) return;
  result_.error = error;
  if (isNoSpaceError(error) && !error->message().starts_with(kNoSpaceText)) {
    result_.error = prefixed(kNoSpaceText, *error);
  }
  result_.outcome = RestoreOutcome::kFailed;
  result_.exitCode = isNoSpaceError(error) ? kExitNoSpace : kExitFailed;
}

}  // namespace kx
