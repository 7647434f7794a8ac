#pragma once

#include <sqlite3.h>

#include <atomic>
#include <functional>

namespace kx {

// Stands between SQLite and the file system: counts what changes files (write, truncate, sync,
// delete) and makes it fail or stop the process at a chosen one. One for the whole test program;
// installed as the default by its first use.
class FaultVfs {
 public:
  static FaultVfs& shared();

  // Operations from now on.
  void reset() {
    count_ = 0;
    failAt_ = -1;
    failures_ = 0;
    onOperation_ = nullptr;
  }
  // The operation with that number (0 is the next), and `times - 1` after it, give `code`.
  void failAt(long operation, int code, long times = 1) {
    count_ = 0;
    failures_ = 0;
    code_ = code;
    times_ = times;
    failAt_ = operation;
  }
  long count() const { return count_; }
  long failures() const { return failures_; }
  // Called before each operation with its number.
  void onOperation(std::function<void(long)> handler) { onOperation_ = std::move(handler); }

  // For the shim's functions: SQLITE_OK, or what to answer instead of doing it.
  int next();

 private:
  FaultVfs();

  std::atomic<long> count_{0}, failAt_{-1}, failures_{0};
  std::atomic<long> times_{1};
  std::atomic<int> code_{SQLITE_OK};
  std::function<void(long)> onOperation_;
};

}  // namespace kx
