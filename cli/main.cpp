#include <string>
#include <vector>

#include "cli/Cli.h"
#include "daemon/ProcessMemory.h"

int main(int argc, char** argv) {
  kx::keepFreedMemory();
  const std::vector<std::string> arguments(argv + (argc > 0 ? 1 : 0), argv + argc);
  kx::cli::Console console(kx::cli::Console::processSetup());
  return kx::cli::run(arguments, console);
}
