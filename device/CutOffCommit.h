#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "device/DeviceRoot.h"

namespace kx {

// A commit of the library that a kill or a power failure cut off leaves the database half written,
// with the journal beside it that takes it back. Whoever opens it for writing does so in the file;
// these do it in memory alone.

// Whether there is such a journal.
bool hasCutOffCommit(const DeviceRoot& root);
// The database as it was before that commit. 0 or an errno.
[[nodiscard]] int readBeforeCutOffCommit(const DeviceRoot& root, std::vector<std::uint8_t>* out);

// Writes the pages of a rollback journal (of SQLite's format, one database) back into the bytes of
// its database. What the journal has not completely is what the commit had not come to.
void takeBack(std::span<const std::uint8_t> journal, std::vector<std::uint8_t>* database);

}  // namespace kx
