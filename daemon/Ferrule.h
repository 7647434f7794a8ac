#pragma once

#include <string>
#include <vector>

namespace kx {

// The daemon's command line without its name: "sync HOST DEVICE", "drive DEVICE", "--help",
// "--version". Writes to the standard streams and returns the exit code. Call it on the main
// thread.
int runFerrule(const std::vector<std::string>& arguments);

}  // namespace kx
