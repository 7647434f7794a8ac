#include "device/KernelMemoryPressure.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace kx {
namespace {

// Some tasks stalled on memory for 150 milliseconds within two seconds (which any user may ask
// for).
constexpr char kTrigger[] = "some 150000 2000000";

}  // namespace

KernelMemoryPressure::KernelMemoryPressure(DispatchQueuePtr queue, std::string triggerFile)
    : queue_(std::move(queue)), triggerFile_(std::move(triggerFile)) {}

KernelMemoryPressure::~KernelMemoryPressure() { cancel(); }

void KernelMemoryPressure::setEventHandler(Block handler) {
  auto shared = std::make_shared<Block>(std::move(handler));
  std::lock_guard<std::mutex> lock(delivery_->mutex);
  if (!delivery_->cancelled) delivery_->handler.swap(shared);
}

void KernelMemoryPressure::deliver(const DispatchQueuePtr& queue,
                                   const std::shared_ptr<Delivery>& delivery) {
  queue->async([delivery] {
    std::shared_ptr<Block> handler;
    {
      std::lock_guard<std::mutex> lock(delivery->mutex);
      if (!delivery->cancelled) handler = delivery->handler;
    }
    if (handler && *handler) (*handler)();
  });
}

void KernelMemoryPressure::resume() {
  std::lock_guard<std::mutex> lock(threadMutex_);
  if (thread_.joinable()) return;
  {
    std::lock_guard<std::mutex> state(delivery_->mutex);
    if (delivery_->cancelled) return;
  }
  UniqueFd trigger(::open(triggerFile_.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC));
  if (!trigger) return;
  if (::write(trigger.get(), kTrigger, sizeof kTrigger) < 0) return;
  stop_ = UniqueFd(::eventfd(0, EFD_CLOEXEC));
  if (!stop_) return;
  thread_ = std::thread(
      [trigger = std::move(trigger), stop = stop_.get(), queue = queue_, delivery = delivery_] {
        struct pollfd watched[] = {{trigger.get(), POLLPRI, 0}, {stop, POLLIN, 0}};
        while (true) {
          if (::poll(watched, 2, -1) < 0) {
            if (errno == EINTR) continue;
            return;
          }
          if (watched[1].revents != 0 || (watched[0].revents & (POLLERR | POLLNVAL)) != 0) return;
          if ((watched[0].revents & POLLPRI) != 0) deliver(queue, delivery);
        }
      });
}

void KernelMemoryPressure::cancel() {
  std::shared_ptr<Block> released;
  {
    std::lock_guard<std::mutex> lock(delivery_->mutex);
    delivery_->cancelled = true;
    released.swap(delivery_->handler);
  }
  std::lock_guard<std::mutex> lock(threadMutex_);
  if (!thread_.joinable()) return;
  const std::uint64_t one = 1;
  while (::write(stop_.get(), &one, sizeof one) < 0 && errno == EINTR) {
  }
  thread_.join();
  stop_.reset();
}

}  // namespace kx
