#include "device/HealthRecord.h"

namespace kx {

void HealthRecord::reset() {
  std::lock_guard<std::mutex> lock(mutex_);
  failed_ = false;
  first_.reset();
  imports_.clear();
}

void HealthRecord::noteFailure(std::string what, ErrorPtr error) {
  log_.failure(what, error);
  std::lock_guard<std::mutex> lock(mutex_);
  failed_ = true;
  if (!first_) {
    first_ = error ? std::move(error) : Error::make(kDeviceErrorDomain, 0, std::move(what));
  }
}

void HealthRecord::noteImportFailure(std::string uuid, ErrorPtr error) {
  log_.failure("import of " + uuid, error);
  std::lock_guard<std::mutex> lock(mutex_);
  imports_.push_back({std::move(uuid), std::move(error)});
}

bool HealthRecord::anyFailure() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return failed_ || !imports_.empty();
}

std::vector<DeviceHealth::ImportFailure> HealthRecord::importFailures() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return imports_;
}

ErrorPtr HealthRecord::firstFailure() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return first_;
}

}  // namespace kx
