#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <stdexcept>
#include <string>
#include <string_view>
#include <unordered_map>

#include "platform/foundation/Error.h"

namespace kx {

// What SQLite answered instead of doing as told. `code` is its extended result code.
class SqliteError : public std::runtime_error {
 public:
  SqliteError(int code, const std::string& what) : std::runtime_error(what), code_(code) {}
  int code() const { return code_; }
  // kNoSpace for a full disk, kDamaged for a database that makes no sense, else kIo.
  ErrorPtr asError() const;
  // Whether the connection is not to be used for writing any more.
  bool endsTheSync() const;

 private:
  int code_;
};

class SqliteStatement;

// One connection. Used on one thread at a time, never across fork. Every failure raises
// SqliteError.
class SqliteDatabase {
 public:
  enum class Access { kCreate, kReadWrite, kReadOnly };
  // `path`: an absolute host path without links (none is followed).
  SqliteDatabase(const std::string& path, Access access);
  // A database in memory that begins as these bytes of a database file say.
  static std::unique_ptr<SqliteDatabase> ofBytes(std::span<const std::uint8_t> bytes);
  ~SqliteDatabase();
  SqliteDatabase(const SqliteDatabase&) = delete;
  SqliteDatabase& operator=(const SqliteDatabase&) = delete;

  // Fixed text without values, one or more statements.
  void execute(const char* sql);
  // Commits, again and again for a minute while readers of other processes are in the way.
  void commit();
  void rollback();
  // What is read in between takes the file's lock once instead of once a statement. Neither counts
  // as a statement; false when it cannot begin.
  bool beginReading();
  void endReading();
  // From now on no commit succeeds: whoever tries one gets an error and a rollback.
  void refuseCommits();
  // Puts all of this database, as of one moment, in the place of all that is in the target, as one
  // transaction of the target: SQLite's online backup. Good while others read either of them. Asked
  // between steps, `goOn` ends it (SQLITE_INTERRUPT) by saying no.
  void copyTo(SqliteDatabase& target, const std::function<bool()>& goOn = {});
  // Of the file; empty for a database in memory.
  std::string path() const;
  std::uint64_t statementsRun() const { return statementsRun_; }
  std::uint64_t rowsWritten() const;

 private:
  friend class SqliteStatement;
  sqlite3_stmt* prepared(const char* sql);
  [[noreturn]] void fail(int code, std::string_view doing) const;

  sqlite3* connection_ = nullptr;
  // By the address of the literal: each place in the code has its own.
  std::unordered_map<const char*, sqlite3_stmt*> statements_;
  std::uint64_t statementsRun_ = 0;
};

// One use of a prepared statement, from binding to the last row. Texts of columns live until the
// next step. `sql` is a literal; a statement is not used again while an earlier use is alive.
class SqliteStatement {
 public:
  SqliteStatement(SqliteDatabase& database, const char* sql);
  ~SqliteStatement();
  SqliteStatement(const SqliteStatement&) = delete;
  SqliteStatement& operator=(const SqliteStatement&) = delete;

  // Values are bound in order, one call each. Reals have to be numbers (a NaN raises).
  SqliteStatement& integer(std::int64_t value);
  SqliteStatement& real(double value);
  SqliteStatement& text(std::string_view value);
  SqliteStatement& null();
  SqliteStatement& optionalInteger(const std::optional<std::int64_t>& value);
  SqliteStatement& optionalReal(const std::optional<double>& value);
  SqliteStatement& optionalText(const std::optional<std::string>& value);

  // True while there is a row.
  bool step();
  // For statements that give no rows.
  void run();
  // Ready to be bound and run once more.
  void again();

  bool isNull(int column) const;
  std::int64_t integerAt(int column) const;
  double realAt(int column) const;
  std::string textAt(int column) const;
  std::string_view textViewAt(int column) const;
  std::optional<std::int64_t> optionalIntegerAt(int column) const;
  std::optional<double> optionalRealAt(int column) const;
  std::optional<std::string> optionalTextAt(int column) const;

 private:
  void check(int code);

  SqliteDatabase& database_;
  sqlite3_stmt* statement_;
  int bound_ = 0;
  bool started_ = false;
};

}  // namespace kx
