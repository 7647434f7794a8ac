#include <sys/stat.h>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>

#include <algorithm>
#include <utility>

#include "daemon/PlistJson.h"
#include "daemon/drive/DriveSession.h"
#include "platform/foundation/PropertyList.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

void check(int failure, const std::string& path) {
  if (failure == 0) return;
  throw DriveException("FileError", escapeControlCharacters(path) + ": " + std::strerror(failure));
}

std::vector<std::uint8_t> contentFor(const DriveArguments& arguments) {
  if (arguments.has("text")) {
    const std::string text = arguments.string("text");
    return {text.begin(), text.end()};
  }
  if (arguments.has("base64")) return bytesFromBase64(arguments.string("base64"));
  const std::string from = arguments.string("from");
  std::ifstream file(from, std::ios::binary);
  if (!file) check(errno != 0 ? errno : EIO, from);
  return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

DriveAnswer putFile(DeviceRoot& root, const DriveArguments& arguments) {
  const std::string path = arguments.string("path");
  check(DeviceRoot::checkPath(path), path);
  const std::vector<std::uint8_t> content = contentFor(arguments);
  const std::string directory = path.substr(0, path.rfind('/'));
  if (!directory.empty()) check(root.makeDirectories(directory), directory);
  check(root.writeAtomically(path, content), path);
  return {};
}

// Null when the file is missing.
DataPtr content(DeviceRoot& root, const std::string& path) {
  std::vector<std::uint8_t> bytes;
  const int failure = root.readFile(path, &bytes);
  if (failure == ENOENT) return nullptr;
  check(failure, path);
  return std::make_shared<Data>(std::move(bytes));
}

DriveAnswer readFile(DeviceRoot& root, const DriveArguments& arguments) {
  const DataPtr bytes = content(root, arguments.string("path"));
  if (!bytes) return {};
  return {{{"base64", base64Text(bytes->span())}}, nullptr};
}

DriveAnswer readPlist(DeviceRoot& root, const DriveArguments& arguments) {
  const DataPtr bytes = content(root, arguments.string("path"));
  if (!bytes) return {};
  ErrorPtr error;
  const Value value = readPropertyList(bytes, &error);
  if (value.isNull()) throw DriveException("PropertyListError", error ? error->message() : "");
  return {plistJson(value), nullptr};
}

DriveAnswer removeFile(DeviceRoot& root, const DriveArguments& arguments) {
  const std::string path = arguments.string("path");
  const int failure = root.remove(path);
  if (failure != ENOENT) check(failure, path);
  return {};
}

DriveAnswer listFiles(DeviceRoot& root, const DriveArguments& arguments) {
  const std::string top = arguments.string("path");
  std::vector<std::string> files;
  std::vector<std::string> directories{top};
  while (!directories.empty()) {
    const std::string directory = std::move(directories.back());
    directories.pop_back();
    std::vector<std::string> names;
    const int failure = root.list(directory, &names);
    if (failure == ENOENT) continue;
    check(failure, directory);
    for (const std::string& name : names) {
      const std::string path = pathByAppending(directory, name);
      struct stat status {};
      if (root.status(path, &status) != 0) continue;
      (S_ISDIR(status.st_mode) ? directories : files).push_back(path);
    }
  }
  std::sort(files.begin(), files.end());
  return {files, nullptr};
}

}  // namespace

void addDeviceFileCalls(DriveSession& session, DriveCallTable& table) {
  using FileCall = DriveAnswer (*)(DeviceRoot&, const DriveArguments&);
  const std::pair<const char*, FileCall> calls[] = {{"device.putFile", putFile},
                                                    {"device.readFile", readFile},
                                                    {"device.readPlist", readPlist},
                                                    {"device.removeFile", removeFile},
                                                    {"device.listFiles", listFiles}};
  for (const auto& entry : calls) {
    const FileCall run = entry.second;
    table[entry.first] = {DriveLane::kConsole, [&session, run](const DriveArguments& arguments) {
                            return run(session.device().root(), arguments);
                          }};
  }
}

}  // namespace kx
