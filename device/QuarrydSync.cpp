#include <cerrno>
#include <unordered_map>

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/QuarrydJobs.h"
#include "platform/foundation/Exceptions.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

// Host dates count from 1904-01-01, ours from 2001-01-01.
constexpr double kHostDateOffset = 3061152000.0;

// By identifier; the texts are those of the property list that they come from.
using ModificationDates = std::unordered_map<std::string_view, double>;

// What the snapshot says of each asset; null, and why, when it makes no sense.
std::optional<ModificationDates> assetsOfSnapshot(const Value& root, std::string* why) {
  try {
    ModificationDates dates;
    const std::optional<ArrayView> updates = root["updates"].asArray("updates");
    for (std::size_t i = 0; updates && i < updates->size(); ++i) {
      const Value item = (*updates)[i];
      if (item["itemType"].asString("itemType") != OptionalString("Asset")) continue;
      const OptionalString uuid = item["uuid"].asString("uuid");
      if (!uuid) continue;
      const auto modified = item["modificationDate"].asNumber("modificationDate");
      dates[*uuid] = (modified ? modified->doubleValue() : 0.0) - kHostDateOffset;
    }
    return dates;
  } catch (const TypeError& problem) {
    *why = problem.what();
    return std::nullopt;
  }
}

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

std::optional<std::string> Quarryd::whyNotWhole(const DataPtr& snapshot) {
  LibraryStore& store = *parts_.store;
  if (restoring_) return "a restore is under way";
  if (store.health().anyFailure()) return "something failed since the sync began";
  ErrorPtr unreadable;
  const Value root = readPropertyList(snapshot, &unreadable);
  if (!root.isDictionary()) {
    return unreadable ? unreadable->description() : "the snapshot is no dictionary";
  }
  std::string why;
  std::optional<ModificationDates> wanted = assetsOfSnapshot(root, &why);
  if (!wanted) return why;
  std::optional<std::string> found;
  store.queue().sync([&] {
    try {
      SqliteStatement row(store.database(),
                          "SELECT uuid, modification_date, incomplete FROM assets "
                          "WHERE saved_type = 256");
      while (row.step()) {
        const auto expected = wanted->find(row.textViewAt(0));
        if (expected == wanted->end()) continue;
        if (row.integerAt(2) != 0) {
          found = std::string(expected->first) + " is incomplete";
          return;
        }
        if (row.optionalRealAt(1) != std::optional<double>(expected->second)) {
          found = std::string(expected->first) + " has another modification date";
          return;
        }
        wanted->erase(expected);
      }
      if (!wanted->empty()) found = std::string(wanted->begin()->first) + " is not in the library";
    } catch (const SqliteError& error) {
      found = error.what();
    }
  });
  return found;
}

ErrorPtr Quarryd::seal(const std::string& snapshotPath) {
  LibraryStore& store = *parts_.store;
  ErrorPtr error;
  const DataPtr snapshot = files_.readFile(snapshotPath, &error);
  if (!snapshot) {
    store.log().failure("the sync is not sealed",
                        systemError("cannot read", snapshotPath, errnoOf(false, error)));
    return nullptr;
  }
  const DataPtr sealed = files_.readFile(device_paths::kLastSynced, nullptr);
  if (sealed && sealed->isEqualToData(*snapshot)) {
    return nullptr;  // proved before, and nothing has been taken back since
  }
  if (const std::optional<std::string> why = whyNotWhole(snapshot)) {
    store.log().write(LogLevel::kWarning, "the sync is not sealed: " + *why);
    return nullptr;
  }
  if (files_.writeFileAtomically(device_paths::kLastSynced, snapshot->span(), &error)) {
    return nullptr;
  }
  const ErrorPtr failure =
      systemError("cannot write", device_paths::kLastSynced, errnoOf(false, error));
  store.health().noteFailure("the sync is not sealed", failure);
  return failure;
}

}  // namespace kx
