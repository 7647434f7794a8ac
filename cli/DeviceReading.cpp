#include "cli/DeviceReading.h"

#include <chrono>
#include <filesystem>
#include <system_error>

#include "device/DeviceLayout.h"

namespace kx::cli {

namespace {

constexpr double kReferenceDateAfterUnixEpochSeconds = 978307200.0;

}  // namespace

std::optional<DeviceDump> readDevice(Context& context, const std::string& root, bool hash,
                                     ErrorPtr* error) {
  DeviceOptions options;
  options.root = root;
  options.readOnly = true;
  options.logs = logSinksFor(context.options, context.console);
  const std::unique_ptr<ReferenceDevice> device = ReferenceDevice::open(options, error);
  if (!device) return std::nullopt;
  ErrorPtr dumpError;
  DeviceDump dump = device->dump(hash, &dumpError);
  if (dumpError) {
    setError(error, dumpError);
    return std::nullopt;
  }
  return dump;
}

std::optional<Date> lastSyncDate(const std::string& root) {
  std::error_code error;
  const auto written = std::filesystem::last_write_time(root + device_paths::kLastSynced, error);
  if (error) return std::nullopt;
  const auto sinceUnixEpoch = std::chrono::file_clock::to_sys(written).time_since_epoch();
  return Date{std::chrono::duration<double>(sinceUnixEpoch).count() -
              kReferenceDateAfterUnixEpochSeconds};
}

}  // namespace kx::cli
