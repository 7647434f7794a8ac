#include <string>
#include <vector>

#include "daemon/Ferrule.h"
#include "daemon/ProcessMemory.h"
#include "daemon/drive/DriveConsole.h"

int main(int count, char** values) {
  kx::keepFreedMemory();
  return kx::runFerrule(
      std::vector<std::string>(values + 1, values + count),
      {{"drive",
        {"ferrule drive DEVICE   call the plug-in step by step: one JSON object a "
         "line",
         kx::runDrive}}});
}
