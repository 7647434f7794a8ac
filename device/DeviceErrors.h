#pragma once

#include <string>

#include "device/ReferenceDevice.h"

namespace kx {

// Makers of the device's errors. Texts name the object; control bytes in it are escaped.
ErrorPtr deviceError(DeviceError code, const std::string& message);
// kNoSpace for ENOSPC and EDQUOT, else kIo with "errno": "<what> <object>: <system text>".
ErrorPtr systemError(const std::string& what, const std::string& object, int errorNumber);
// Domain "POSIX", errno as the code: what the file system interface gives.
ErrorPtr posixError(const std::string& path, int errorNumber);

}  // namespace kx
