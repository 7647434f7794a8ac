#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace kx::test {

// How a program ended, and how many calls it made that leave a trace on a disk: files made,
// written, synced, renamed, removed.
struct TracedRun {
  bool killed = false;
  int exitCode = -1;
  std::uint64_t effects = 0;
};

// Runs a program under ptrace, with its output thrown away. Just before its `killBefore`-th such
// call (counted over all its threads, from 1) it is killed with SIGKILL; 0 lets it end.
TracedRun runTraced(const std::vector<std::string>& arguments, std::uint64_t killBefore);

// Runs a program and gives what it wrote to standard output.
std::string runForOutput(const std::vector<std::string>& arguments, int* exitCode);

// Whether this process may trace its children.
bool canTrace();

}  // namespace kx::test
