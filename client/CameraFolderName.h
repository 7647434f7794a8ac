#pragma once

#include <string_view>

namespace kx {

// Whether a directory name is that of a camera folder: an integer from 100 to 999, as a scanner
// reads one (leading blanks and a sign are accepted), then two to five letters, then nothing more.
// UTF-8. Any thread.
bool isCameraFolderName(std::string_view name);

}  // namespace kx
