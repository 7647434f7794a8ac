#include "tests/device/FaultVfs.h"

#include <cstring>

namespace kx {
namespace {

struct ShimFile {
  sqlite3_file base;
  // The real file follows in memory.
  sqlite3_file* real() { return reinterpret_cast<sqlite3_file*>(this + 1); }
};

sqlite3_file* real(sqlite3_file* file) { return reinterpret_cast<ShimFile*>(file)->real(); }
sqlite3_vfs* realVfs(sqlite3_vfs* vfs) { return static_cast<sqlite3_vfs*>(vfs->pAppData); }

int shimClose(sqlite3_file* file) { return real(file)->pMethods->xClose(real(file)); }
int shimRead(sqlite3_file* file, void* into, int bytes, sqlite3_int64 offset) {
  return real(file)->pMethods->xRead(real(file), into, bytes, offset);
}
int shimWrite(sqlite3_file* file, const void* from, int bytes, sqlite3_int64 offset) {
  if (const int code = FaultVfs::shared().next(); code != SQLITE_OK) return code;
  return real(file)->pMethods->xWrite(real(file), from, bytes, offset);
}
int shimTruncate(sqlite3_file* file, sqlite3_int64 size) {
  if (const int code = FaultVfs::shared().next(); code != SQLITE_OK) return code;
  return real(file)->pMethods->xTruncate(real(file), size);
}
int shimSync(sqlite3_file* file, int flags) {
  if (const int code = FaultVfs::shared().next(); code != SQLITE_OK) return code;
  return real(file)->pMethods->xSync(real(file), flags);
}
int shimFileSize(sqlite3_file* file, sqlite3_int64* size) {
  return real(file)->pMethods->xFileSize(real(file), size);
}
int shimLock(sqlite3_file* file, int level) {
  return real(file)->pMethods->xLock(real(file), level);
}
int shimUnlock(sqlite3_file* file, int level) {
  return real(file)->pMethods->xUnlock(real(file), level);
}
int shimCheckReservedLock(sqlite3_file* file, int* out) {
  return real(file)->pMethods->xCheckReservedLock(real(file), out);
}
int shimFileControl(sqlite3_file* file, int op, void* argument) {
  return real(file)->pMethods->xFileControl(real(file), op, argument);
}
int shimSectorSize(sqlite3_file* file) { return real(file)->pMethods->xSectorSize(real(file)); }
int shimCharacteristics(sqlite3_file* file) {
  return real(file)->pMethods->xDeviceCharacteristics(real(file));
}

const sqlite3_io_methods kMethods = {1,
                                     shimClose,
                                     shimRead,
                                     shimWrite,
                                     shimTruncate,
                                     shimSync,
                                     shimFileSize,
                                     shimLock,
                                     shimUnlock,
                                     shimCheckReservedLock,
                                     shimFileControl,
                                     shimSectorSize,
                                     shimCharacteristics,
                                     nullptr,
                                     nullptr,
                                     nullptr,
                                     nullptr,
                                     nullptr,
                                     nullptr};

int shimOpen(sqlite3_vfs* vfs, const char* name, sqlite3_file* file, int flags, int* outFlags) {
  const int code = realVfs(vfs)->xOpen(realVfs(vfs), name, real(file), flags, outFlags);
  file->pMethods = real(file)->pMethods != nullptr ? &kMethods : nullptr;
  return code;
}

int shimDelete(sqlite3_vfs* vfs, const char* name, int syncDirectory) {
  if (const int code = FaultVfs::shared().next(); code != SQLITE_OK) return code;
  return realVfs(vfs)->xDelete(realVfs(vfs), name, syncDirectory);
}

}  // namespace

FaultVfs& FaultVfs::shared() {
  static FaultVfs vfs;
  return vfs;
}

FaultVfs::FaultVfs() {
  static sqlite3_vfs shim;
  sqlite3_vfs* const found = sqlite3_vfs_find(nullptr);
  shim = *found;
  shim.zName = "fault";
  shim.pNext = nullptr;
  shim.pAppData = found;
  shim.szOsFile = found->szOsFile + static_cast<int>(sizeof(ShimFile));
  shim.xOpen = shimOpen;
  shim.xDelete = shimDelete;
  sqlite3_vfs_register(&shim, 1);
}

int FaultVfs::next() {
  const long number = count_++;
  if (onOperation_) onOperation_(number);
  const long first = failAt_;
  if (first < 0 || number < first || number >= first + times_) return SQLITE_OK;
  ++failures_;
  return code_;
}

}  // namespace kx
