#pragma once

#include <functional>
#include <string>

#include "device/DeviceRoot.h"

namespace kx {

// What the backup service needs of the library. The library may be open, here and in other
// processes; nothing of it is changed. Errors are the device's. Any thread.

// The identity of the device's library, made with it; empty and an error when it cannot be read.
std::string libraryIdentity(const DeviceRoot& device, ErrorPtr* error);

// A copy of the library as of one moment, by SQLite's online backup, checked and without journals.
// `to`: an absolute host path without links where no file is. It is not synced to disk, and after a
// failure something may be left there. False and an error; `goOn` saying no is kIo.
bool copyLibrary(const DeviceRoot& device, const std::string& to, const std::function<bool()>& goOn,
                 ErrorPtr* error);

}  // namespace kx
