#include "daemon/LibrarySwitch.h"

#include "platform/files/FileSystem.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

// The marker's one key: the old file's bytes, absent when there was no file.
constexpr const char* kContentKey = "content";

}  // namespace

Value readDevicePropertyList(FileSystem& files, const std::string& path) {
  if (!files.fileExists(path)) return {};
  ErrorPtr ignored;
  DataPtr bytes = files.readFile(path, &ignored);
  return bytes ? readPropertyList(std::move(bytes), &ignored) : Value();
}

ErrorPtr LibrarySwitch::begin(const std::string& newLibraryUUID) {
  const Value current = readDevicePropertyList(files_, kKXCurrentLibraryUUIDPath)["libraryUUID"];
  if (current.isString() && current.stringValue() == newLibraryUUID) return nullptr;
  Dictionary marker;
  ErrorPtr error;
  if (files_.fileExists(kKXCurrentLibraryUUIDPath)) {
    const DataPtr content = files_.readFile(kKXCurrentLibraryUUIDPath, &error);
    if (!content) return error;
    marker.set(kContentKey, Value::data(content->span()));
  }
  const auto bytes =
      writePropertyList(Value::dictionary(std::move(marker)), PropertyListFormat::kBinary, &error);
  if (error) return error;
  files_.writeFileAtomically(kLibraryMarkerPath, bytes, &error);
  return error;
}

ErrorPtr LibrarySwitch::commit() {
  if (!files_.fileExists(kLibraryMarkerPath)) return nullptr;
  ErrorPtr error;
  files_.removeItem(kLibraryMarkerPath, &error);
  return error;
}

ErrorPtr LibrarySwitch::rollBack() {
  if (!files_.fileExists(kLibraryMarkerPath)) return nullptr;
  const Value marker = readDevicePropertyList(files_, kLibraryMarkerPath);
  ErrorPtr error;
  if (marker.isDictionary()) {
    const Value content = marker[kContentKey];
    if (content.kind() == Kind::kData) {
      files_.writeFileAtomically(kKXCurrentLibraryUUIDPath, content.dataValue(), &error);
    } else if (files_.fileExists(kKXCurrentLibraryUUIDPath)) {
      files_.removeItem(kKXCurrentLibraryUUIDPath, &error);
    }
  }
  if (!error) files_.removeItem(kLibraryMarkerPath, &error);
  return error;
}

}  // namespace kx
