#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "device/Sqlite.h"
#include "platform/foundation/Error.h"

namespace kx {

inline constexpr int kLibrarySchemaVersion = 1;

// How a database was found.
struct OpenedLibrary {
  std::unique_ptr<SqliteDatabase> database;  // null after a failure
  bool isNew = false;
};

// Opens the library's database for writing and makes its tables when there are none. Errors:
// kNewerSchema, kNotOurs (another program's database), kDamaged, kNoSpace, kIo.
OpenedLibrary openLibraryForWriting(const std::string& hostPath, ErrorPtr* error);
// The same for reading alone. Works while another process writes.
OpenedLibrary openLibraryForReading(const std::string& hostPath, ErrorPtr* error);
// What a plan is made over: the file at `hostPath`, or else a database of these bytes, or else a
// new and empty one.
struct PlannedLibrary {
  std::string hostPath;
  std::vector<std::uint8_t> bytes;
  bool isNew() const { return hostPath.empty() && bytes.empty(); }
};
// The library as it would be after changes that are never made: one transaction is open on it, its
// commit is refused, and no byte of a file or beside it is written. The writer's lock is held on a
// library that is there.
OpenedLibrary openLibraryForPlanning(const PlannedLibrary& planned, ErrorPtr* error);
// The same library as it is; null when it is new.
std::unique_ptr<SqliteDatabase> openLibraryBeforePlan(const PlannedLibrary& planned,
                                                      ErrorPtr* error);
// SQLite's own check of the file's structure; null when nothing is wrong.
ErrorPtr quickCheck(SqliteDatabase& database);

}  // namespace kx
