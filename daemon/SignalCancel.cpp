#include "daemon/SignalCancel.h"

#include <pthread.h>
#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <ctime>
#include <thread>

namespace kx {
namespace {

constexpr timespec kGrace{1, 800'000'000};

sigset_t watchedSignals() {
  sigset_t set;
  ::sigemptyset(&set);
  ::sigaddset(&set, SIGINT);
  ::sigaddset(&set, SIGTERM);
  return set;
}

}  // namespace

// The watching thread is woken for its end by a SIGTERM of its own, after `isOver` was set.
struct SignalCancel::State {
  CancelToken& token;
  std::function<void(int)> beforeForcedExit;
  std::atomic<bool> isOver{false};
  sigset_t before{};
  std::thread watcher;

  void watch() {
    const sigset_t set = watchedSignals();
    int signal = 0;
    while (::sigwait(&set, &signal) != 0) {
    }
    if (isOver) return;
    token.cancel(signal);
    // A second signal, or the time being up, ends the process; our own wake-up ends the watch.
    while (::sigtimedwait(&set, nullptr, &kGrace) < 0 && errno == EINTR) {
    }
    if (isOver) return;
    if (beforeForcedExit) beforeForcedExit(signal);
    ::_exit(128 + signal);
  }
};

SignalCancel::SignalCancel(CancelToken& token, std::function<void(int signal)> beforeForcedExit)
    : state_(new State{token, std::move(beforeForcedExit), {}, {}, {}}) {
  const sigset_t set = watchedSignals();
  ::pthread_sigmask(SIG_BLOCK, &set, &state_->before);
  state_->watcher = std::thread([state = state_.get()] { state->watch(); });
}

SignalCancel::~SignalCancel() {
  state_->isOver = true;
  ::pthread_kill(state_->watcher.native_handle(), SIGTERM);
  state_->watcher.join();
  ::pthread_sigmask(SIG_SETMASK, &state_->before, nullptr);
}

}  // namespace kx
