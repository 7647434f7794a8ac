#pragma once

#include <memory>
#include <mutex>
#include <vector>

#include "platform/dispatch/Dispatch.h"

namespace kx {

// Hands out memory-pressure sources whose events a test raises. Any thread; the sources may outlive
// it.
class ManualMemoryPressure {
 public:
  std::unique_ptr<MemoryPressureSource> newSource() {
    auto source = std::make_shared<DispatchSource>(queue_);
    std::lock_guard<std::mutex> lock(mutex_);
    ++made_;
    std::erase_if(sources_, [](const auto& weak) { return weak.expired(); });
    sources_.push_back(source);
    return std::make_unique<Handle>(std::move(source));
  }

  // Raises one event at every source that listens and waits until it is handled.
  void raise() {
    for (const std::shared_ptr<DispatchSource>& source : live()) source->raise();
    queue_->drain();
  }
  // Sources that listen now, and that were ever made.
  std::size_t listening() const {
    std::size_t count = 0;
    for (const std::shared_ptr<DispatchSource>& source : live()) {
      if (source->isListening()) ++count;
    }
    return count;
  }
  std::size_t made() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return made_;
  }

 private:
  // What the client owns: the source goes with it.
  class Handle final : public MemoryPressureSource {
   public:
    explicit Handle(std::shared_ptr<DispatchSource> source) : source_(std::move(source)) {}
    void setEventHandler(Block handler) override { source_->setEventHandler(std::move(handler)); }
    void resume() override { source_->resume(); }
    void cancel() override { source_->cancel(); }

   private:
    std::shared_ptr<DispatchSource> source_;
  };

  std::vector<std::shared_ptr<DispatchSource>> live() const {
    std::lock_guard<std::mutex> lock(mutex_);
    std::vector<std::shared_ptr<DispatchSource>> sources;
    for (const std::weak_ptr<DispatchSource>& source : sources_) {
      if (auto held = source.lock()) sources.push_back(std::move(held));
    }
    return sources;
  }

  DispatchQueuePtr queue_ = DispatchQueue::concurrent("kx.memory.pressure", 2);
  mutable std::mutex mutex_;
  std::vector<std::weak_ptr<DispatchSource>> sources_;
  std::size_t made_ = 0;
};

}  // namespace kx
