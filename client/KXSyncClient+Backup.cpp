#include "client/KXSyncClient.h"

namespace kx {

void KXSyncClient::pathsToBackup(StringList* pathsToBackup, StringList* /*pathsNotToBackup*/) {
  if (pathsToBackup != nullptr) *pathsToBackup = {"DCIM"};
}

}  // namespace kx
