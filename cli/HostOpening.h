#pragma once

#include <memory>
#include <string>
#include <vector>

#include "cli/Command.h"
#include "daemon/SyncRunner.h"
#include "host/HostLibrary.h"

namespace CLI {
class App;
}

namespace kx::cli {

// How the user wants a folder of photos to be read.
struct FolderReading {
  std::string libraryId;
  std::string timezone;
};

void addFolderReadingOptions(CLI::App& command, FolderReading& reading);

// "UTC", "Z", "+2", "+02:00" or "-0530": minutes east of UTC, at most 14 hours. UsageError for any
// other text.
int timezoneMinutes(const std::string& text);

// The options for opening a host, with progress on the terminal and cancelling.
HostOptions hostOptions(Context& context, const FolderReading& reading, const CancelToken& cancel);

// The snapshot that the device at that path got last, null for none; for HostOptions.
DataPtr previousSnapshotOf(const std::string& device);

// Opens the host. Null and an error that names the path; UsageError when an option makes no sense.
std::unique_ptr<HostLibrary> openHost(const std::string& path, const HostOptions& options,
                                      ErrorPtr* error);
// The error with the path in front of its text.
ErrorPtr withPath(const std::string& path, const ErrorPtr& error);

// Names on standard error what was passed over or read without metadata.
void reportHostProblems(Context& context, const std::vector<HostProblem>& problems);

// The exit code for an error of opening or writing a host library.
int exitCodeForHostError(const ErrorPtr& error, const CancelToken& cancel);

}  // namespace kx::cli
