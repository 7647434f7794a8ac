#pragma once

namespace kx {

// The source that the client's messages name; its categories have names of their own.
inline constexpr const char* kClientSource = "KXSyncClient";

}  // namespace kx
