#include "device/Sqlite.h"

#include <sys/statvfs.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <limits>

#include "device/DeviceErrors.h"

namespace kx {
namespace {

constexpr int kBusyTimeoutMilliseconds = 5000;
constexpr int kCommitAttempts = 12;

int primary(int code) { return code & 0xff; }

// Whether the file system that holds the database has no byte or no file left.
bool isFull(sqlite3* connection) {
  const char* path = sqlite3_db_filename(connection, "main");
  struct statvfs status = {};
  if (path == nullptr || ::statvfs(path, &status) != 0) return false;
  return status.f_bavail == 0 || (status.f_files > 0 && status.f_favail == 0);
}

// Where SQLite cannot make or extend a file for want of room, its code does not always say so: for
// a journal it tries again read-only, and the system's error is then that of the second attempt.
int withFullDisk(int code, sqlite3* connection) {
  if (primary(code) != SQLITE_CANTOPEN && primary(code) != SQLITE_IOERR) return code;
  const int system = sqlite3_system_errno(connection);
  return system == ENOSPC || system == EDQUOT || isFull(connection) ? SQLITE_FULL : code;
}

}  // namespace

ErrorPtr SqliteError::asError() const {
  switch (primary(code_)) {
    case SQLITE_FULL:
      return deviceError(DeviceError::kNoSpace,
                         "no space left on the device: " + std::string(what()));
    case SQLITE_CORRUPT:
    case SQLITE_NOTADB:
      return deviceError(DeviceError::kDamaged, what());
    default:
      return deviceError(DeviceError::kIo, what());
  }
}

bool SqliteError::endsTheSync() const {
  return primary(code_) == SQLITE_IOERR || primary(code_) == SQLITE_CORRUPT ||
         primary(code_) == SQLITE_NOTADB;
}

SqliteDatabase::SqliteDatabase(const std::string& path, Access access) {
  int flags = SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_NOFOLLOW | SQLITE_OPEN_EXRESCODE;
  flags |= access == Access::kReadOnly ? SQLITE_OPEN_READONLY : SQLITE_OPEN_READWRITE;
  if (access == Access::kCreate) flags |= SQLITE_OPEN_CREATE;
  const int code = sqlite3_open_v2(path.c_str(), &connection_, flags, nullptr);
  if (code != SQLITE_OK) {
    const SqliteError error(withFullDisk(code, connection_),
                            "cannot open the library: " + std::string(sqlite3_errstr(code)));
    sqlite3_close(connection_);
    throw error;
  }
  sqlite3_busy_timeout(connection_, kBusyTimeoutMilliseconds);
  sqlite3_db_config(connection_, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
  sqlite3_db_config(connection_, SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
  sqlite3_limit(connection_, SQLITE_LIMIT_ATTACHED, 0);
}

std::unique_ptr<SqliteDatabase> SqliteDatabase::ofBytes(std::span<const std::uint8_t> bytes) {
  auto database = std::make_unique<SqliteDatabase>(":memory:", Access::kReadWrite);
  const auto size = static_cast<sqlite3_int64>(bytes.size());
  auto* copy = static_cast<unsigned char*>(sqlite3_malloc64(bytes.size() + 1));
  if (copy == nullptr) throw SqliteError(SQLITE_NOMEM, "no memory for the library");
  std::copy(bytes.begin(), bytes.end(), copy);
  const int code =
      sqlite3_deserialize(database->connection_, "main", copy, size, size,
                          SQLITE_DESERIALIZE_FREEONCLOSE | SQLITE_DESERIALIZE_RESIZEABLE);
  if (code != SQLITE_OK) database->fail(code, "the library cannot be read");
  return database;
}

SqliteDatabase::~SqliteDatabase() {
  for (const auto& [sql, statement] : statements_) sqlite3_finalize(statement);
  sqlite3_close(connection_);
}

void SqliteDatabase::fail(int code, std::string_view doing) const {
  throw SqliteError(withFullDisk(code, connection_),
                    std::string(doing) + ": " + sqlite3_errmsg(connection_));
}

void SqliteDatabase::execute(const char* sql) {
  ++statementsRun_;
  const int code = sqlite3_exec(connection_, sql, nullptr, nullptr, nullptr);
  if (code != SQLITE_OK) fail(code, "the library cannot be worked on");
}

bool SqliteDatabase::beginReading() {
  return sqlite3_exec(connection_, "BEGIN", nullptr, nullptr, nullptr) == SQLITE_OK;
}

void SqliteDatabase::endReading() {
  // Some failures have ended it already.
  if (sqlite3_get_autocommit(connection_) != 0) return;
  const int code = sqlite3_exec(connection_, "COMMIT", nullptr, nullptr, nullptr);
  if (code != SQLITE_OK) sqlite3_exec(connection_, "ROLLBACK", nullptr, nullptr, nullptr);
}

void SqliteDatabase::commit() {
  for (int attempt = 1;; ++attempt) {
    ++statementsRun_;
    const int code = sqlite3_exec(connection_, "COMMIT", nullptr, nullptr, nullptr);
    if (code == SQLITE_OK) return;
    if (primary(code) != SQLITE_BUSY || attempt == kCommitAttempts) {
      fail(code, "the library cannot be written");
    }
  }
}

void SqliteDatabase::rollback() {
  // SQLite itself has rolled back after some failures.
  if (sqlite3_get_autocommit(connection_) == 0) execute("ROLLBACK");
}

void SqliteDatabase::copyTo(SqliteDatabase& target, const std::function<bool()>& goOn) {
  constexpr std::string_view kDoing = "the library cannot be copied";
  constexpr int kPagesPerStep = 1024;
  sqlite3_backup* const copy = sqlite3_backup_init(target.connection_, "main", connection_, "main");
  if (copy == nullptr) target.fail(sqlite3_extended_errcode(target.connection_), kDoing);
  int code = SQLITE_OK;
  int refusals = 0;
  while (code == SQLITE_OK || (primary(code) == SQLITE_BUSY && refusals < kCommitAttempts)) {
    if (goOn && !goOn()) {
      sqlite3_backup_finish(copy);
      throw SqliteError(SQLITE_INTERRUPT, std::string(kDoing) + ": interrupted");
    }
    code = sqlite3_backup_step(copy, kPagesPerStep);
    if (primary(code) == SQLITE_BUSY) ++refusals;  // after the connection's busy time
  }
  const int ended = sqlite3_backup_finish(copy);
  if (code == SQLITE_DONE && ended == SQLITE_OK) return;
  target.fail(ended != SQLITE_OK ? ended : code, kDoing);
}

void SqliteDatabase::refuseCommits() {
  sqlite3_commit_hook(
      connection_, [](void*) { return 1; }, nullptr);
}

std::string SqliteDatabase::path() const {
  // One in memory may have a name all the same.
  const char* const path = sqlite3_db_filename(connection_, "main");
  return path == nullptr || *path != '/' ? std::string() : path;
}

std::uint64_t SqliteDatabase::rowsWritten() const {
  return static_cast<std::uint64_t>(sqlite3_total_changes64(connection_));
}

sqlite3_stmt* SqliteDatabase::prepared(const char* sql) {
  sqlite3_stmt*& statement = statements_[sql];
  if (statement == nullptr) {
    const int code =
        sqlite3_prepare_v3(connection_, sql, -1, SQLITE_PREPARE_PERSISTENT, &statement, nullptr);
    if (code != SQLITE_OK) fail(code, "the library does not know a statement");
  }
  return statement;
}

SqliteStatement::SqliteStatement(SqliteDatabase& database, const char* sql)
    : database_(database), statement_(database.prepared(sql)) {
  if (sqlite3_stmt_busy(statement_) != 0) throw std::logic_error("a statement is used twice");
}

SqliteStatement::~SqliteStatement() {
  sqlite3_reset(statement_);
  sqlite3_clear_bindings(statement_);
}

void SqliteStatement::check(int code) {
  if (code != SQLITE_OK) database_.fail(code, "a value cannot be stored");
}

SqliteStatement& SqliteStatement::integer(std::int64_t value) {
  check(sqlite3_bind_int64(statement_, ++bound_, value));
  return *this;
}

SqliteStatement& SqliteStatement::real(double value) {
  if (std::isnan(value)) throw SqliteError(SQLITE_MISMATCH, "a real that is no number");
  check(sqlite3_bind_double(statement_, ++bound_, value));
  return *this;
}

SqliteStatement& SqliteStatement::text(std::string_view value) {
  // The text has to live until the statement has run; our callers see to that.
  check(sqlite3_bind_text64(statement_, ++bound_, value.empty() ? "" : value.data(), value.size(),
                            SQLITE_STATIC, SQLITE_UTF8));
  return *this;
}

SqliteStatement& SqliteStatement::null() {
  check(sqlite3_bind_null(statement_, ++bound_));
  return *this;
}

SqliteStatement& SqliteStatement::optionalInteger(const std::optional<std::int64_t>& value) {
  return value ? integer(*value) : null();
}

SqliteStatement& SqliteStatement::optionalReal(const std::optional<double>& value) {
  return value ? real(*value) : null();
}

SqliteStatement& SqliteStatement::optionalText(const std::optional<std::string>& value) {
  return value ? text(*value) : null();
}

bool SqliteStatement::step() {
  if (!started_) {
    started_ = true;
    ++database_.statementsRun_;
  }
  const int code = sqlite3_step(statement_);
  if (code == SQLITE_ROW) return true;
  if (code != SQLITE_DONE) database_.fail(code, "the library cannot be worked on");
  return false;
}

void SqliteStatement::run() {
  while (step()) {
  }
}

void SqliteStatement::again() {
  sqlite3_reset(statement_);
  bound_ = 0;
  started_ = false;
}

bool SqliteStatement::isNull(int column) const {
  return sqlite3_column_type(statement_, column) == SQLITE_NULL;
}

std::int64_t SqliteStatement::integerAt(int column) const {
  return sqlite3_column_int64(statement_, column);
}

double SqliteStatement::realAt(int column) const {
  return sqlite3_column_double(statement_, column);
}

std::string_view SqliteStatement::textViewAt(int column) const {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(statement_, column));
  if (text == nullptr) return {};
  return {text, static_cast<std::size_t>(sqlite3_column_bytes(statement_, column))};
}

std::string SqliteStatement::textAt(int column) const { return std::string(textViewAt(column)); }

std::optional<std::int64_t> SqliteStatement::optionalIntegerAt(int column) const {
  if (isNull(column)) return std::nullopt;
  return integerAt(column);
}

std::optional<double> SqliteStatement::optionalRealAt(int column) const {
  if (isNull(column)) return std::nullopt;
  return realAt(column);
}

std::optional<std::string> SqliteStatement::optionalTextAt(int column) const {
  if (isNull(column)) return std::nullopt;
  return textAt(column);
}

}  // namespace kx
