#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "device/DeviceRoot.h"
#include "platform/dispatch/Dispatch.h"

namespace kx {

// Memory pressure as the kernel reports it (a trigger on /proc/pressure/memory), watched by a
// thread of its own between resume and cancel. Where the kernel offers none the source stays
// silent. Any thread.
class KernelMemoryPressure : public MemoryPressureSource {
 public:
  // `triggerFile` has the form of /proc/pressure/memory.
  KernelMemoryPressure(DispatchQueuePtr queue, std::string triggerFile);
  ~KernelMemoryPressure() override;

  void setEventHandler(Block handler) override;
  void resume() override;
  void cancel() override;

 private:
  // What events need; outlives the source while one is being handled.
  struct Delivery {
    std::mutex mutex;
    bool cancelled = false;
    std::shared_ptr<Block> handler;
  };
  static void deliver(const DispatchQueuePtr& queue, const std::shared_ptr<Delivery>& delivery);

  const DispatchQueuePtr queue_;
  const std::string triggerFile_;
  const std::shared_ptr<Delivery> delivery_ = std::make_shared<Delivery>();
  std::mutex threadMutex_;
  UniqueFd stop_;  // an eventfd that ends the thread
  std::thread thread_;
};

}  // namespace kx
