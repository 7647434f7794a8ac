#include "daemon/ProcessMemory.h"

#include <malloc.h>
#include <sys/mman.h>
#include <unistd.h>

#include <climits>
#include <cstdint>
#include <cstdlib>

namespace kx {
namespace {

// The most that the allocator takes; what is larger is a mapping of its own.
constexpr int kLargestKeptBytes = 32 << 20;
// How much more of the heap is reserved than is asked for; unused, it takes no memory.
constexpr int kReserveBytes = 256 << 20;

// Has the heap, as far as it is reserved now, made of large pages: a library's records are walked
// over so often that small ones cost a tenth of a sync.
void useLargePages() {
  ::mallopt(M_TOP_PAD, kReserveBytes);
  void* const grow = std::malloc(kLargestKeptBytes / 2);
  if (grow == nullptr) return;
  const auto page = static_cast<std::uintptr_t>(::sysconf(_SC_PAGESIZE));
  const std::uintptr_t from = (reinterpret_cast<std::uintptr_t>(grow) + page - 1) / page * page;
  const auto to = reinterpret_cast<std::uintptr_t>(::sbrk(0));
  std::free(grow);
  if (from < to) ::madvise(reinterpret_cast<void*>(from), to - from, MADV_HUGEPAGE);
  ::mallopt(M_TOP_PAD, 128 << 10);
}

}  // namespace

void keepFreedMemory() {
  // Each only tunes the allocator: one that is refused costs time and nothing else.
  ::mallopt(M_ARENA_MAX, 1);
  ::mallopt(M_MMAP_THRESHOLD, kLargestKeptBytes);
  ::mallopt(M_TRIM_THRESHOLD, INT_MAX);
  useLargePages();
}

}  // namespace kx
