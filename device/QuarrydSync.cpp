#include <cerrno>

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/QuarrydJobs.h"
#include "device/SnapshotAssets.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

bool isOlder(const struct stat& status, const std::optional<Date>& date) {
  constexpr double kReferenceDateSinceUnixEpoch = 978307200.0;
  if (!date) return true;
  const double modified = static_cast<double>(status.st_mtim.tv_sec) +
                          static_cast<double>(status.st_mtim.tv_nsec) * 1e-9;
  return modified - kReferenceDateSinceUnixEpoch < date->secondsSinceReference;
}

// 0, or the errno of a file operation that failed.
int errnoOf(bool done, const ErrorPtr& error) {
  if (done) return 0;
  return error && error->domain() == kPosixErrorDomain ? static_cast<int>(error->code()) : EIO;
}

}  // namespace

// A snapshot with the assets that it lists, and what is to become the seal. Texts are those of the
// root.
struct Quarryd::Expected {
  DataPtr bytes;
  Value root;
  SnapshotAssets assets;
  std::unique_ptr<FileSystem::PreparedFile> seal;
};

ErrorPtr Quarryd::cleanUp(const HandOver& handOver, const std::optional<Date>& before) {
  // Directories come before what they hold; they are removed the other way round.
  std::vector<FileProperties> found;
  ErrorPtr failure;
  files_.enumerate(
      device_paths::kStaging,
      [&](const FileProperties& entry) {
        found.push_back(entry);
        return EnumerationChoice::kDescend;
      },
      [&](const std::string& path, const ErrorPtr& error) {
        if (error->code() != ENOENT) failure = deviceError(DeviceError::kIo, error->message());
        static_cast<void>(path);
      });
  for (auto entry = found.rbegin(); entry != found.rend(); ++entry) {
    if (handOver.namedPaths.contains(entry->path)) continue;
    struct stat status;
    int failed = parts_.root->status(entry->path, &status);
    if (failed == 0 && !entry->isDirectory && !isOlder(status, before)) continue;
    ErrorPtr why;
    if (failed == 0) failed = errnoOf(files_.removeItem(entry->path, &why), why);
    if (failed == 0 || failed == ENOENT || failed == ENOTEMPTY) continue;
    failure = systemError("cannot remove", entry->path, failed);
  }
  if (failure) parts_.store->health().noteFailure("the state of earlier syncs stays", failure);
  return failure;
}

void Quarryd::expectSeal() {
  work_->async([this] {
    DataPtr bytes = files_.readFile(device_paths::kSnapshot, nullptr);
    if (!bytes) return;
    std::string ignored;
    const Value root = readPropertyList(bytes, nullptr);
    auto assets = root.isDictionary() ? SnapshotAssets::of(root, &ignored) : std::nullopt;
    // What makes no sense is told of when the seal is asked for.
    if (!assets) return;
    auto seal = files_.prepareFile(device_paths::kLastSynced, bytes);
    expected_.reset(new Expected{std::move(bytes), root, std::move(*assets), std::move(seal)});
  });
}

std::optional<std::string> Quarryd::whyNotWhole(const DataPtr& snapshot, Expected* expected) {
  if (restoring_) return "a restore is under way";
  if (parts_.store->health().anyFailure()) return "something failed since the sync began";
  if (expected != nullptr) return whyNotInLibrary(std::move(expected->assets));
  ErrorPtr unreadable;
  const Value root = readPropertyList(snapshot, &unreadable);
  if (!root.isDictionary()) {
    return unreadable ? unreadable->description() : "the snapshot is no dictionary";
  }
  std::string why;
  std::optional<SnapshotAssets> wanted = SnapshotAssets::of(root, &why);
  return wanted ? whyNotInLibrary(std::move(*wanted)) : why;
}

std::optional<std::string> Quarryd::whyNotInLibrary(SnapshotAssets wanted) {
  LibraryStore& store = *parts_.store;
  std::optional<std::string> found;
  // False when the asset is not as it should be.
  const auto prove = [&](std::string_view uuid, std::optional<double> modified, bool isIncomplete) {
    SnapshotAssets::Asset* const expected = wanted.find(uuid);
    if (expected == nullptr) return true;
    if (isIncomplete) {
      found = std::string(uuid) + " is incomplete";
    } else if (modified != std::optional<double>(expected->modified)) {
      found = std::string(uuid) + " has another modification date";
    } else {
      expected->proved = true;
    }
    return !found;
  };
  store.queue().sync([&] {
    try {
      const bool isRead = store.showRowsReadAhead([&](const AssetRow& row) {
        return prove(row.uuid, row.modificationDate, row.incomplete);
      });
      if (!isRead) {
        SqliteStatement row(store.database(),
                            "SELECT uuid, modification_date, incomplete FROM assets "
                            "WHERE +saved_type = 256");
        while (row.step() && prove(row.textViewAt(0), row.optionalRealAt(1), row.integerAt(2) != 0))
          continue;
      }
      if (found) return;
      if (const OptionalString missing = wanted.firstNotProved()) {
        found = std::string(*missing) + " is not in the library";
      }
    } catch (const SqliteError& error) {
      found = error.what();
    }
  });
  return found;
}

ErrorPtr Quarryd::seal(const std::string& snapshotPath) {
  LibraryStore& store = *parts_.store;
  ErrorPtr error;
  // What was read ahead counts while the file still holds it.
  std::shared_ptr<Expected> expected = std::move(expected_);
  if (expected && !files_.fileHolds(snapshotPath, expected->bytes->span())) expected.reset();
  const DataPtr snapshot = expected ? expected->bytes : files_.readFile(snapshotPath, &error);
  if (!snapshot) {
    store.log().failure("the sync is not sealed",
                        systemError("cannot read", snapshotPath, errnoOf(false, error)));
    return nullptr;
  }
  if (files_.fileHolds(device_paths::kLastSynced, snapshot->span())) {
    return nullptr;  // proved before, and nothing has been taken back since
  }
  if (const std::optional<std::string> why = whyNotWhole(snapshot, expected.get())) {
    store.log().write(LogLevel::kWarning, "the sync is not sealed: " + *why);
    return nullptr;
  }
  const bool isSealed =
      expected ? expected->seal->putInPlace(&error)
               : files_.writeDataAtomically(device_paths::kLastSynced, snapshot, &error);
  if (isSealed) return nullptr;
  const ErrorPtr failure =
      systemError("cannot write", device_paths::kLastSynced, errnoOf(false, error));
  store.health().noteFailure("the sync is not sealed", failure);
  return failure;
}

}  // namespace kx
