#pragma once

#include <mutex>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "device/ReferenceDevice.h"
#include "testing/TestPlatform.h"

namespace kx::test {

// A device in memory, with what it noted open to a test. Threads as ReferenceDevice's.
class FakeDevice : public ReferenceDevice {
 public:
  class Health : public DeviceHealth {
   public:
    void reset() override;
    void noteFailure(std::string what, ErrorPtr error) override;
    void noteImportFailure(std::string uuid, ErrorPtr error) override;
    bool anyFailure() const override;
    std::vector<ImportFailure> importFailures() const override;
    ErrorPtr firstFailure() const override;

   private:
    mutable std::mutex mutex_;
    std::vector<ImportFailure> imports_;
    ErrorPtr first_;
  };

  Platform& platform() override { return memory; }
  DeviceHealth& health() override { return noted; }
  LibraryChanges takeChanges() override { return std::exchange(changes, {}); }
  DeviceCounters takeCounters() override { return {}; }
  // A sync does without these two.
  DeviceAdmin& admin() override { throw std::logic_error("no admin"); }
  DeviceRoot& root() override { throw std::logic_error("no root"); }
  void setRestoreFiles(std::optional<std::vector<QBFile>>) override {}
  void drain() override { memory.saver.drain(); }
  DeviceDump dump(bool, ErrorPtr*) override { return content; }
  void readAhead() override { ++readsAhead; }
  void stopReadingAhead() override {}
  LibraryDifference difference(const LibraryChanges&, ErrorPtr*) override { return {}; }

  TestPlatform memory;
  Health noted;
  LibraryChanges changes;
  DeviceDump content;  // what dump gives
  int readsAhead = 0;
};

}  // namespace kx::test
