#include "device/LibrarySchema.h"

#include <cstdint>

#include "device/DeviceErrors.h"
#include "platform/library/KXPhotoLibrary.h"

namespace kx {
namespace {

constexpr std::int64_t kApplicationId = 0x4b584c42;  // "KXLB"

// Reals are kept in columns of type ANY: a column of type REAL would lose the sign of -0.0.
constexpr const char* kTables = R"sql(
CREATE TABLE info(key TEXT PRIMARY KEY NOT NULL, value TEXT NOT NULL) STRICT, WITHOUT ROWID;
CREATE TABLE assets(
  pk INTEGER PRIMARY KEY,
  uuid TEXT NOT NULL UNIQUE,
  saved_type INTEGER NOT NULL,
  is_video INTEGER NOT NULL CHECK(is_video IN (0, 1)),
  incomplete INTEGER NOT NULL CHECK(incomplete IN (0, 1)),
  modification_date ANY CHECK(typeof(modification_date) IN ('real', 'null')),
  sort_token ANY CHECK(typeof(sort_token) IN ('real', 'null')),
  latitude ANY CHECK(typeof(latitude) IN ('real', 'null')),
  longitude ANY CHECK(typeof(longitude) = typeof(latitude)),
  creation_date ANY CHECK(typeof(creation_date) IN ('real', 'null')),
  original_file_name TEXT,
  path TEXT NOT NULL,
  size INTEGER NOT NULL CHECK(size >= 0)) STRICT;
CREATE INDEX assets_by_type ON assets(saved_type);
CREATE INDEX assets_incomplete ON assets(pk) WHERE incomplete = 1;
CREATE TABLE faces(
  pk INTEGER PRIMARY KEY,
  asset INTEGER NOT NULL REFERENCES assets(pk) ON DELETE CASCADE,
  identifier INTEGER NOT NULL CHECK(identifier BETWEEN 0 AND 65535),
  x ANY NOT NULL CHECK(typeof(x) = 'real'),
  y ANY NOT NULL CHECK(typeof(y) = 'real'),
  width ANY NOT NULL CHECK(typeof(width) = 'real'),
  height ANY NOT NULL CHECK(typeof(height) = 'real'),
  album_uuid TEXT) STRICT;
CREATE INDEX faces_by_asset ON faces(asset);
CREATE TABLE albums(
  pk INTEGER PRIMARY KEY AUTOINCREMENT,
  uuid TEXT,
  kind INTEGER NOT NULL,
  title TEXT,
  pending_type INTEGER NOT NULL,
  pending_count INTEGER NOT NULL CHECK(pending_count BETWEEN 0 AND 4294967295),
  managed INTEGER NOT NULL CHECK(managed IN (0, 1)),
  role TEXT UNIQUE,
  order_tag INTEGER) STRICT;
CREATE INDEX albums_by_uuid ON albums(uuid);
CREATE INDEX albums_by_kind ON albums(kind);
CREATE TABLE memberships(
  album INTEGER NOT NULL REFERENCES albums(pk) ON DELETE CASCADE,
  asset INTEGER NOT NULL REFERENCES assets(pk) ON DELETE CASCADE,
  position INTEGER,
  PRIMARY KEY(album, asset)) STRICT, WITHOUT ROWID;
CREATE INDEX memberships_by_asset ON memberships(asset, album);
CREATE TABLE list_entries(
  album INTEGER PRIMARY KEY REFERENCES albums(pk) ON DELETE CASCADE,
  list INTEGER NOT NULL CHECK(list BETWEEN 1 AND 3),
  position INTEGER NOT NULL) STRICT;
CREATE INDEX list_entries_in_order ON list_entries(list, position);
CREATE TABLE additional_attributes(
  asset INTEGER PRIMARY KEY REFERENCES assets(pk) ON DELETE CASCADE,
  original_file_size INTEGER) STRICT;
CREATE TABLE sidecar_files(
  pk INTEGER PRIMARY KEY,
  asset INTEGER NOT NULL REFERENCES assets(pk) ON DELETE CASCADE,
  compressed_size INTEGER) STRICT;
CREATE INDEX sidecar_files_by_asset ON sidecar_files(asset);
CREATE TABLE asset_files(
  asset INTEGER NOT NULL REFERENCES assets(pk) ON DELETE CASCADE,
  ordinal INTEGER NOT NULL,
  path TEXT NOT NULL,
  PRIMARY KEY(asset, ordinal)) STRICT, WITHOUT ROWID;
INSERT INTO albums(kind, pending_type, pending_count, managed, role)
  VALUES(16, 1, 0, 0, 'camera'), (17, 1, 0, 0, 'syncProgress'), (18, 1, 0, 0, 'otaRestoreProgress');
)sql";

constexpr const char* kConnectionSettings =
    "PRAGMA foreign_keys=ON; PRAGMA cell_size_check=ON; PRAGMA mmap_size=0; "
    "PRAGMA cache_size=-12288; PRAGMA temp_store=MEMORY;";
// A rollback journal, removed and its directory synced with every commit: the write-ahead log of
// SQLite before 3.51.3 may lose its way when a checkpoint meets a restart of the log.
constexpr const char* kWriterSettings =
    "PRAGMA journal_mode=DELETE; PRAGMA synchronous=EXTRA; PRAGMA locking_mode=NORMAL;";

// What changes stays in the page cache, what it was before in a journal in memory.
constexpr const char* kPlannerSettings =
    "PRAGMA journal_mode=MEMORY; PRAGMA synchronous=OFF; PRAGMA cache_spill=OFF; "
    "PRAGMA locking_mode=NORMAL;";

std::int64_t number(SqliteDatabase& database, const char* sql) {
  SqliteStatement statement(database, sql);
  return statement.step() ? statement.integerAt(0) : 0;
}

void makeTables(SqliteDatabase& database) {
  database.execute("BEGIN IMMEDIATE");
  try {
    database.execute(kTables);
    const std::string storeUUID = UUIDString();
    SqliteStatement(database, "INSERT INTO info VALUES('store', ?)").text(storeUUID).run();
    database.execute("PRAGMA application_id=1264077890; PRAGMA user_version=1");
    database.commit();
  } catch (...) {
    database.rollback();
    throw;
  }
}

static_assert(kApplicationId == 1264077890);
static_assert(kLibrarySchemaVersion == 1);

// Null when the tables are ours and of a version that this program knows.
ErrorPtr checkVersion(SqliteDatabase& database) {
  const std::int64_t version = number(database, "PRAGMA user_version");
  if (number(database, "PRAGMA application_id") != kApplicationId) {
    return deviceError(DeviceError::kNotOurs, "the library was made by another program");
  }
  if (version > kLibrarySchemaVersion) {
    return deviceError(DeviceError::kNewerSchema,
                       "the library has version " + std::to_string(version) +
                           ", this program knows " + std::to_string(kLibrarySchemaVersion));
  }
  if (version < 1) return deviceError(DeviceError::kDamaged, "the library has no version");
  return nullptr;
}

bool isEmpty(SqliteDatabase& database) {
  return number(database, "SELECT count(*) FROM sqlite_schema") == 0;
}

}  // namespace

OpenedLibrary openLibraryForWriting(const std::string& hostPath, ErrorPtr* error) {
  OpenedLibrary opened;
  try {
    opened.database = std::make_unique<SqliteDatabase>(hostPath, SqliteDatabase::Access::kCreate);
    opened.database->execute(kConnectionSettings);
    opened.isNew = isEmpty(*opened.database);
    if (!opened.isNew) {
      if (ErrorPtr wrong = checkVersion(*opened.database)) {
        setError(error, std::move(wrong));
        return {};
      }
    }
    opened.database->execute(kWriterSettings);
    if (opened.isNew) makeTables(*opened.database);
    return opened;
  } catch (const SqliteError& failure) {
    setError(error, failure.asError());
    return {};
  }
}

namespace {

std::unique_ptr<SqliteDatabase> openPlanned(const PlannedLibrary& planned) {
  constexpr auto kAccess = SqliteDatabase::Access::kReadWrite;
  auto database = !planned.bytes.empty()
                      ? SqliteDatabase::ofBytes(planned.bytes)
                      : std::make_unique<SqliteDatabase>(
                            planned.isNew() ? ":memory:" : planned.hostPath, kAccess);
  database->execute(kConnectionSettings);
  return database;
}

}  // namespace

OpenedLibrary openLibraryForPlanning(const PlannedLibrary& planned, ErrorPtr* error) {
  try {
    OpenedLibrary opened;
    opened.database = openPlanned(planned);
    opened.isNew = isEmpty(*opened.database);
    if (opened.isNew) {
      opened.database = openPlanned({});
    } else if (ErrorPtr wrong = checkVersion(*opened.database)) {
      setError(error, std::move(wrong));
      return {};
    }
    opened.database->execute(kPlannerSettings);
    if (opened.isNew) makeTables(*opened.database);
    opened.database->refuseCommits();
    opened.database->execute("BEGIN IMMEDIATE");
    return opened;
  } catch (const SqliteError& failure) {
    setError(error, failure.asError());
    return {};
  }
}

std::unique_ptr<SqliteDatabase> openLibraryBeforePlan(const PlannedLibrary& planned,
                                                      ErrorPtr* error) {
  if (planned.isNew()) return nullptr;
  if (planned.bytes.empty()) return openLibraryForReading(planned.hostPath, error).database;
  try {
    return openPlanned(planned);
  } catch (const SqliteError& failure) {
    setError(error, failure.asError());
    return nullptr;
  }
}

OpenedLibrary openLibraryForReading(const std::string& hostPath, ErrorPtr* error) {
  // An interrupted commit is undone by the first to open the library, which takes write access.
  for (const auto access :
       {SqliteDatabase::Access::kReadOnly, SqliteDatabase::Access::kReadWrite}) {
    try {
      OpenedLibrary opened;
      opened.database = std::make_unique<SqliteDatabase>(hostPath, access);
      opened.database->execute(kConnectionSettings);
      if (isEmpty(*opened.database)) {
        setError(error, deviceError(DeviceError::kNotOurs, "the library is empty"));
        return {};
      }
      opened.database->execute("PRAGMA query_only=ON");
      if (ErrorPtr wrong = checkVersion(*opened.database)) {
        setError(error, std::move(wrong));
        return {};
      }
      return opened;
    } catch (const SqliteError& failure) {
      const bool hotJournal =
          (failure.code() & 0xff) == SQLITE_READONLY || (failure.code() & 0xff) == SQLITE_CANTOPEN;
      if (access == SqliteDatabase::Access::kReadWrite || !hotJournal) {
        setError(error, failure.asError());
        return {};
      }
    }
  }
  return {};
}

ErrorPtr quickCheck(SqliteDatabase& database) {
  try {
    SqliteStatement check(database, "PRAGMA quick_check(1)");
    const std::string answer = check.step() ? check.textAt(0) : "no answer";
    if (answer == "ok") return nullptr;
    return deviceError(DeviceError::kDamaged, "the library is damaged: " + answer);
  } catch (const SqliteError& failure) {
    return failure.asError();
  }
}

}  // namespace kx
