#include "tests/daemon/FakeDevice.h"

#include <utility>

namespace kx::test {

void FakeDevice::Health::reset() {
  std::lock_guard<std::mutex> lock(mutex_);
  imports_.clear();
  first_ = nullptr;
}

void FakeDevice::Health::noteFailure(std::string, ErrorPtr error) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (!first_) first_ = std::move(error);
}

void FakeDevice::Health::noteImportFailure(std::string uuid, ErrorPtr error) {
  std::lock_guard<std::mutex> lock(mutex_);
  imports_.push_back({std::move(uuid), std::move(error)});
}

bool FakeDevice::Health::anyFailure() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return first_ || !imports_.empty();
}

std::vector<DeviceHealth::ImportFailure> FakeDevice::Health::importFailures() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return imports_;
}

ErrorPtr FakeDevice::Health::firstFailure() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return first_;
}

}  // namespace kx::test
