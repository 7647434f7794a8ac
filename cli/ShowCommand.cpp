#include <CLI/CLI.hpp>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <memory>
#include <system_error>
#include <utility>
#include <vector>

#include "cli/Command.h"
#include "cli/JsonOutput.h"
#include "cli/SnapshotText.h"
#include "daemon/SnapshotJson.h"
#include "daemon/SyncRunner.h"
#include "platform/foundation/Limits.h"
#include "platform/foundation/PropertyList.h"
#include "transport/KXSTransportDecoder.h"

namespace kx::cli {

namespace {

constexpr const char* kShowExamples =
    "Examples:\n"
    "  kxsync show ./bundle/PhotoLibrary.plist             library, containers and assets\n"
    "  kxsync show ./bundle/PhotoLibrary.plist --summary   counts alone\n"
    "  kxsync show ./bundle/PhotoLibrary.plist --json      all of it, for a script";

struct ShowArguments {
  std::string file;
  bool summary = false;
};

ErrorPtr fileError(const std::string& file, const std::string& reason) {
  return Error::make(kCliErrorDomain, kExitFailed, file + ": " + reason);
}

DataPtr readWhole(const std::string& file, ErrorPtr* error) {
  std::error_code failure;
  const auto kind = std::filesystem::status(file, failure).type();
  if (kind == std::filesystem::file_type::directory) {
    setError(error,
             fileError(file, "is a directory; a bundle's snapshot is its PhotoLibrary.plist"));
    return nullptr;
  }
  const auto size = failure ? 0 : std::filesystem::file_size(file, failure);
  if (failure) {
    setError(error, fileError(file, failure.message()));
    return nullptr;
  }
  if (size > limits::kSnapshotFileBytes) {
    setError(error, fileError(file, "is larger than the largest snapshot, " +
                                        std::to_string(limits::kSnapshotFileBytes) + " bytes"));
    return nullptr;
  }
  std::vector<std::uint8_t> bytes(size);
  errno = 0;
  std::ifstream stream(file, std::ios::binary);
  stream.read(reinterpret_cast<char*>(bytes.data()), static_cast<std::streamsize>(size));
  if (!stream) {
    const int reason = errno;
    setError(error, fileError(file, reason == 0 ? "ended while it was read"
                                                : std::generic_category().message(reason)));
    return nullptr;
  }
  return std::make_shared<Data>(std::move(bytes));
}

KXSLibraryChangeSnapshotPtr readSnapshot(const std::string& file, ErrorPtr* error) {
  const DataPtr bytes = readWhole(file, error);
  if (!bytes) return nullptr;
  ErrorPtr malformed;
  const Value root = readPropertyList(bytes, &malformed);
  if (root.isNull()) {
    setError(error, malformed ? Error::make(malformed->domain(), malformed->code(),
                                            file + ": " + malformed->message())
                              : fileError(file, "holds nothing"));
    return nullptr;
  }
  if (!root.isDictionary()) {
    setError(error, fileError(file, "is no snapshot: its root is no dictionary but of the type " +
                                        std::string(kindName(root.kind()))));
    return nullptr;
  }
  return KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(root, nullptr);
}

class ConsoleLines : public LineSink {
 public:
  explicit ConsoleLines(Console& console) : console_(console) {}
  void heading(const std::string& line) override { console_.heading(line); }
  void line(const std::string& line) override { console_.result(line); }

 private:
  Console& console_;
};

int show(Context& context, const KXSLibraryChangeSnapshot& snapshot, bool summary) {
  if (context.options.json) {
    context.console.raw(jsonLine(summary ? countsJson(snapshot) : snapshotJson(snapshot)));
  } else {
    ConsoleLines lines(context.console);
    describeSnapshot(snapshot, summary, lines);
  }
  return kExitDone;
}

int runShow(Context& context, const ShowArguments& arguments) {
  try {
    ErrorPtr error;
    const KXSLibraryChangeSnapshotPtr snapshot = readSnapshot(arguments.file, &error);
    if (!snapshot) return reportFailure(context, error, kExitFailed);
    return show(context, *snapshot, arguments.summary);
  } catch (const std::bad_alloc&) {
    throw;
  } catch (const std::exception& wrong) {
    return reportFailure(context, fileError(arguments.file, wrong.what()), kExitFailed);
  }
}

}  // namespace

void addShowCommand(CLI::App& app, Action& chosen) {
  auto arguments = std::make_shared<ShowArguments>();
  CLI::App* command = app.add_subcommand("show", "Print a snapshot file in readable form");
  command->add_option("FILE", arguments->file, "The snapshot file, a property list")
      ->required()
      ->type_name("PATH");
  command->add_flag("--summary", arguments->summary, "Print counts alone");
  command->footer(kShowExamples);
  command->callback([arguments, &chosen] {
    chosen = [arguments](Context& context) { return runShow(context, *arguments); };
  });
}

}  // namespace kx::cli
