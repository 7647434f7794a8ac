#pragma once

#include <string>
#include <vector>

#include "cli/Console.h"

namespace kx::cli {

// Runs kxsync with the arguments (without the program's name) and gives its exit code. Raises
// nothing. Call it once, on the main thread.
int run(const std::vector<std::string>& arguments, Console& console);

}  // namespace kx::cli
