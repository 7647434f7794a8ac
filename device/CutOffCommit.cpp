#include "device/CutOffCommit.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <string>

#include "device/DeviceLayout.h"

namespace kx {
namespace {

constexpr std::array<std::uint8_t, 8> kMagic = {0xd9, 0xd5, 0x05, 0xf9, 0x20, 0xa1, 0x63, 0xd7};
constexpr std::size_t kHeaderBytes = 28;
constexpr std::uint32_t kUntilTheEnd = 0xffffffff;
constexpr std::size_t kSmallestPage = 512;
constexpr std::size_t kLargestPage = 65536;
// Every so many bytes of a page, from its end, count in its checksum.
constexpr std::size_t kChecksumStep = 200;

std::string journalPath() { return std::string(device_paths::kDatabase) + "-journal"; }

std::uint32_t number(std::span<const std::uint8_t> bytes, std::size_t at) {
  return (static_cast<std::uint32_t>(bytes[at]) << 24) |
         (static_cast<std::uint32_t>(bytes[at + 1]) << 16) |
         (static_cast<std::uint32_t>(bytes[at + 2]) << 8) | bytes[at + 3];
}

// One part of a journal: a header that fills a sector, then records.
struct Part {
  std::uint32_t records = 0;
  std::uint32_t nonce = 0;
  std::uint32_t pages = 0;  // of the database, before the commit
  std::size_t sectorBytes = 0;
  std::size_t pageBytes = 0;
};

bool isSize(std::size_t bytes) {
  return bytes >= kSmallestPage && bytes <= kLargestPage && (bytes & (bytes - 1)) == 0;
}

std::optional<Part> partAt(std::span<const std::uint8_t> journal, std::size_t at) {
  if (at > journal.size() || journal.size() - at < kHeaderBytes) return std::nullopt;
  if (!std::equal(kMagic.begin(), kMagic.end(), journal.begin() + static_cast<long>(at))) {
    return std::nullopt;
  }
  const Part part{number(journal, at + 8), number(journal, at + 12), number(journal, at + 16),
                  number(journal, at + 20), number(journal, at + 24)};
  return part;
}

std::uint32_t checksum(std::span<const std::uint8_t> page, std::uint32_t nonce) {
  std::uint32_t sum = nonce;
  for (std::size_t i = page.size() - kChecksumStep; i > 0 && i < page.size(); i -= kChecksumStep) {
    sum += page[i];
  }
  return sum;
}

// The records of one part from `at` on, which is moved behind them; false ends the whole.
bool takeBackPart(std::span<const std::uint8_t> journal, const Part& part, std::size_t* at,
                  std::vector<std::uint8_t>* database) {
  const std::size_t recordBytes = part.pageBytes + 8;
  for (std::uint32_t record = 0; record < part.records; ++record) {
    if (*at > journal.size() || journal.size() - *at < recordBytes) return false;
    const std::size_t page = number(journal, *at);
    const auto content = journal.subspan(*at + 4, part.pageBytes);
    const std::uint32_t sum = number(journal, *at + 4 + part.pageBytes);
    *at += recordBytes;
    if (page == 0 || sum != checksum(content, part.nonce)) return false;
    if (page > part.pages) continue;
    const std::size_t offset = (page - 1) * part.pageBytes;
    if (database->size() < offset + part.pageBytes) database->resize(offset + part.pageBytes);
    std::copy(content.begin(), content.end(), database->begin() + static_cast<long>(offset));
  }
  return true;
}

}  // namespace

void takeBack(std::span<const std::uint8_t> journal, std::vector<std::uint8_t>* database) {
  const std::optional<Part> first = partAt(journal, 0);
  if (!first || !isSize(first->pageBytes) || first->sectorBytes < kHeaderBytes) return;
  std::size_t at = 0;
  while (std::optional<Part> part = partAt(journal, at)) {
    // The sizes are those of the first part, which alone is sure to have them.
    part->sectorBytes = first->sectorBytes;
    part->pageBytes = first->pageBytes;
    part->pages = first->pages;
    if (part->records == kUntilTheEnd) {
      part->records =
          static_cast<std::uint32_t>((journal.size() - part->sectorBytes) / (part->pageBytes + 8));
    }
    at += part->sectorBytes;
    if (!takeBackPart(journal, *part, &at, database)) break;
    at = (at + first->sectorBytes - 1) / first->sectorBytes * first->sectorBytes;
  }
  database->resize(static_cast<std::size_t>(first->pages) * first->pageBytes);
}

bool hasCutOffCommit(const DeviceRoot& root) {
  struct stat status;
  return root.status(journalPath(), &status) == 0 && status.st_size > 0;
}

int readBeforeCutOffCommit(const DeviceRoot& root, std::vector<std::uint8_t>* out) {
  std::vector<std::uint8_t> journal;
  if (const int failed = root.readFile(journalPath(), &journal); failed != 0) return failed;
  if (const int failed = root.readFile(device_paths::kDatabase, out); failed != 0) return failed;
  takeBack(journal, out);
  return 0;
}

}  // namespace kx
