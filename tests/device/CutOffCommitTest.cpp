#include "device/CutOffCommit.h"

#include <gtest/gtest.h>
#include <sqlite3.h>

#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

namespace fs = std::filesystem;
using Bytes = std::vector<std::uint8_t>;

Bytes contentOf(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

void put(const std::string& path, const Bytes& bytes) {
  std::ofstream(path, std::ios::binary)
      .write(reinterpret_cast<const char*>(bytes.data()),
             static_cast<std::streamsize>(bytes.size()));
}

void run(sqlite3* connection, const std::string& sql) {
  ASSERT_EQ(sqlite3_exec(connection, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK)
      << sql << ": " << sqlite3_errmsg(connection);
}

// A database and its journal as a kill in the middle of a commit leaves them.
class CutOff {
 public:
  explicit CutOff(unsigned seed) : random_(seed) {
    const std::string path = directory_.path() + "/library";
    sqlite3* connection = nullptr;
    EXPECT_EQ(sqlite3_open(path.c_str(), &connection), SQLITE_OK);
    run(connection, "PRAGMA page_size=" + std::to_string(512U << (random_() % 4)));
    run(connection, "CREATE TABLE t(pk INTEGER PRIMARY KEY, text)");
    const std::string some = std::to_string(50 + random_() % 400);
    run(connection, "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i+1 FROM n WHERE i < " +
                        some + ") INSERT INTO t SELECT i, hex(randomblob(100)) FROM n");
    before = contentOf(path);
    // Pages are written early, in several parts of the journal.
    run(connection, "PRAGMA cache_size=2; PRAGMA cache_spill=2; BEGIN");
    for (unsigned i = 1 + random_() % 4; i > 0; --i) {
      run(connection,
          "UPDATE t SET text = hex(randomblob(120)) WHERE pk % " + std::to_string(i) + " = 0");
      run(connection, "INSERT INTO t(text) SELECT hex(randomblob(60)) FROM t LIMIT 40");
    }
    database = contentOf(path);
    journal = contentOf(path + "-journal");
    sqlite3_close(connection);
  }

  // What SQLite makes of the two.
  Bytes takenBackBySqlite() const {
    const std::string path = directory_.path() + "/copy";
    put(path, database);
    put(path + "-journal", journal);
    sqlite3* connection = nullptr;
    EXPECT_EQ(sqlite3_open(path.c_str(), &connection), SQLITE_OK);
    sqlite3_exec(connection, "SELECT count(*) FROM sqlite_schema", nullptr, nullptr, nullptr);
    sqlite3_close(connection);
    EXPECT_FALSE(fs::exists(path + "-journal"));
    return contentOf(path);
  }
  Bytes takenBack() const {
    Bytes bytes = database;
    takeBack(journal, &bytes);
    return bytes;
  }

  std::mt19937& random() { return random_; }

  Bytes before, database, journal;

 private:
  std::mt19937 random_;
  TemporaryDirectory directory_;
};

TEST(CutOffCommitTest, TakesTheCommitBackAsSqliteDoes) {
  const unsigned base = std::random_device{}();
  for (unsigned seed = base; seed < base + 25; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    const CutOff cutOff(seed);
    ASSERT_GT(cutOff.journal.size(), 512U);
    EXPECT_EQ(cutOff.takenBack(), cutOff.before);
    EXPECT_EQ(cutOff.takenBackBySqlite(), cutOff.before);
  }
}

TEST(CutOffCommitTest, UsesAJournalAsFarAsItIsWhole) {
  const unsigned base = std::random_device{}();
  for (unsigned seed = base; seed < base + 40; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    CutOff cutOff(seed);
    const std::size_t place = 512 + cutOff.random()() % (cutOff.journal.size() - 512);
    if (seed % 2 == 0) {
      cutOff.journal.resize(place);
    } else {
      cutOff.journal[place] = static_cast<std::uint8_t>(cutOff.journal[place] + 1);
    }
    EXPECT_EQ(cutOff.takenBack(), cutOff.takenBackBySqlite());
  }
}

TEST(CutOffCommitTest, LeavesTheDatabaseAloneWithoutAJournalOfItsKind) {
  const Bytes database(1024, 7);
  for (const Bytes& journal : {Bytes(), Bytes(600, 0), Bytes(27, 0xd9)}) {
    Bytes bytes = database;
    takeBack(journal, &bytes);
    EXPECT_EQ(bytes, database);
  }
}

}  // namespace
}  // namespace kx
