#include "daemon/ProcessMemory.h"

#include <malloc.h>

#include <climits>

namespace kx {
namespace {

// The most that the allocator takes; what is larger is a mapping of its own.
constexpr int kLargestKeptBytes = 32 << 20;

}  // namespace

void keepFreedMemory() {
  // Each only tunes the allocator: one that is refused costs time and nothing else.
  ::mallopt(M_ARENA_MAX, 1);
  ::mallopt(M_MMAP_THRESHOLD, kLargestKeptBytes);
  ::mallopt(M_TRIM_THRESHOLD, INT_MAX);
}

}  // namespace kx
