#include "cli/HostOpening.h"

#include <sys/stat.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <regex>

#include "cli/Progress.h"
#include "device/DeviceLayout.h"
#include "host/HostFiles.h"

namespace kx::cli {

namespace {

constexpr std::size_t kProblemsShown = 20;
constexpr int kMinutesAnHour = 60;
constexpr int kFurthestOffsetMinutes = 14 * kMinutesAnHour;
constexpr int kSignalExitBase = 128;

std::string readingLine(const HostProgress& progress) {
  const std::string done = groupedNumber(progress.filesDone);
  if (progress.phase == HostProgress::Phase::kListing)
    return "listing the host: " + done + " files";
  const std::string of = progress.filesTotal > 0 ? " of " + groupedNumber(progress.filesTotal) : "";
  if (progress.phase == HostProgress::Phase::kReading)
    return "reading the host: " + done + of + " files";
  return "copying: " + done + of + " files, " + readableBytes(progress.bytesDone);
}

}  // namespace

void addFolderReadingOptions(CLI::App& command, FolderReading& reading) {
  command
      .add_option("--library-id", reading.libraryId,
                  "Identity of a folder's library (default: from the folder's path)")
      ->type_name("UUID");
  command
      .add_option("--timezone", reading.timezone,
                  "Offset of capture times that state none: UTC (default), +02:00, -05:30 ...")
      ->type_name("OFFSET");
}

int timezoneMinutes(const std::string& text) {
  if (text.empty() || text == "UTC" || text == "Z") return 0;
  static const std::regex kOffset("([+-])([0-9]{1,2})(:?([0-9]{2}))?");
  std::smatch parts;
  if (std::regex_match(text, parts, kOffset)) {
    const int hours = std::stoi(parts[2].str());
    const int minutes = parts[4].matched ? std::stoi(parts[4].str()) : 0;
    const int offset = hours * kMinutesAnHour + minutes;
    if (minutes < kMinutesAnHour && offset <= kFurthestOffsetMinutes) {
      return parts[1].str() == "-" ? -offset : offset;
    }
  }
  throw UsageError("--timezone: \"" + text + "\" is no offset like UTC, +02:00 or -05:30");
}

HostOptions hostOptions(Context& context, const FolderReading& reading, const CancelToken& cancel) {
  HostOptions options;
  options.libraryID = reading.libraryId;
  options.timezoneOffsetMinutes = timezoneMinutes(reading.timezone);
  options.userAgent = std::string("kxsync/") + KX_VERSION;
  options.progress = [&context, &cancel](const HostProgress& progress) {
    if (!context.options.quiet) context.console.progress(readingLine(progress));
    return !cancel.isCancelled();
  };
  return options;
}

DataPtr previousSnapshotOf(const std::string& device) {
  constexpr std::uint64_t kMostBytes = std::uint64_t{1} << 30;
  FileHandle root;
  if (openFolder(device, &root) != 0) return nullptr;
  // That of the last sync that came to its end, else of the last one that was begun.
  for (const std::string path : {device_paths::kLastSynced, device_paths::kSnapshot}) {
    FileHandle file;
    struct stat status = {};
    std::vector<std::uint8_t> bytes;
    if (openRegularBeneath(root.get(), path.substr(1), &file, &status) != 0) continue;
    if (readWhole(file.get(), kMostBytes, &bytes) == 0)
      return std::make_shared<Data>(std::move(bytes));
  }
  return nullptr;
}

void reportHostProblems(Context& context, const std::vector<HostProblem>& problems) {
  std::size_t shown = 0;
  for (const HostProblem& problem : problems) {
    if (shown == kProblemsShown) break;
    context.console.warning(problem.path + ": " + problem.text);
    ++shown;
  }
  if (shown < problems.size()) {
    context.console.warning("... and " + groupedNumber(problems.size() - shown) +
                            " more like these (--json lists all)");
  }
}

ErrorPtr withPath(const std::string& path, const ErrorPtr& error) {
  return Error::make(error->domain(), error->code(), path + ": " + errorText(error));
}

std::unique_ptr<HostLibrary> openHost(const std::string& path, const HostOptions& options,
                                      ErrorPtr* error) {
  ErrorPtr failure;
  auto library = openHostLibrary(path, options, &failure);
  if (library) return library;
  const bool usage = failure && failure->domain() == kHostErrorDomain &&
                     failure->code() == static_cast<std::int64_t>(HostError::kUsage);
  if (usage && !options.libraryID.empty()) {
    throw UsageError(errorText(failure) + ": \"" + options.libraryID + "\"");
  }
  if (usage) throw UsageError(errorText(failure));
  setError(error, withPath(path, failure));
  return nullptr;
}

int exitCodeForHostError(const ErrorPtr& error, const CancelToken& cancel) {
  if (cancel.isCancelled()) return kSignalExitBase + cancel.signal();
  return isNoSpaceError(error) ? kExitNoSpace : kExitFailed;
}

}  // namespace kx::cli
