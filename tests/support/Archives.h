#pragma once

#include <memory>
#include <stdexcept>

#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/PropertyList.h"

namespace kx {

inline std::vector<std::uint8_t> archiveBytes(const ArchivablePtr& object) {
  ErrorPtr error;
  auto bytes = KeyedArchiver::archivedData(object, &error);
  if (error) throw std::runtime_error(error->description());
  return bytes;
}

// The archive's objects, as the property list that it is.
inline Value archivedObjects(const ArchivablePtr& object) {
  ErrorPtr error;
  return readPropertyList(std::make_shared<const Data>(archiveBytes(object)), &error)["objects"];
}

// The object after archiving and restoring it.
template <typename T>
std::shared_ptr<T> throughArchive(const std::shared_ptr<T>& object, const ArchiveClasses& classes) {
  ErrorPtr error;
  const ArchivablePtr restored = KeyedUnarchiver::unarchivedObject(
      std::make_shared<const Data>(archiveBytes(object)), classes, &error);
  if (error) throw std::runtime_error(error->description());
  return std::dynamic_pointer_cast<T>(restored);
}

}  // namespace kx
