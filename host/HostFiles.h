#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/HostLibrary.h"

// System calls of the host side. Everything is opened below a held directory; a link is never
// followed, wherever in the path it stands, and no device or FIFO is waited for. Operations give
// 0 or errno unless they say otherwise. Any thread.
namespace kx {

// Opens a directory by a path of the user's own, in which links are followed.
int openFolder(const std::string& path, FileHandle* folder);

// Opens `relativePath` ("a/b.jpg"; "" is the folder itself) below `folder` with the open flags
// given, to which O_NOFOLLOW, O_NONBLOCK and O_CLOEXEC are added.
int openBeneath(int folder, const std::string& relativePath, int flags, FileHandle* file);

// The same without openat2: one component after the other.
int openBeneathByComponents(int folder, const std::string& relativePath, int flags,
                            FileHandle* file);

// Opens a regular file for reading; ELOOP for a link, EINVAL for another kind of file.
int openRegularBeneath(int folder, const std::string& relativePath, FileHandle* file,
                       struct stat* status);

// The same by a path of the user's own; only the last component must not be a link.
int openRegularPath(const std::string& path, FileHandle* file, struct stat* status);

// The same as what openMedia of a library gives.
std::optional<HostMedia> openHostMedia(int folder, const std::string& relativePath,
                                       ErrorPtr* error);

// All names in the directory but "." and "..", in no order.
int forEachName(int folder, const std::function<void(std::string_view)>& visit);
// The same sorted by bytes.
int listNames(int folder, std::vector<std::string>* names);

// Reads the whole file; EFBIG when it is longer than the limit, EIO when it shrinks meanwhile.
int readWhole(int file, std::uint64_t limitBytes, std::vector<std::uint8_t>* bytes);

// Writes all of it.
int writeAll(int file, const void* bytes, std::size_t size);

// Whether the text can be one name in a directory: not empty, ".", "..", longer than 255 bytes, and
// without "/" and NUL.
bool isOneComponent(std::string_view name);

// What strerror says, safe from any thread.
std::string systemErrorText(int error);

// An error of the domain "POSIX": `what` and the system's text.
ErrorPtr posixError(int error, const std::string& what);

}  // namespace kx
