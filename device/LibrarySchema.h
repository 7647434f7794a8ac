#pragma once

#include <memory>
#include <string>

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
// SQLite's own check of the file's structure; null when nothing is wrong.
ErrorPtr quickCheck(SqliteDatabase& database);

}  // namespace kx
