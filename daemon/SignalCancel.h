#pragma once

#include <functional>
#include <memory>

#include "daemon/SyncRunner.h"

namespace kx {

// While it lives, SIGINT and SIGTERM trip the token instead of ending the process. A sync that has
// not ended 1.8 seconds after the first signal, or at a second one, is ended by the process's end
// (exit code 128 + signal) after `beforeForcedExit` was called on the watching thread: every step
// is safe against that. Make it on the main thread before any other thread is started (threads
// inherit the blocked signals) and destroy it there.
class SignalCancel {
 public:
  SignalCancel(CancelToken& token, std::function<void(int signal)> beforeForcedExit);
  ~SignalCancel();
  SignalCancel(const SignalCancel&) = delete;
  SignalCancel& operator=(const SignalCancel&) = delete;

 private:
  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace kx
