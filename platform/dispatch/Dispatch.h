#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

namespace kx {

using Block = std::function<void()>;

// A group counts work under way: enter and leave balance, wait returns when the count is 0 (at once
// when nothing was entered). Any thread. Leaving more often than entering raises
// InternalInconsistency. Shared by reference, so that late blocks may still leave it.
class DispatchGroup {
 public:
  DispatchGroup();
  ~DispatchGroup();
  DispatchGroup(const DispatchGroup&) = delete;
  DispatchGroup& operator=(const DispatchGroup&) = delete;

  void enter();
  void leave();
  // No time limit.
  void wait();

 private:
  struct State;
  std::unique_ptr<State> state_;
};
using DispatchGroupPtr = std::shared_ptr<DispatchGroup>;

// A counting semaphore. Any thread. wait without a limit; timed waits go through Clock::wait, since
// nothing but the clock may measure time.
class DispatchSemaphore {
 public:
  explicit DispatchSemaphore(long count);
  ~DispatchSemaphore();
  DispatchSemaphore(const DispatchSemaphore&) = delete;
  DispatchSemaphore& operator=(const DispatchSemaphore&) = delete;

  void signal();
  void wait();
  // Takes the semaphore if that needs no waiting.
  bool tryWait();
  // For clocks alone: false when `timeout` of real time went by.
  bool waitFor(std::chrono::nanoseconds timeout);

 private:
  struct State;
  std::unique_ptr<State> state_;
};

// Work queues. A serial queue runs its blocks one at a time in the order submitted, on a thread of
// its own; a concurrent queue runs them in the order submitted on a small fixed pool. Blocks must
// not throw out of async (an exception that escapes ends the process with a message); sync hands
// the exception to its caller. Destruction runs every block already submitted, then joins; a queue
// may be released by its own block. Calling sync on a serial queue from one of its own blocks
// raises InternalInconsistency instead of waiting for ever.
class DispatchQueue {
 public:
  static std::shared_ptr<DispatchQueue> serial(std::string label);
  static std::shared_ptr<DispatchQueue> concurrent(std::string label, std::size_t threads);

  ~DispatchQueue();
  DispatchQueue(const DispatchQueue&) = delete;
  DispatchQueue& operator=(const DispatchQueue&) = delete;

  const std::string& label() const;
  void async(Block block);
  // Enters the group before the block is queued and leaves it when the block has ended (and its
  // captures are released). A null group counts nowhere.
  void async(const DispatchGroupPtr& group, Block block);
  void sync(const Block& block);
  // Waits until everything submitted before this call has run.
  void drain();
  // Whether the calling thread is running a block of this queue.
  bool isCurrent() const;

 private:
  struct State;
  explicit DispatchQueue(std::shared_ptr<State> state);
  std::shared_ptr<State> state_;
};
using DispatchQueuePtr = std::shared_ptr<DispatchQueue>;

// An event source that watches for memory pressure and nothing else. Made stopped; events are
// delivered on the queue it was made for (concurrent, default priority) from resume until cancel.
// After cancel has returned no new call of the handler begins, and the handler and what it captured
// are released as soon as a call under way has ended; cancelling twice is harmless.
class MemoryPressureSource {
 public:
  virtual ~MemoryPressureSource() = default;
  virtual void setEventHandler(Block handler) = 0;
  virtual void resume() = 0;
  virtual void cancel() = 0;
};

// The delivery half of an event source, for implementations of it: whoever notices the event calls
// raise, and the handler is called once for each on the queue, unless the source is stopped by
// then. Any thread.
class DispatchSource final : public MemoryPressureSource {
 public:
  explicit DispatchSource(DispatchQueuePtr queue);
  ~DispatchSource() override;
  void setEventHandler(Block handler) override;
  void resume() override;
  void cancel() override;
  // Queues one event; nothing happens unless the source has been resumed and not cancelled.
  void raise();
  bool isListening() const;

 private:
  struct State;
  std::shared_ptr<State> state_;
  DispatchQueuePtr queue_;
};

}  // namespace kx
