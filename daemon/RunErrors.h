#pragma once

#include <string>

#include "daemon/PluginHost.h"
#include "daemon/SyncRunner.h"

namespace kx {

inline constexpr const char* kNoSpaceText = "no space left on the device";

// An error of the daemon itself; control bytes in the message are escaped.
ErrorPtr syncError(SyncErrorCode code, const std::string& message);
// The error with words before its message.
ErrorPtr prefixed(const std::string& prefix, const Error& error);
// A call into the plug-in raised.
ErrorPtr raisedError(const std::string& call, const RaisedException& raised);
// A signal has ended the run.
ErrorPtr interruptedError(int signal);

}  // namespace kx
