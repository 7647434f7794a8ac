#include "device/LibraryReturn.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/LibrarySchema.h"
#include "device/Sha256.h"

namespace kx {
namespace {

constexpr std::size_t kCopyBytes = std::size_t{1} << 20;
// Among transferred files, which no run leaves behind.
constexpr const char* kWorkingCopy = "/var/mobile/Media/Photos/Sync/Staging/library.sqlite";

// The backup's identity stands in the library that was brought back until the restore has ended.
constexpr const char* kLeaveOutSynced =
    "DELETE FROM assets WHERE saved_type = 256;"
    "DELETE FROM albums WHERE role IS NULL AND kind IN (1550, 1551, 15);"
    "UPDATE assets SET incomplete = 1;"
    "UPDATE albums SET pending_type = 1, pending_count = 0;";

ErrorPtr unusable(const std::string& why) {
  return deviceError(DeviceError::kDamaged, "the library of the backup cannot be used: " + why);
}

bool hasRow(SqliteDatabase& database, const char* sql) {
  return SqliteStatement(database, sql).step();
}

bool hasOwnThings(SqliteDatabase& database) {
  return hasRow(database, "SELECT 1 FROM assets WHERE saved_type <> 256 LIMIT 1") ||
         hasRow(database,
                "SELECT 1 FROM albums WHERE role IS NULL AND kind NOT IN (1550, 1551, 15) LIMIT 1");
}

bool cameFrom(SqliteDatabase& database, const std::string& backup) {
  SqliteStatement row(database, "SELECT value FROM info WHERE key = 'restoredFrom'");
  return row.step() && row.textAt(0) == backup;
}

std::vector<std::string> schemaOf(SqliteDatabase& database) {
  std::vector<std::string> lines;
  SqliteStatement row(database, "SELECT type, name, tbl_name, sql FROM sqlite_schema");
  while (row.step()) {
    lines.push_back(row.textAt(0) + "\n" + row.textAt(1) + "\n" + row.textAt(2) + "\n" +
                    row.textAt(3));
  }
  std::sort(lines.begin(), lines.end());
  return lines;
}

struct CopyEnd {
  int failed = 0;         // errno of the device's side
  std::string different;  // why it is not the file that the manifest names
};

int writeAll(int fd, std::span<const std::uint8_t> bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(fd, bytes.data(), bytes.size());
    if (count < 0 && errno != EINTR) return errno;
    if (count > 0) bytes = bytes.subspan(static_cast<std::size_t>(count));
  }
  return 0;
}

CopyEnd copyChecked(const LibraryCopy& copy, int to) {
  std::vector<std::uint8_t> buffer(kCopyBytes);
  Sha256 hash;
  std::int64_t done = 0;
  while (true) {
    const ssize_t count = ::pread(copy.file, buffer.data(), buffer.size(), done);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return {0, "it cannot be read"};
    if (count == 0) break;
    done += count;
    if (done > copy.size) break;
    const std::span<const std::uint8_t> piece(buffer.data(), static_cast<std::size_t>(count));
    hash.update(piece);
    if (const int failed = writeAll(to, piece); failed != 0) return {failed, ""};
  }
  if (done != copy.size || hash.hexDigest() != copy.sha256) {
    return {0, "library.sqlite is not what the manifest says"};
  }
  return {};
}

// Nothing, or why the database is not one of ours in order.
std::string objectionTo(SqliteDatabase& database, SqliteDatabase& own) {
  if (schemaOf(database) != schemaOf(own)) return "its tables are not those of a library";
  SqliteStatement check(database, "PRAGMA integrity_check(1)");
  const std::string answer = check.step() ? check.textAt(0) : "no answer";
  if (answer != "ok") return answer;
  if (hasRow(database, "PRAGMA foreign_key_check"))
    return "rows of it name rows that are not there";
  return {};
}

void prepare(SqliteDatabase& database, const std::string& backup) {
  // Nothing of this file is kept if anything ends here.
  database.execute("PRAGMA journal_mode=MEMORY; PRAGMA synchronous=OFF; BEGIN IMMEDIATE");
  database.execute(kLeaveOutSynced);
  SqliteStatement(database, "INSERT OR REPLACE INTO info VALUES('restoredFrom', ?)")
      .text(backup)
      .run();
  database.commit();
}

ErrorPtr removeLastSynced(const DeviceRoot& root) {
  int failed = root.remove(device_paths::kLastSynced);
  if (failed == ENOENT) return nullptr;
  if (failed == 0) failed = root.syncDirectory(device_paths::kSync);
  return failed == 0 ? nullptr : systemError("cannot remove", device_paths::kLastSynced, failed);
}

// The working copy, checked. Null with an error of the device, or with `result` set to unusable.
std::unique_ptr<SqliteDatabase> openCopy(const DeviceRoot& root, const LibraryCopy& copy,
                                         LibraryReturnResult* result, ErrorPtr* error) {
  UniqueFd target;
  int failed = root.remove(kWorkingCopy);
  if (failed == 0 || failed == ENOENT) {
    failed = root.openFile(kWorkingCopy, O_WRONLY | O_CREAT | O_EXCL, &target);
  }
  CopyEnd end{failed, ""};
  if (failed == 0) end = copyChecked(copy, target.get());
  if (const int closing = target.close(); end.failed == 0) end.failed = closing;
  if (end.failed != 0) {
    *error = systemError("cannot write", kWorkingCopy, end.failed);
    return nullptr;
  }
  if (end.different.empty()) {
    ErrorPtr why;
    OpenedLibrary opened = openLibraryForWriting(root.hostPath() + kWorkingCopy, &why);
    if (opened.database && !opened.isNew) return std::move(opened.database);
    end.different = why ? why->message() : "it is empty";
  }
  result->outcome = LibraryReturn::kUnusable;
  result->why = unusable(end.different);
  return nullptr;
}

ErrorPtr replaceLibrary(const DeviceRoot& root, SqliteDatabase& own, const LibraryCopy& copy,
                        LibraryReturnResult* result) {
  ErrorPtr error;
  const std::unique_ptr<SqliteDatabase> database = openCopy(root, copy, result, &error);
  if (!database) return error;
  try {
    if (const std::string objection = objectionTo(*database, own); !objection.empty()) {
      *result = {LibraryReturn::kUnusable, false, unusable(objection)};
      return nullptr;
    }
    prepare(*database, copy.backup);
  } catch (const SqliteError& failure) {
    const ErrorPtr why = failure.asError();
    if (why->code() == static_cast<std::int64_t>(DeviceError::kNoSpace)) return why;
    *result = {LibraryReturn::kUnusable, false, unusable(failure.what())};
    return nullptr;
  }
  if (ErrorPtr failed = removeLastSynced(root)) return failed;
  database->copyTo(own);
  result->outcome = LibraryReturn::kBroughtBack;
  result->changed = true;
  return nullptr;
}

}  // namespace

ErrorPtr bringLibraryBack(const std::shared_ptr<DeviceRoot>& root, const LibraryCopy& copy,
                          LibraryReturnResult* result) {
  struct stat status;
  // A new library says nothing of what was synced before.
  if (root->status(device_paths::kDatabase, &status) == ENOENT) {
    if (ErrorPtr failed = removeLastSynced(*root)) return failed;
  }
  try {
    ErrorPtr error;
    const OpenedLibrary own =
        openLibraryForWriting(root->hostPath() + device_paths::kDatabase, &error);
    if (!own.database) return error;
    if (cameFrom(*own.database, copy.backup)) {
      result->outcome = LibraryReturn::kBroughtBack;
      return nullptr;
    }
    if (hasOwnThings(*own.database)) {
      result->outcome = LibraryReturn::kKept;
      return nullptr;
    }
    ErrorPtr failure = replaceLibrary(*root, *own.database, copy, result);
    const int failed = root->remove(kWorkingCopy);
    if (!failure && failed != 0 && failed != ENOENT) {
      failure = systemError("cannot remove", kWorkingCopy, failed);
    }
    return failure;
  } catch (const SqliteError& failure) {
    return failure.asError();
  }
}

ErrorPtr forgetLibraryReturn(LibraryStore& store) {
  try {
    if (!hasRow(store.database(), "SELECT 1 FROM info WHERE key = 'restoredFrom'")) return nullptr;
  } catch (const SqliteError& failure) {
    return failure.asError();
  }
  return store.write([](LibraryWriter& writer) {
    writer.database().execute("DELETE FROM info WHERE key = 'restoredFrom'");
  });
}

}  // namespace kx
