#include <condition_variable>
#include <cstdio>
#include <deque>
#include <exception>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/dispatch/Dispatch.h"
#include "platform/foundation/Exceptions.h"

namespace kx {

struct DispatchQueue::State {
  std::string label;
  std::size_t width = 1;
  std::mutex mutex;
  std::condition_variable work;
  std::condition_variable progress;
  std::deque<Block> blocks;
  std::vector<std::thread> threads;
  // Blocks are numbered in the order submitted: drain waits for numbers below its own.
  std::uint64_t submitted = 0;
  std::uint64_t finished = 0;
  bool closing = false;
};

namespace {

// The queue whose block this thread is running.
thread_local const void* currentQueue = nullptr;

void runBlock(const std::string& label, Block block) {
  try {
    block();
  } catch (const std::exception& exception) {
    std::fprintf(stderr, "%s: an exception left a block: %s\n", label.c_str(), exception.what());
    std::terminate();
  } catch (...) {
    std::fprintf(stderr, "%s: an exception of unknown type left a block\n", label.c_str());
    std::terminate();
  }
}

}  // namespace

DispatchQueue::DispatchQueue(std::shared_ptr<State> state) : state_(std::move(state)) {
  auto run = [](const std::shared_ptr<State>& shared) {
    currentQueue = shared.get();
    std::unique_lock<std::mutex> lock(shared->mutex);
    while (true) {
      shared->work.wait(lock, [&] { return shared->closing || !shared->blocks.empty(); });
      if (shared->blocks.empty()) return;
      Block block = std::move(shared->blocks.front());
      shared->blocks.pop_front();
      lock.unlock();
      runBlock(shared->label, std::move(block));
      lock.lock();
      ++shared->finished;
      shared->progress.notify_all();
    }
  };
  for (std::size_t i = 0; i < state_->width; ++i) state_->threads.emplace_back(run, state_);
}

std::shared_ptr<DispatchQueue> DispatchQueue::serial(std::string label) {
  auto state = std::make_shared<State>();
  state->label = std::move(label);
  return std::shared_ptr<DispatchQueue>(new DispatchQueue(std::move(state)));
}

std::shared_ptr<DispatchQueue> DispatchQueue::concurrent(std::string label, std::size_t threads) {
  auto state = std::make_shared<State>();
  state->label = std::move(label);
  state->width = threads == 0 ? 1 : threads;
  return std::shared_ptr<DispatchQueue>(new DispatchQueue(std::move(state)));
}

DispatchQueue::~DispatchQueue() {
  {
    std::lock_guard<std::mutex> lock(state_->mutex);
    state_->closing = true;
    state_->work.notify_all();
  }
  for (std::thread& thread : state_->threads) {
    // Released by its own block: that thread ends by itself and keeps the state alive until then.
    if (thread.get_id() == std::this_thread::get_id()) {
      thread.detach();
    } else {
      thread.join();
    }
  }
}

const std::string& DispatchQueue::label() const { return state_->label; }

void DispatchQueue::async(Block block) {
  std::lock_guard<std::mutex> lock(state_->mutex);
  state_->blocks.push_back(std::move(block));
  ++state_->submitted;
  state_->work.notify_one();
}

void DispatchQueue::async(const DispatchGroupPtr& group, Block block) {
  if (!group) {
    async(std::move(block));
    return;
  }
  group->enter();
  async([group, work = std::move(block)]() mutable {
    work();
    work = nullptr;
    group->leave();
  });
}

void DispatchQueue::sync(const Block& block) {
  if (isCurrent() && state_->width == 1) {
    throw InternalInconsistency("sync on " + state_->label + " from one of its own blocks");
  }
  std::exception_ptr thrown;
  DispatchSemaphore done(0);
  async([&] {
    try {
      block();
    } catch (...) {
      thrown = std::current_exception();
    }
    done.signal();
  });
  done.wait();
  if (thrown) std::rethrow_exception(thrown);
}

void DispatchQueue::drain() {
  if (isCurrent()) {
    throw InternalInconsistency("drain of " + state_->label + " from one of its own blocks");
  }
  std::unique_lock<std::mutex> lock(state_->mutex);
  const std::uint64_t target = state_->submitted;
  state_->progress.wait(lock, [&] { return state_->finished >= target; });
}

bool DispatchQueue::isCurrent() const { return currentQueue == state_.get(); }

struct DispatchSource::State {
  std::mutex mutex;
  std::shared_ptr<Block> handler;
  bool listening = false;
};

DispatchSource::DispatchSource(DispatchQueuePtr queue)
    : state_(std::make_shared<State>()), queue_(std::move(queue)) {}

DispatchSource::~DispatchSource() { cancel(); }

void DispatchSource::setEventHandler(Block handler) {
  auto shared = std::make_shared<Block>(std::move(handler));
  std::lock_guard<std::mutex> lock(state_->mutex);
  state_->handler.swap(shared);
}

void DispatchSource::resume() {
  std::lock_guard<std::mutex> lock(state_->mutex);
  state_->listening = state_->handler != nullptr;
}

void DispatchSource::cancel() {
  // Declared before the lock: what the handler captured is released after it.
  std::shared_ptr<Block> released;
  std::lock_guard<std::mutex> lock(state_->mutex);
  state_->listening = false;
  released.swap(state_->handler);
}

void DispatchSource::raise() {
  if (!isListening()) return;
  queue_->async([weak = std::weak_ptr<State>(state_)] {
    std::shared_ptr<Block> handler;
    if (const std::shared_ptr<State> state = weak.lock()) {
      std::lock_guard<std::mutex> lock(state->mutex);
      if (state->listening) handler = state->handler;
    }
    if (handler) (*handler)();
  });
}

bool DispatchSource::isListening() const {
  std::lock_guard<std::mutex> lock(state_->mutex);
  return state_->listening;
}

}  // namespace kx
