#pragma once

#include <string_view>

#include "platform/sync/FRLog.h"
#include "testing/CapturingLogs.h"

namespace kx {

// Keeps every message that is logged during its life and puts the old sinks back afterwards. One at
// a time.
class CapturedLog : public CapturingLogs {
 public:
  CapturedLog() : previous_(logSinks()) { setLogSinks(sinks()); }
  ~CapturedLog() { setLogSinks(previous_); }
  CapturedLog(const CapturedLog&) = delete;
  CapturedLog& operator=(const CapturedLog&) = delete;

  // The messages as "level source function text", one a line.
  std::string lines() const {
    std::string all;
    for (const CapturedMessage& message : messages()) {
      all += std::to_string(static_cast<int>(message.level)) + " " + message.source + " " +
             message.function + " " + message.text + "\n";
    }
    return all;
  }

 private:
  LogSinks previous_;
};

}  // namespace kx
