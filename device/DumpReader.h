#pragma once

#include "device/LibraryRows.h"
#include "device/ReferenceDevice.h"
#include "device/Sqlite.h"

namespace kx {

// Reads the library whole, in one read transaction. Raises SqliteError. Used on the thread of the
// connection.
DeviceDump readDump(SqliteDatabase& database);
// The rest of a dump: state files, and with `hash` the SHA-256 of each asset's file that is there.
void addFilesToDump(const DeviceRoot& root, bool hash, DeviceDump* dump);

}  // namespace kx
