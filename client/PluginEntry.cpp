#include <cstdint>

#include "client/KXSyncClient.h"

// The module's one entry point (FRPluginEntry). Never throws.
extern "C" __attribute__((visibility("default"))) kx::FRClient* kxsync_plugin_create_client(
    kx::Platform* platform, std::uint32_t interfaceVersion) noexcept {
  if (platform == nullptr || interfaceVersion != kx::kFRInterfaceVersion) return nullptr;
  try {
    kx::setLogSinks(platform->logs());
    return new kx::KXSyncClient(*platform);
  } catch (...) {
    return nullptr;
  }
}
