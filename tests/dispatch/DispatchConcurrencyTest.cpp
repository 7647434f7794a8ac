#include <gtest/gtest.h>

#include <atomic>
#include <stdexcept>
#include <thread>
#include <vector>

#include "platform/dispatch/Dispatch.h"
#include "platform/foundation/Exceptions.h"

namespace kx {
namespace {

TEST(DispatchQueueConcurrency, SerialQueueRunsBlocksOneAtATimeInTheOrderSubmitted) {
  const DispatchQueuePtr queue = DispatchQueue::serial("test.serial");
  std::vector<int> order;
  std::atomic<int> running{0};
  bool overlapped = false;
  for (int i = 0; i < 1000; ++i) {
    queue->async([&, i] {
      if (++running != 1) overlapped = true;
      order.push_back(i);
      --running;
    });
  }
  queue->drain();
  ASSERT_EQ(order.size(), 1000U);
  for (int i = 0; i < 1000; ++i) EXPECT_EQ(order[static_cast<std::size_t>(i)], i);
  EXPECT_FALSE(overlapped);
}

TEST(DispatchQueueConcurrency, DestructionRunsWhatWasSubmitted) {
  std::atomic<int> ran{0};
  {
    const DispatchQueuePtr queue = DispatchQueue::serial("test.destruction");
    for (int i = 0; i < 100; ++i) queue->async([&] { ++ran; });
  }
  EXPECT_EQ(ran, 100);
}

TEST(DispatchQueueConcurrency, AQueueMayBeReleasedByItsOwnBlock) {
  DispatchSemaphore released(0);
  DispatchQueuePtr queue = DispatchQueue::serial("test.self-release");
  DispatchQueue& raw = *queue;
  DispatchSemaphore handedOver(0);
  raw.async([&released, &handedOver, &queue] {
    handedOver.wait();
    queue.reset();
    released.signal();
  });
  handedOver.signal();
  released.wait();
  EXPECT_EQ(queue, nullptr);
}

TEST(DispatchQueueConcurrency, SyncHandsTheExceptionToItsCaller) {
  const DispatchQueuePtr queue = DispatchQueue::serial("test.throwing");
  EXPECT_THROW(queue->sync([] { throw std::runtime_error("from the block"); }), std::runtime_error);
  bool ran = false;
  queue->sync([&] { ran = true; });
  EXPECT_TRUE(ran);
}

TEST(DispatchQueueConcurrency, SyncFromItsOwnBlockRaisesInsteadOfWaitingForEver) {
  const DispatchQueuePtr queue = DispatchQueue::serial("test.nested");
  queue->sync([&] {
    EXPECT_TRUE(queue->isCurrent());
    EXPECT_THROW(queue->sync([] {}), InternalInconsistency);
    EXPECT_THROW(queue->drain(), InternalInconsistency);
  });
  EXPECT_FALSE(queue->isCurrent());
}

TEST(DispatchQueueConcurrency, ConcurrentQueueRunsBlocksSideBySide) {
  const DispatchQueuePtr queue = DispatchQueue::concurrent("test.concurrent", 2);
  DispatchSemaphore first(0);
  DispatchSemaphore second(0);
  // Each block waits for the other: they end only when both run at once.
  queue->async([&] {
    first.signal();
    second.wait();
  });
  queue->async([&] {
    second.signal();
    first.wait();
  });
  queue->drain();
  EXPECT_FALSE(first.tryWait());
  EXPECT_FALSE(second.tryWait());
}

TEST(DispatchGroupConcurrency, WaitReturnsWhenEveryBlockOfTheGroupHasEnded) {
  const auto group = std::make_shared<DispatchGroup>();
  const DispatchQueuePtr one = DispatchQueue::serial("test.one");
  const DispatchQueuePtr two = DispatchQueue::serial("test.two");
  std::atomic<int> ran{0};
  for (int i = 0; i < 100; ++i) {
    one->async(group, [&] { ++ran; });
    two->async(group, [&] { ++ran; });
  }
  group->wait();
  EXPECT_EQ(ran, 200);
}

TEST(DispatchGroupConcurrency, CapturesAreReleasedBeforeTheGroupIsLeft) {
  const auto group = std::make_shared<DispatchGroup>();
  const DispatchQueuePtr queue = DispatchQueue::serial("test.captures");
  auto captured = std::make_shared<int>(1);
  queue->async(group, [captured] { EXPECT_EQ(*captured, 1); });
  group->wait();
  EXPECT_EQ(captured.use_count(), 1);
}

TEST(DispatchGroupConcurrency, EmptyGroupDoesNotWaitAndLeavingTooOftenRaises) {
  DispatchGroup group;
  group.wait();
  EXPECT_THROW(group.leave(), InternalInconsistency);
  group.enter();
  group.leave();
  EXPECT_THROW(group.leave(), InternalInconsistency);
}

TEST(DispatchGroupConcurrency, NullGroupCountsNowhereAndTheBlockRuns) {
  const DispatchQueuePtr queue = DispatchQueue::serial("test.null-group");
  bool ran = false;
  queue->async(nullptr, [&] { ran = true; });
  queue->drain();
  EXPECT_TRUE(ran);
}

TEST(DispatchSemaphoreConcurrency, CountsSignals) {
  DispatchSemaphore semaphore(1);
  EXPECT_TRUE(semaphore.tryWait());
  EXPECT_FALSE(semaphore.tryWait());
  EXPECT_FALSE(semaphore.waitFor(std::chrono::nanoseconds(1)));
  std::thread other([&] { semaphore.signal(); });
  semaphore.wait();
  other.join();
  semaphore.signal();
  EXPECT_TRUE(semaphore.waitFor(std::chrono::nanoseconds(1)));
}

class DispatchSourceConcurrency : public testing::Test {
 protected:
  DispatchQueuePtr queue_ = DispatchQueue::concurrent("test.events", 2);
  DispatchSource source_{queue_};
};

TEST_F(DispatchSourceConcurrency, DeliversOnlyBetweenResumeAndCancel) {
  std::atomic<int> events{0};
  source_.setEventHandler([&] { ++events; });
  source_.raise();
  queue_->drain();
  EXPECT_EQ(events, 0);
  source_.resume();
  source_.raise();
  source_.raise();
  queue_->drain();
  EXPECT_EQ(events, 2);
  source_.cancel();
  source_.cancel();
  source_.raise();
  queue_->drain();
  EXPECT_EQ(events, 2);
}

TEST_F(DispatchSourceConcurrency, CancelReleasesWhatTheHandlerCaptured) {
  auto captured = std::make_shared<int>(0);
  source_.setEventHandler([captured] { ++*captured; });
  source_.resume();
  EXPECT_EQ(captured.use_count(), 2);
  source_.cancel();
  EXPECT_EQ(captured.use_count(), 1);
}

TEST_F(DispatchSourceConcurrency, AnEventQueuedBeforeCancelIsNotDeliveredAfterIt) {
  const DispatchQueuePtr narrow = DispatchQueue::concurrent("test.narrow", 1);
  DispatchSource source(narrow);
  DispatchSemaphore gate(0);
  std::atomic<int> events{0};
  source.setEventHandler([&] { ++events; });
  source.resume();
  narrow->async([&] { gate.wait(); });
  source.raise();
  source.cancel();
  gate.signal();
  narrow->drain();
  EXPECT_EQ(events, 0);
}

TEST_F(DispatchSourceConcurrency, SourceMayBeDestroyedWithEventsQueued) {
  const DispatchQueuePtr narrow = DispatchQueue::concurrent("test.narrow", 1);
  DispatchSemaphore gate(0);
  std::atomic<int> events{0};
  narrow->async([&] { gate.wait(); });
  {
    DispatchSource source(narrow);
    source.setEventHandler([&] { ++events; });
    source.resume();
    source.raise();
  }
  gate.signal();
  narrow->drain();
  EXPECT_EQ(events, 0);
}

}  // namespace
}  // namespace kx
