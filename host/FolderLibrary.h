#pragma once

#include <memory>
#include <string>

#include "host/HostLibrary.h"

namespace kx {

// Reads a folder of photos and videos as a host library. `path` is canonical and `folder` the
// directory that it names. Errors as openHostLibrary.
std::unique_ptr<HostLibrary> readFolderLibrary(const std::string& path, FileHandle folder,
                                               const HostOptions& options, ErrorPtr* error);

}  // namespace kx
