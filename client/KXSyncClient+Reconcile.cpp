#include "client/KXSyncClient.h"

#include <exception>
#include <future>

#include "client/LogSource.h"
#include "platform/foundation/PropertyList.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {
namespace {

constexpr const char* kReconcileFunction = "reconcileSync";
constexpr const char* kFileURLScheme = "file://";
constexpr std::string_view kLibraryUUID = "libraryUUID";
constexpr std::string_view kUserAgent = "userAgent";
constexpr std::string_view kTesselUserAgent = "TesselUserAgent";
constexpr std::string_view kLibraryKind = "libraryKind";
constexpr std::int64_t kMasterAlbumSubclass = 5;

bool isMasterAlbum(const KXSItem* item) {
  const auto* album = dynamic_cast<const KXSAlbum*>(item);
  if (album == nullptr) return false;
  const std::optional<Number> subclass = album->albumSubclass();
  return subclass && subclass->int64Value() == kMasterAlbumSubclass;
}

// Takes the first master album out of the items. Null when there is none.
KXSAlbumPtr takeMasterAlbum(KXSItemMap& items) {
  for (const auto& entry : items) {
    if (!isMasterAlbum(entry.value.get())) continue;
    auto master = std::static_pointer_cast<KXSAlbum>(entry.value);
    if (const OptionalString uuid = master->uuid()) items.remove(*uuid);
    return master;
  }
  return nullptr;
}

}  // namespace

bool KXSyncClient::reconcileSync(std::uint32_t syncType, const std::string& newAnchor,
                                 const ProgressCallback& /*progressCallback*/, ErrorPtr* error) {
  syncRequested_ = true;
  assertNotOnMainThread();
  KX_LOG(kClientSource, kReconcileFunction, LogLevel::kInfo, "Reconcile Sync: (type=%d) anchor: %@",
         syncType, newAnchor);
  KX_LOG(kClientSource, kReconcileFunction, LogLevel::kInfo, "Library before: %@", library_);
  _initializeLibrary();

  ErrorPtr decoderError;
  std::future<PreviousSnapshot> previous;
  const KXSLibraryChangeSnapshotPtr snapshot = decodeNewSnapshot(&previous, error, &decoderError);
  KX_LOG(kClientSource, kReconcileFunction, LogLevel::kError, "snapshot %@ err: %@", snapshot,
         decoderError);
  if (decoderError) {
    KX_LOG(kClientSource, kReconcileFunction, LogLevel::kInfo, "Forwarding error from KXS");
    setError(error, decoderError);
    return false;
  }
  if (!snapshot) {
    // The reader's own error, if there is one, says more.
    if (error != nullptr && !*error) {
      *error = std::make_shared<const Error>(kBundleIdentifier, kKXErrorNoSnapshot);
    }
    return false;
  }
  std::optional<std::string> previousUUID;
  const bool isNullSync = equalsPreviousSnapshot(*snapshot, previous.get(), &previousUUID);
  // The library may be at work for long before it answers what follows.
  if (!isNullSync) startHostWork(*snapshot);
  _initializeOutstandingAssets();

  const bool isResync = decideResync(previousUUID, *snapshot);
  Dictionary current;
  current.setIfPresent(kLibraryUUID, Value::optionalString(snapshot->libraryUUID()));
  writeDictionary(kKXCurrentLibraryUUIDPath, std::move(current));
  if (isNullSync) {
    KX_LOG(kClientSource, kReconcileFunction, LogLevel::kDebug,
           "NULL PHOTO SYNC DETECTED - NO RECONCILING NEEDED");
  } else {
    reconcileSnapshot(snapshot, isResync);
  }
  lastSyncJobsSaveTime_ = platform_.clock().now().secondsSinceReference;
  return true;
}

// Reads and decodes the snapshot file and keeps what the host said about itself. Null when nothing
// could be decoded; the reader's error goes to `error`. `previous` is set with it: the snapshot of
// the last completed sync is read meanwhile.
KXSLibraryChangeSnapshotPtr KXSyncClient::decodeNewSnapshot(std::future<PreviousSnapshot>* previous,
                                                            ErrorPtr* error,
                                                            ErrorPtr* decoderError) {
  KX_LOG(kClientSource, kReconcileFunction, LogLevel::kInfo, "Loading up change snapshot");
  KX_LOG(kClientSource, kReconcileFunction, LogLevel::kInfo, "Sync url %@",
         std::string(kFileURLScheme) + kKXSnapshotPath);
  const std::shared_ptr<KXSTransportDecoder> own = KXSTransportDecoder::decoder();
  const std::shared_ptr<KXSTransportDecoder> decoder = platform_.snapshotDecoder(own);
  const DataPtr bytes = readPropertyListBytes(platform_.files(), kKXSnapshotPath, error);
  if (bytes) {
    // What another decoder than ours makes of equal bytes may be something else.
    *previous = std::async(std::launch::async, [this, own = decoder == own ? bytes : nullptr] {
      return readPreviousSnapshot(own);
    });
  }
  const Value root = bytes ? readPropertyList(bytes, error) : Value();
  const std::string agentPath = platform_.photoLibrary().syncInfoPath();
  removeSyncUserAgentInfoFile(agentPath);
  if (!root.isDictionary()) return nullptr;

  Dictionary agent;
  agent.setIfPresent(kUserAgent, root[kTesselUserAgent]);
  KXSLibraryChangeSnapshotPtr snapshot =
      decoder->decodeSnapshotFromPropertyList(root, decoderError);
  if (!snapshot) return nullptr;
  agent.setIfPresent(kLibraryKind, Value::optionalString(snapshot->libraryKind()));
  if (!agent.empty()) writeDictionary(agentPath, std::move(agent));
  return snapshot;
}

void KXSyncClient::removeSyncUserAgentInfoFile(const std::string& path) {
  if (!platform_.files().fileExists(path)) return;
  ErrorPtr error;
  if (platform_.files().removeItem(path, &error)) return;
  KX_LOG(kClientSource, kReconcileFunction, LogLevel::kError,
         "Failed to remove syncUserAgentInfoFile at path %@ err: %@", path, error);
}

// The snapshot of the last completed sync. Whatever is wrong with its file, it only means that
// there is none. When its bytes are those given, of the new one, it is not decoded.
KXSyncClient::PreviousSnapshot KXSyncClient::readPreviousSnapshot(const DataPtr& bytes) {
  FileSystem& files = platform_.files();
  PreviousSnapshot previous;
  if (bytes && files.fileHolds(KXPreviousMetadataSyncFilePath, bytes->span())) {
    previous.isTwin = true;
    return previous;
  }
  const DataPtr last = files.readFile(KXPreviousMetadataSyncFilePath, nullptr);
  const Value root = last ? readPropertyList(last, nullptr) : Value();
  if (!root.isDictionary()) return previous;
  try {
    previous.snapshot =
        KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(root, nullptr);
  } catch (const std::exception&) {
    previous.snapshot = nullptr;
  }
  return previous;
}

// Whether the snapshot equals the one of the last completed sync, and the identifier of the
// latter's library.
bool KXSyncClient::equalsPreviousSnapshot(const KXSLibraryChangeSnapshot& snapshot,
                                          const PreviousSnapshot& previous,
                                          std::optional<std::string>* libraryUUID) {
  if (previous.isTwin) {
    *libraryUUID = snapshot.libraryUUID();
    return snapshot.isEqualToTwin();
  }
  if (!previous.snapshot) return false;
  try {
    *libraryUUID = previous.snapshot->libraryUUID();
    return snapshot.isEqualToSnapshot(previous.snapshot);
  } catch (const std::exception&) {
    return false;
  }
}

bool KXSyncClient::decideResync(OptionalString previousUUID,
                                const KXSLibraryChangeSnapshot& snapshot) {
  const OptionalString uuid = snapshot.libraryUUID();
  if (previousUUID) return previousUUID != uuid;
  const Value stored = readDictionary(kKXCurrentLibraryUUIDPath)[kLibraryUUID];
  if (!stored.isNull() && stored == Value::optionalString(uuid)) return false;
  KX_LOG(kClientSource, kReconcileFunction, LogLevel::kInfo,
         "Forcing resync based on CurrentLibraryUUID.plist: previous %@, snapshot %@", stored,
         uuid);
  return true;
}

void KXSyncClient::startHostWork(const KXSLibraryChangeSnapshot& snapshot) {
  const KXSItemMapPtr& items = snapshot.albumsAndEventsByUUID();
  const auto containers = items ? std::make_shared<KXSItemMap>(*items) : nullptr;
  KXSAlbumPtr master = containers ? takeMasterAlbum(*containers) : nullptr;
  hostWork_ = HostWork::start(containers, master ? master : masterAlbum_, snapshot.assetsByUUID());
}

// For a step that is taken by itself.
void KXSyncClient::startHostWork() {
  hostWork_ = HostWork::start(albumsAndEvents_, masterAlbum_, uuidToKXSAsset_);
}

void KXSyncClient::reconcileSnapshot(const KXSLibraryChangeSnapshotPtr& snapshot, bool isResync) {
  // An interrupted sync must never be taken for a null sync the next time.
  platform_.files().removeItem(KXPreviousMetadataSyncFilePath, nullptr);
  const KXSItemMapPtr& items = snapshot->albumsAndEventsByUUID();
  albumsAndEvents_ = items ? std::make_shared<KXSItemMap>(*items) : nullptr;
  _pullOutMasterAlbumFromAlbumsAndEvents();
  uuidToKXSAsset_ = snapshot->assetsByUUID();
  memberships_ = std::nullopt;  // the host work for this snapshot is under way
  snapshot_ = snapshot;
  isResync_ = isResync;
  _reconcileMetadata();
  const std::shared_ptr<TransferList> outstanding = outstandingAssets();
  KX_LOG(kClientSource, kReconcileFunction, LogLevel::kInfo,
         "Done reconciling! isResync %d, Outstanding assets: %@", isResync_ ? 1 : 0,
         describeTransfers(outstanding));
}

void KXSyncClient::_pullOutMasterAlbumFromAlbumsAndEvents() {
  if (!albumsAndEvents_) return;
  if (KXSAlbumPtr master = takeMasterAlbum(*albumsAndEvents_)) masterAlbum_ = std::move(master);
}

void KXSyncClient::_reconcileMetadata() {
  KX_LOG(kClientSource, "_reconcileMetadata", LogLevel::kInfo, "Entering reconcileMetadata");
  const auto group = std::make_shared<DispatchGroup>();
  BlockFailure failure;
  submitWatched(failure, [this, &group] {
    _reconcileAlbums(group);
    _reconcileAssets(group);
    _setPendingAlbumCounts(group);
    _createAlbumUUIDToObjectIDMap(group);
  });
  KX_LOG(kClientSource, "_reconcileMetadata", LogLevel::kInfo, "Waiting for reconcile to finish");
  group->wait();
  failure.rethrow();
  KX_LOG(kClientSource, "_reconcileMetadata", LogLevel::kInfo, "Leaving reconcileMetadata!");
}

// Failures are not reported.
void KXSyncClient::writeDictionary(const std::string& path, Dictionary dictionary) {
  const std::vector<std::uint8_t> bytes = writePropertyList(
      Value::dictionary(std::move(dictionary)), PropertyListFormat::kBinary, nullptr);
  if (!bytes.empty()) platform_.files().writeFileAtomically(path, bytes, nullptr);
}

// Null when the file is missing, unreadable or holds no dictionary.
Value KXSyncClient::readDictionary(const std::string& path) {
  const Value root = readPropertyListFile(platform_.files(), path, nullptr);
  return root.isDictionary() ? root : Value();
}

}  // namespace kx
