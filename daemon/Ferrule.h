#pragma once

#include <functional>
#include <map>
#include <string>
#include <vector>

namespace kx {

// A sub-command beside sync: its arguments with its own name first, and its exit code.
struct FerruleCommand {
  std::string usage;  // a line of the help text: "ferrule drive DEVICE    what it does"
  std::function<int(const std::vector<std::string>& arguments)> run;
};
using FerruleCommands = std::map<std::string, FerruleCommand>;

// The daemon's command line without its name: "sync HOST DEVICE", one of `further`, "--help",
// "--version". Writes to the standard streams and returns the exit code. Call it on the main thread
// while it is the only one.
int runFerrule(const std::vector<std::string>& arguments, const FerruleCommands& further);

}  // namespace kx
