#include "transport/KXSTransportEncoder.h"

#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

Value encodeItems(const KXSItemMapPtr& items) {
  Array elements;
  if (items) {
    elements.reserve(items->size());
    for (const auto& entry : *items) elements.push_back(entry.value->propertyList());
  }
  return Value::array(std::move(elements));
}

}  // namespace

Value KXSTransportEncoder::encodeSnapshot(const KXSLibraryChangeSnapshot& snapshot,
                                          ErrorPtr* /*error*/) {
  Dictionary root;  // setting a null raises
  root.set(kKXSTransportLibraryUUIDKey, Value::optionalString(snapshot.libraryUUID()));
  root.set(kKXSTransportLibraryKindKey, Value::optionalString(snapshot.libraryKind()));
  root.set(kKXSTransportUpdatesKey, encodeItems(snapshot.updates()));
  root.set(kKXSTransportDeletesKey, encodeItems(snapshot.deletes()));
  return Value::dictionary(std::move(root));
}

bool KXSTransportEncoder::encodeSnapshotToFile(const KXSLibraryChangeSnapshot& snapshot,
                                               FileSystem& files, const std::string& path,
                                               ErrorPtr* error) {
  const Value root = encodeSnapshot(snapshot, error);
  const std::vector<std::uint8_t> bytes =
      writePropertyList(root, PropertyListFormat::kBinary, error);
  return !bytes.empty() && files.writeFileAtomically(path, bytes, error);
}

}  // namespace kx
