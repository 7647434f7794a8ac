#include "daemon/SyncSession.h"

#include <sys/stat.h>

#include <algorithm>
#include <csignal>
#include <utility>

#include "daemon/PlannedTransfers.h"
#include "daemon/RunErrors.h"
#include "daemon/TransferLoop.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

// The plug-in only logs the type; 1 stands for a sync that the user asked for.
constexpr std::uint32_t kSyncType = 1;
constexpr const char* kAnchor = "1";

bool hasNeededOperations(const FRClient& client) {
  constexpr FROperation kNeeded[] = {
      FROperation::kPrepareForSyncWithHostAnchor,  FROperation::kReconcileSync,
      FROperation::kOutstandingAssetTransfers,     FROperation::kAssetTransfer,
      FROperation::kAssetTransferEndedWithSuccess, FROperation::kSyncEndedWithSuccess,
  };
  return std::all_of(std::begin(kNeeded), std::end(kNeeded),
                     [&](FROperation operation) { return client.respondsTo(operation); });
}

std::size_t countWithout(const std::set<std::string>& counted, const std::set<std::string>& left) {
  return static_cast<std::size_t>(
      std::count_if(counted.begin(), counted.end(),
                    [&](const std::string& uuid) { return !left.contains(uuid); }));
}

// A hint from outside the device, which is not open yet.
bool isSealed(const std::string& deviceRoot) {
  struct stat status;
  return ::lstat((deviceRoot + KXPreviousMetadataSyncFilePath).c_str(), &status) == 0;
}

// Null when there are no bytes, or they make no sense or name none.
std::optional<std::string> libraryUUIDIn(const DataPtr& bytes) {
  const Value uuid = bytes ? readPropertyList(bytes, nullptr)["libraryUUID"] : Value();
  if (!uuid.isString()) return std::nullopt;
  return std::string(uuid.stringValue());
}

// Whether a sync of the sealed snapshot may turn out to be a null one, at a glance: assets without
// a place never count as unchanged.
bool mayBeNull(const Data& sealed) {
  const std::span<const std::uint8_t> bytes = sealed.span();
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  return text.find("latitude") != std::string_view::npos;
}

}  // namespace

std::optional<HostSnapshot> readHostSnapshot(HostLink& host, const std::string& deviceRoot,
                                             ErrorPtr* error) {
  HostSnapshot snapshot;
  ErrorPtr problem;
  snapshot.bytes = host.snapshot(&problem);
  if (!snapshot.bytes) {
    if (!problem) {
      problem = syncError(SyncErrorCode::kHostUnreadable,
                          "the snapshot of " + host.description() + " cannot be read");
    }
    setError(error, problem);
    return std::nullopt;
  }
  // It is checked when it is known not to be the sealed one, while the library is read ahead.
  if (isSealed(deviceRoot)) return snapshot;
  snapshot.checked = checkSnapshot(snapshot.bytes, error);
  if (!snapshot.checked) return std::nullopt;
  return snapshot;
}

SyncSession::SyncSession(const Context& context, HostSnapshot snapshot)
    : context_(context),
      snapshot_(std::move(snapshot)),
      files_(context.device.platform().files()),
      librarySwitch_(files_),
      startedAt_(context.device.platform().clock().absoluteTime()) {}

SyncResult SyncSession::run() {
  enter(SyncPhase::kChecking);
  const bool reconciled = checkBeforeFirstEffect() && !stopIfCancelled() && putSnapshotInPlace() &&
                          prepare() && reconcile();
  if (reconciled) transferAndEnd();
  conclude();
  result_.seconds = context_.device.platform().clock().absoluteTime() - startedAt_;
  return std::move(result_);
}

ErrorPtr SyncSession::checkAgainstDevice() {
  ErrorPtr error;
  if (!snapshot_.checked) snapshot_.checked = checkSnapshot(snapshot_.bytes, &error);
  if (!snapshot_.checked) return error;
  const CheckedSnapshot& checked = *snapshot_.checked;
  DeviceComparison comparison;
  error = compareWithDevice(checked, context_.device.platform(), &comparison);
  if (!error) error = refuseDeviceMadeContainers(comparison);
  if (error) return error;
  std::optional<GuardFacts> guard;
  if (!context_.options.allowDeletes) {
    guard = guardAgainstDeletes(checked, comparison, context_.device);
  }
  if (guard) error = guardError(*guard);
  if (error && !context_.plan) return error;
  const auto space =
      refuseWithoutSpace(checked, comparison, context_.host, context_.device, context_.options);
  if (space && !error) error = spaceError(*space);
  if (!context_.plan) return error;
  // A plan goes on, to say what would be done.
  context_.plan->guard = guard;
  context_.plan->space = space;
  context_.plan->stop = error;
  return nullptr;
}

// Whether the host's snapshot is, byte for byte, the one that the device sealed last.
bool SyncSession::matchesSeal() {
  if (!matchesSeal_) {
    matchesSeal_ = files_.fileHolds(KXPreviousMetadataSyncFilePath, snapshot_.bytes->span());
  }
  return *matchesSeal_;
}

// What a sync that is no null one needs later on.
void SyncSession::readMeanwhile() {
  context_.host.expectFiles();
  sealed_ = std::async(std::launch::async,
                       [this] { return files_.readFile(KXPreviousMetadataSyncFilePath, nullptr); });
}

bool SyncSession::checkBeforeFirstEffect() {
  if (!matchesSeal() || !mayBeNull(*snapshot_.bytes)) context_.device.readAhead();
  if (!matchesSeal()) readMeanwhile();
  // These very bytes have been checked and synced whole: everything unlisted is gone since, and
  // everything listed is there.
  ErrorPtr error = matchesSeal() ? nullptr : checkAgainstDevice();
  std::shared_ptr<PluginModule> module = context_.options.plugin;
  if (!error && !module) module = PluginModule::load(context_.options.pluginPath, &error);
  if (!error) {
    plugin_ = std::make_unique<PluginHost>(std::move(module), context_.device.platform());
    error = plugin_->createClient();
  }
  if (!error) {
    bool isComplete = false;
    plugin_->call([&](FRClient& client) { isComplete = hasNeededOperations(client); });
    if (!isComplete) {
      error = syncError(SyncErrorCode::kPlugin, "the plug-in lacks an operation that a sync needs");
    }
  }
  if (error) fail(error);
  return error == nullptr;
}

bool SyncSession::putSnapshotInPlace() {
  ErrorPtr error = librarySwitch_.rollBack();
  if (!error && !context_.plan) staging_ = Staging::open(context_.options.deviceRoot, &error);
  if (staging_) staging_->clear();
  // A file that holds these bytes already is left as it is.
  if (!error) files_.writeDataAtomically(kKXSnapshotPath, snapshot_.bytes, &error);
  // The bytes are kept for the plug-in, which reads this file. The rest has served.
  if (snapshot_.checked) libraryUUID_ = std::move(snapshot_.checked->libraryUUID);
  snapshot_.checked.reset();
  if (error) fail(prefixed("the snapshot cannot be put on the device", *error));
  return error == nullptr;
}

bool SyncSession::prepare() {
  enter(SyncPhase::kPreparing);
  context_.device.health().reset();
  context_.device.takeChanges();
  if (!callPrepare()) {
    endWithoutTransfers();
    return false;
  }
  if (!stopIfCancelled()) return true;
  endWithoutTransfers();
  return false;
}

bool SyncSession::callPrepare() {
  bool prepared = false;
  ErrorPtr error;
  const auto raised = plugin_->call([&](FRClient& client) {
    prepared = client.prepareForSyncWithHostAnchor(kAnchor, {}, &error);
  });
  if (raised) {
    prepared = false;
    error = syncError(SyncErrorCode::kPlugin, raised->name + ": " + raised->reason);
  }
  if (!prepared) failCall(SyncErrorCode::kPrepare, "preparing the sync failed", error);
  return prepared;
}

bool SyncSession::reconcile() {
  enter(SyncPhase::kReconciling);
  LibraryNames names;
  if (!matchesSeal()) {
    names = {sealed_.get(), files_.readFile(kKXCurrentLibraryUUIDPath, nullptr)};
  }
  const bool hadLastSynced = files_.fileExists(KXPreviousMetadataSyncFilePath);
  // What is sealed belongs to the library that the device knows already.
  const ErrorPtr kept = matchesSeal() ? nullptr : librarySwitch_.begin(libraryUUID_);
  if (kept) {
    fail(prefixed("the name of the library before cannot be kept", *kept));
    endWithoutTransfers();
    return false;
  }
  ErrorPtr error;
  const bool reconciled = callReconcile(&error);
  snapshot_ = {};
  context_.device.stopReadingAhead();
  settleLibrarySwitch(reconciled);
  if (!reconciled) {
    failCall(SyncErrorCode::kReconcile, "reconciling failed", error);
    endWithoutTransfers();
    return false;
  }
  if (!matchesSeal()) isResync_ = std::async(std::launch::async, &isOther, names, libraryUUID_);
  // Every reconcile but a null one takes the last-synced snapshot away.
  isNull_ = hadLastSynced && files_.fileExists(KXPreviousMetadataSyncFilePath);
  return true;
}

bool SyncSession::callReconcile(ErrorPtr* error) {
  bool reconciled = false;
  const auto raised = plugin_->call(
      [&](FRClient& client) { reconciled = client.reconcileSync(kSyncType, kAnchor, {}, error); });
  if (!raised) return reconciled;
  *error = syncError(SyncErrorCode::kPlugin, raised->name + ": " + raised->reason);
  return false;
}

void SyncSession::settleLibrarySwitch(bool reconciled) {
  const bool isWhole = reconciled && !context_.device.health().anyFailure();
  const ErrorPtr error = isWhole ? librarySwitch_.commit() : librarySwitch_.rollBack();
  // Whatever stays behind is put back at the next start: a resync too many, never one too few.
  if (error) context_.device.health().noteFailure("current library file", error);
}

// Whether the library is another than the device had: by the rules of the reconcile, over what the
// files held before it.
bool SyncSession::isOther(const LibraryNames& before, const std::string& libraryUUID) {
  std::optional<std::string> known = libraryUUIDIn(before.sealed);
  if (!known) known = libraryUUIDIn(before.current);
  return known != libraryUUID;
}

void SyncSession::transferAndEnd() {
  enter(context_.plan ? SyncPhase::kPlanning : SyncPhase::kTransferring);
  const bool allArrived = transfer();
  enter(SyncPhase::kFinishing);
  DeviceHealth& health = context_.device.health();
  // What the asset daemon has not come to yet may still fail, and the flag is to say so.
  if (!cancelled_) context_.device.drain();
  const bool flag = allArrived && !cancelled_ && !result_.error && !health.anyFailure();
  const auto raised =
      plugin_->call([&](FRClient& client) { client.assetTransferEndedWithSuccess(flag); });
  const auto raisedToo =
      plugin_->call([&](FRClient& client) { client.syncEndedWithSuccess(flag && !raised); });
  ended_ = true;
  for (const auto& each : {raised, raisedToo}) {
    if (each) {
      fail(syncError(SyncErrorCode::kPlugin,
                     "ending the sync failed: " + each->name + ": " + each->reason));
    }
  }
}

bool SyncSession::transfer() {
  std::vector<FRAssetPtr> outstanding;
  const auto raised =
      plugin_->call([&](FRClient& client) { outstanding = client.outstandingAssetTransfers(); });
  if (raised) {
    fail(syncError(SyncErrorCode::kPlugin,
                   "listing the transfers failed: " + raised->name + ": " + raised->reason));
    return false;
  }
  for (const FRAssetPtr& request : outstanding) {
    if (request && !request->isRestore()) requested_.insert(request->identifier());
  }
  if (context_.plan) return planTransfers(outstanding);
  sayWhenTooSmall(outstanding);
  TransferLoop loop({context_.host, *staging_, *plugin_, context_.device.health(), context_.cancel,
                     context_.progress},
                    result_);
  loop.run(outstanding);
  diskFull_ = loop.isDiskFull();
  if (loop.wasCancelled()) stopIfCancelled();
  return loop.allArrived();
}

bool SyncSession::planTransfers(const std::vector<FRAssetPtr>& outstanding) {
  PlannedTransfers transfers({context_.host, *plugin_, context_.cancel, context_.progress}, result_,
                             *context_.plan);
  transfers.run(outstanding);
  if (transfers.wasCancelled()) stopIfCancelled();
  return transfers.allArrived();
}

// Changed files were no part of the check before the first effect.
void SyncSession::sayWhenTooSmall(const std::vector<FRAssetPtr>& outstanding) {
  std::uint64_t needed = 0;
  for (const FRAssetPtr& request : outstanding) {
    if (!request || request->isRestore()) continue;
    const auto size = context_.host.mediaSize(request->identifier());
    if (size && *size > 0) needed += static_cast<std::uint64_t>(*size);
  }
  const std::string& root = context_.options.deviceRoot;
  if (needed == 0 || !shortage(needed, kWorkingBytes, freeBytesAt(root))) return;
  // The files of assets that went make room first.
  context_.device.drain();
  const auto space = shortage(needed, kWorkingBytes, freeBytesAt(root));
  if (space && context_.options.notice) {
    context_.options.notice("not all files will fit: " + spaceError(*space)->message());
  }
}

bool SyncSession::stopIfCancelled() {
  if (!context_.cancel.isCancelled()) return false;
  const int signal = context_.cancel.signal();
  cancelled_ = true;
  result_.outcome = SyncOutcome::kStopped;
  result_.exitCode = 128 + signal;
  result_.error = syncError(
      SyncErrorCode::kCancelled,
      std::string(signal == SIGINT ? "interrupted" : "terminated") +
          (context_.plan ? "; nothing was changed" : "; the same command goes on from here"));
  return true;
}

void SyncSession::endWithoutTransfers() {
  const auto raised = plugin_->call([&](FRClient& client) { client.syncEndedWithSuccess(false); });
  if (raised) {
    fail(syncError(SyncErrorCode::kPlugin,
                   "ending the sync failed: " + raised->name + ": " + raised->reason));
  }
}

void SyncSession::conclude() {
  context_.device.stopReadingAhead();
  if (isResync_.valid()) result_.resync = isResync_.get();
  if (plugin_) {
    if (const auto raised = plugin_->destroyClient()) {
      fail(syncError(SyncErrorCode::kPlugin,
                     "the plug-in's end raised " + raised->name + ": " + raised->reason));
    }
  }
  if (!staging_ && !context_.plan) return;
  context_.device.drain();
  if (staging_) staging_->clear();
  const LibraryChanges changes = context_.device.takeChanges();
  collectChanges(changes);
  if (ended_ && !cancelled_) judge();
  if (context_.plan && !cancelled_) concludePlan(changes);
}

// What would stop the sync at its beginning comes before all that it would have met later.
void SyncSession::concludePlan(const LibraryChanges& changes) {
  SyncPlan& plan = *context_.plan;
  ErrorPtr error;
  plan.difference = context_.device.difference(changes, &error);
  if (error) fail(prefixed("the device library cannot be read", *error));
  for (const LibraryDifference::Asset& asset : plan.difference.assets) {
    if (asset.content || asset.fate == LibraryDifference::Fate::kGone) {
      plan.bytesToFree += static_cast<std::uint64_t>(asset.sizeBefore);
    }
  }
  if (!plan.stop && !result_.error && plan.bytesToBring > 0) {
    plan.space = shortage(plan.bytesToBring, kWorkingBytes,
                          freeBytesAt(context_.options.deviceRoot) + plan.bytesToFree);
    if (plan.space) plan.stop = spaceError(*plan.space);
  }
  if (!plan.stop) return;
  result_.error = nullptr;
  fail(plan.stop);
}

void SyncSession::collectChanges(const LibraryChanges& changes) {
  for (const auto& failure : context_.device.health().importFailures()) {
    const Error* error = failure.error.get();
    result_.failed.push_back(SyncFailure{failure.uuid, error ? error->domain() : "",
                                         error ? error->code() : 0,
                                         error ? error->message() : "the import failed"});
  }
  result_.imported = changes.importedAssets.size();
  result_.deletedAssets = countWithout(changes.deletedAssets, requested_);
  std::set<std::string> replaced = changes.importedAssets;
  replaced.insert(changes.deletedAssets.begin(), changes.deletedAssets.end());
  result_.updatedAssets = countWithout(changes.updatedAssets, replaced);
  result_.albumsCreated = countWithout(changes.createdContainers, changes.deletedContainers);
  result_.albumsDeleted = countWithout(changes.deletedContainers, changes.createdContainers);
  std::set<std::string> anew = changes.createdContainers;
  anew.insert(changes.deletedContainers.begin(), changes.deletedContainers.end());
  result_.albumsRenamed = countWithout(changes.renamedContainers, anew);
}

// The end of a run whose calls were all made.
void SyncSession::judge() {
  const ErrorPtr failure = context_.device.health().firstFailure();
  const bool importFull =
      std::any_of(result_.failed.begin(), result_.failed.end(), [](const SyncFailure& failed) {
        return isNoSpaceError(Error::make(failed.domain, failed.code));
      });
  if (diskFull_ || importFull || isNoSpaceError(failure)) {
    result_.error = nullptr;
    fail(syncError(SyncErrorCode::kNoSpace,
                   std::string(kNoSpaceText) + ": " + std::to_string(result_.imported) + " of " +
                       std::to_string(result_.requested) + " files were brought"));
    return;
  }
  if (failure) fail(prefixed("the device library failed", *failure));
  if (result_.error) return;
  if (!result_.failed.empty()) {
    result_.outcome = SyncOutcome::kPartial;
    result_.exitCode = kExitPartial;
    const std::size_t count = result_.failed.size();
    result_.error =
        syncError(SyncErrorCode::kMissingParts,
                  std::to_string(count) + (count == 1 ? " photo" : " photos") + " did not make it");
    return;
  }
  if (!files_.fileExists(KXPreviousMetadataSyncFilePath)) {
    fail(syncError(SyncErrorCode::kNotSealed,
                   "everything arrived, but the device could not prove that it holds it"));
    return;
  }
  result_.outcome = isNull_ ? SyncOutcome::kNull : SyncOutcome::kSynced;
  result_.exitCode = kExitDone;
}

void SyncSession::enter(SyncPhase phase) {
  if (!context_.progress) return;
  SyncProgress progress;
  progress.phase = phase;
  context_.progress(progress);
}

void SyncSession::fail(const ErrorPtr& error) {
  if (result_.error) return;
  result_.error = error;
  if (isNoSpaceError(error) && !error->message().starts_with(kNoSpaceText)) {
    result_.error = prefixed(kNoSpaceText, *error);
  }
  result_.outcome = SyncOutcome::kFailed;
  result_.exitCode = isNoSpaceError(error) ? kExitNoSpace : kExitFailed;
  if (error->domain() == kSyncErrorDomain &&
      error->code() == static_cast<std::int64_t>(SyncErrorCode::kGuard)) {
    result_.outcome = SyncOutcome::kStopped;
    result_.exitCode = kExitGuard;
  }
}

// A call that answered false or raised: its own error, else what the device noted meanwhile.
void SyncSession::failCall(SyncErrorCode code, const std::string& call, const ErrorPtr& error) {
  const ErrorPtr noted = context_.device.health().firstFailure();
  if (isNoSpaceError(noted)) return fail(prefixed(call, *noted));
  if (error) return fail(prefixed(call, *error));
  if (noted) return fail(prefixed(call, *noted));
  fail(syncError(code, call + ": the plug-in gave no reason"));
}

}  // namespace kx
