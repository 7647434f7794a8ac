#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/OrderedMap.h"
#include "platform/foundation/Value.h"

namespace kx {

class KeyedArchiver;
class KeyedUnarchiver;

// An object that can be written to a keyed archive. Identity is kept: the same object encoded twice
// is written once and comes back as one object.
class Archivable {
 public:
  virtual ~Archivable() = default;
  // The name under which archives know the class.
  virtual std::string_view archiveClassName() const = 0;
  virtual void encodeWithCoder(KeyedArchiver& coder) const = 0;
};

using ArchivablePtr = std::shared_ptr<Archivable>;
using ArchivableMap = OrderedMap<ArchivablePtr>;

// Writes an object graph. Layout: a binary property list, see docs/formats/keyed-archive.md (names
// itself "KXKeyedArchiver", version 1). Used on one thread. Objects are encoded one after the
// other, never inside one another; what they throw passes through.
class KeyedArchiver {
 public:
  // Empty and an error for a null root, a graph with a cycle (E_ARCHIVE_CYCLE) or with more than 64
  // objects inside one another (E_PLIST_DEPTH), or a value that cannot be written.
  static std::vector<std::uint8_t> archivedData(const ArchivablePtr& root, ErrorPtr* error);

  // Null values and null objects are left out: the key is then absent. A key encoded again
  // replaces.
  void encodeValue(std::string_view key, const Value& value);
  void encodeObject(std::string_view key, const ArchivablePtr& object);
  // A dictionary from string to object, order kept; a null pointer writes nothing.
  void encodeObjectMap(std::string_view key, const ArchivableMap* map);

 private:
  KeyedArchiver();
  ~KeyedArchiver();
  KeyedArchiver(const KeyedArchiver&) = delete;
  KeyedArchiver& operator=(const KeyedArchiver&) = delete;
  struct State;
  std::unique_ptr<State> state_;
};

// The classes that one decoding allows: archive class name to a maker that reads the object.
class ArchiveClasses {
 public:
  using Maker = std::function<ArchivablePtr(KeyedUnarchiver&)>;
  ArchiveClasses& add(std::string_view className, Maker maker);
  const Maker* find(std::string_view className) const;

 private:
  std::vector<std::pair<std::string, Maker>> makers_;
};

// Reads an object graph; only classes of `classes` are ever made, any other is an error
// (E_ARCHIVE_CLASS). A cycle is an error (E_ARCHIVE_CYCLE), and so is an object that nothing refers
// to (E_ARCHIVE_SHAPE). The whole table is checked before the first object is made; makers are
// nested at most 64 deep, and a TypeError or InternalInconsistency that one raises becomes an error
// (E_ARCHIVE_SHAPE). Used on one thread.
class KeyedUnarchiver {
 public:
  // With a root class, a root of any other is an error (E_ARCHIVE_CLASS).
  static ArchivablePtr unarchivedObject(DataPtr bytes, const ArchiveClasses& classes,
                                        ErrorPtr* error, std::string_view rootClass = {});

  // For makers: the fields of the object being made. Null when absent; a field of another sort (a
  // value where an object is asked for) ends the reading with E_ARCHIVE_SHAPE, an object of another
  // class than the one named with E_ARCHIVE_CLASS.
  Value decodeValue(std::string_view key);
  ArchivablePtr decodeObject(std::string_view key, std::string_view className = {});
  std::shared_ptr<ArchivableMap> decodeObjectMap(std::string_view key,
                                                 std::string_view className = {});

 private:
  KeyedUnarchiver();
  ~KeyedUnarchiver();
  KeyedUnarchiver(const KeyedUnarchiver&) = delete;
  KeyedUnarchiver& operator=(const KeyedUnarchiver&) = delete;
  ErrorPtr makerError(const char* what) const;
  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace kx
