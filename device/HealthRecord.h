#pragma once

#include <mutex>
#include <string>
#include <vector>

#include "device/DeviceLog.h"
#include "device/ReferenceDevice.h"

namespace kx {

// The device's health, kept in memory; every failure is logged too. Any thread.
class HealthRecord : public DeviceHealth {
 public:
  explicit HealthRecord(const DeviceLog& log) : log_(log) {}
  void reset() override;
  void noteFailure(std::string what, ErrorPtr error) override;
  void noteImportFailure(std::string uuid, ErrorPtr error) override;
  bool anyFailure() const override;
  std::vector<ImportFailure> importFailures() const override;
  ErrorPtr firstFailure() const override;

 private:
  const DeviceLog& log_;
  mutable std::mutex mutex_;
  bool failed_ = false;
  ErrorPtr first_;
  std::vector<ImportFailure> imports_;
};

}  // namespace kx
