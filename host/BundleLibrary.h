#pragma once

#include <memory>
#include <string>

#include "host/HostLibrary.h"

namespace kx {

inline constexpr const char* kBundleSnapshotName = "PhotoLibrary.plist";
inline constexpr const char* kBundleMediaName = "media";

// Whether the directory holds PhotoLibrary.plist and the directory media.
bool isHostBundle(int folder);

// Opens a host bundle: reads its snapshot and, when a file is first asked for, the names in media/.
// The file of an asset is the one named by its UUID exactly, else the first by bytes of those named
// "UUID.*". Errors as openHostLibrary; mediaNames() of a media/ that cannot be listed raises
// std::system_error.
std::unique_ptr<HostLibrary> openBundleLibrary(const std::string& path, FileHandle folder,
                                               ErrorPtr* error);

}  // namespace kx
