#include <gtest/gtest.h>

#include <thread>

#include "testing/FakeClock.h"

namespace kx {
namespace {

TEST(FakeClockConcurrencyTest, StandsStillUntilItIsMoved) {
  FakeClock clock;
  const double start = clock.absoluteTime();
  clock.setNow(Date{10.0});
  EXPECT_EQ(clock.now(), Date{10.0});
  EXPECT_EQ(clock.absoluteTime(), start);
  clock.advance(2.5);
  EXPECT_EQ(clock.now(), Date{12.5});
  EXPECT_EQ(clock.absoluteTime(), start + 2.5);
}

TEST(FakeClockConcurrencyTest, ASignalEndsATimedWait) {
  FakeClock clock;
  DispatchSemaphore semaphore(0);
  bool signalled = false;
  std::thread waiter([&] { signalled = clock.wait(semaphore, 5); });
  clock.awaitWaiters(1);
  clock.advance(4.9);
  semaphore.signal();
  waiter.join();
  EXPECT_TRUE(signalled);
  EXPECT_FALSE(semaphore.tryWait());
}

TEST(FakeClockConcurrencyTest, TheLimitEndsATimedWait) {
  FakeClock clock;
  DispatchSemaphore semaphore(0);
  bool signalled = true;
  std::thread waiter([&] { signalled = clock.wait(semaphore, 5); });
  clock.awaitWaiters(1);
  clock.advance(5);
  waiter.join();
  EXPECT_FALSE(signalled);
  EXPECT_FALSE(semaphore.tryWait());
}

TEST(FakeClockConcurrencyTest, ASemaphoreThatIsFreeNeedsNoWaiting) {
  FakeClock clock;
  DispatchSemaphore semaphore(1);
  EXPECT_TRUE(clock.wait(semaphore, 0));
  clock.setTimeOutAtOnce(true);
  EXPECT_FALSE(clock.wait(semaphore, 1000));
  semaphore.signal();
  EXPECT_TRUE(clock.wait(semaphore, 1000));
}

}  // namespace
}  // namespace kx
