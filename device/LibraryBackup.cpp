#include "device/LibraryBackup.h"

#include "device/DeviceLayout.h"
#include "device/LibrarySchema.h"
#include "device/Sqlite.h"

namespace kx {

std::string libraryIdentity(const DeviceRoot& device, ErrorPtr* error) {
  const OpenedLibrary library =
      openLibraryForReading(device.hostPath() + device_paths::kDatabase, error);
  if (!library.database) return {};
  try {
    SqliteStatement row(*library.database, "SELECT value FROM info WHERE key = 'store'");
    return row.step() ? row.textAt(0) : std::string();
  } catch (const SqliteError& failure) {
    setError(error, failure.asError());
    return {};
  }
}

bool copyLibrary(const DeviceRoot& device, const std::string& to, const std::function<bool()>& goOn,
                 ErrorPtr* error) {
  const OpenedLibrary library =
      openLibraryForReading(device.hostPath() + device_paths::kDatabase, error);
  if (!library.database) return false;
  try {
    SqliteDatabase copy(to, SqliteDatabase::Access::kCreate);
    copy.execute("PRAGMA journal_mode=OFF; PRAGMA synchronous=OFF");
    library.database->copyTo(copy, goOn);
    if (ErrorPtr damaged = quickCheck(copy)) {
      setError(error, std::move(damaged));
      return false;
    }
    return true;
  } catch (const SqliteError& failure) {
    setError(error, failure.asError());
    return false;
  }
}

}  // namespace kx
