#include <algorithm>

#include "platform/foundation/ArchiveLayout.h"
#include "platform/foundation/Exceptions.h"
#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/PropertyListFailure.h"

namespace kx {
namespace {

using archive::Graph;

[[noreturn]] void fail(PropertyListError code, std::string what, std::string path) {
  throw PropertyListFailure(code, std::move(what), PropertyListFailure::kNoOffset, std::move(path));
}

[[noreturn]] void failShape(std::string what, std::string path) {
  fail(PropertyListError::kArchiveShape, std::move(what), std::move(path));
}

void require(const Value& value, Kind kind, const std::string& path) {
  if (value.kind() == kind) return;
  failShape(
      "expected " + std::string(kindName(kind)) + ", found " + std::string(kindName(value.kind())),
      path);
}

std::string objectPath(std::size_t object) { return "objects[" + std::to_string(object) + "]"; }

void requireOnly(const DictionaryView& fields, std::initializer_list<std::string_view> known,
                 const std::string& path) {
  for (std::size_t i = 0; i < fields.size(); ++i) {
    const std::string_view key = fields.keyAt(i);
    if (std::find(known.begin(), known.end(), key) == known.end()) {
      failShape("unknown key \"" + std::string(key) + "\"", path);
    }
  }
}

// Checks the table of objects and collects who refers to whom.
class TableCheck {
 public:
  TableCheck(ArrayView objects, const ArchiveClasses& classes)
      : objects_(std::move(objects)), classes_(classes) {}

  void run() {
    for (std::size_t i = 0; i < objects_.size(); ++i) {
      checkObject(objects_[i], objectPath(i));
      graph.closeObject();
    }
  }
  std::uint32_t target(const Value& reference, const std::string& path) const {
    require(reference, Kind::kUid, path);
    if (reference.uidValue() >= objects_.size()) {
      failShape("reference to object " + std::to_string(reference.uidValue()) + " of " +
                    std::to_string(objects_.size()),
                path);
    }
    return reference.uidValue();
  }

  Graph graph;
  std::vector<const ArchiveClasses::Maker*> makers;

 private:
  void checkObject(const Value& object, const std::string& path) {
    require(object, Kind::kDictionary, path);
    const DictionaryView fields = object.dictionaryValue();
    requireOnly(
        fields,
        {archive::kClassKey, archive::kValuesKey, archive::kReferencesKey, archive::kMapsKey},
        path);
    const Value className = fields.find(archive::kClassKey);
    require(className, Kind::kString, path);
    const ArchiveClasses::Maker* maker = classes_.find(className.stringValue());
    if (maker == nullptr) {
      fail(PropertyListError::kArchiveClass,
           "the class \"" + std::string(className.stringValue()) + "\" is not allowed", path);
    }
    makers.push_back(maker);
    if (const Value values = fields.find(archive::kValuesKey); !values.isNull()) {
      require(values, Kind::kDictionary, path);
    }
    if (const Value references = fields.find(archive::kReferencesKey); !references.isNull()) {
      checkReferences(references, path);
    }
    if (const Value maps = fields.find(archive::kMapsKey); !maps.isNull()) {
      require(maps, Kind::kDictionary, path);
      const DictionaryView view = maps.dictionaryValue();
      for (std::size_t i = 0; i < view.size(); ++i) {
        checkMap(view.valueAt(i), path + "." + std::string(view.keyAt(i)));
      }
    }
  }
  void checkReferences(const Value& references, const std::string& path) {
    require(references, Kind::kDictionary, path);
    const DictionaryView view = references.dictionaryValue();
    for (std::size_t i = 0; i < view.size(); ++i) {
      graph.edges.push_back(target(view.valueAt(i), path + "." + std::string(view.keyAt(i))));
    }
  }
  void checkMap(const Value& map, const std::string& path) {
    require(map, Kind::kDictionary, path);
    requireOnly(map.dictionaryValue(), {archive::kMapKeysKey, archive::kMapObjectsKey}, path);
    const Value keyArray = map[archive::kMapKeysKey];
    const Value objectArray = map[archive::kMapObjectsKey];
    require(keyArray, Kind::kArray, path);
    require(objectArray, Kind::kArray, path);
    const ArrayView keys = keyArray.arrayValue();
    const ArrayView objects = objectArray.arrayValue();
    if (keys.size() != objects.size()) failShape("a map with an odd number of parts", path);
    OrderedMap<bool> seen;
    seen.reserve(keys.size());
    for (std::size_t i = 0; i < keys.size(); ++i) {
      const Value key = keys[i];
      require(key, Kind::kString, path);
      seen.set(key, true);
      if (seen.size() != i + 1) {
        failShape("the key \"" + std::string(key.stringValue()) + "\" occurs twice", path);
      }
      graph.edges.push_back(target(objects[i], path));
    }
  }

  const ArrayView objects_;
  const ArchiveClasses& classes_;
};

// The table of objects of a file that is an archive, and the number of the root.
std::pair<Value, Value> openArchive(const Value& file) {
  require(file, Kind::kDictionary, {});
  requireOnly(
      file.dictionaryValue(),
      {archive::kArchiverKey, archive::kVersionKey, archive::kRootKey, archive::kObjectsKey}, {});
  const Value name = file[archive::kArchiverKey];
  if (!name.isString() || name.stringValue() != archive::kArchiverName) {
    failShape("the file is no keyed archive", archive::kArchiverKey);
  }
  const Value version = file[archive::kVersionKey];
  if (!version.isNumber() || version.numberValue() != Number::integer(archive::kVersion)) {
    failShape("unknown version of keyed archives", archive::kVersionKey);
  }
  require(file[archive::kObjectsKey], Kind::kArray, archive::kObjectsKey);
  return {file[archive::kObjectsKey], file[archive::kRootKey]};
}

}  // namespace

struct KeyedUnarchiver::State {
  explicit State(ArrayView table) : objects(std::move(table)), made(objects.size()) {}

  const ArrayView objects;
  std::vector<const ArchiveClasses::Maker*> makers;
  std::vector<ArchivablePtr> made;
  std::uint32_t current = 0;

  Value section(const char* name) const { return objects[current][name]; }
  std::string path(std::string_view key) const {
    return objectPath(current) + "." + std::string(key);
  }
  // The field, after the other sections were found without it.
  Value field(const char* wanted, std::string_view key) const {
    for (const char* name : {archive::kValuesKey, archive::kReferencesKey, archive::kMapsKey}) {
      const Value found = section(name)[key];
      if (found.isNull()) continue;
      if (name == wanted) return found;
      failShape("a field of another sort than its reader needs", path(key));
    }
    return Value();
  }
  ArchivablePtr object(KeyedUnarchiver& coder, std::uint32_t number, std::string_view className,
                       const std::string& slot) {
    const Value found = objects[number][archive::kClassKey];
    if (!className.empty() && found.stringValue() != className) {
      fail(PropertyListError::kArchiveClass,
           "the class \"" + std::string(found.stringValue()) + "\" is not allowed here", slot);
    }
    if (made[number] != nullptr) return made[number];
    const std::uint32_t outer = std::exchange(current, number);
    ArchivablePtr fresh = (*makers[number])(coder);
    if (fresh == nullptr) failShape("an object could not be made", objectPath(number));
    current = outer;
    made[number] = fresh;
    return fresh;
  }
};

KeyedUnarchiver::KeyedUnarchiver() = default;
KeyedUnarchiver::~KeyedUnarchiver() = default;

ArchivablePtr KeyedUnarchiver::unarchivedObject(DataPtr bytes, const ArchiveClasses& classes,
                                                ErrorPtr* error, std::string_view rootClass) {
  ErrorPtr readError;
  const Value file = readPropertyList(std::move(bytes), &readError);
  if (readError != nullptr) {
    setError(error, readError);
    return nullptr;
  }
  KeyedUnarchiver coder;
  try {
    const auto [table, root] = openArchive(file);
    TableCheck check(table.arrayValue(), classes);
    check.run();
    const std::uint32_t rootNumber = check.target(root, archive::kRootKey);
    archive::checkGraph(check.graph, rootNumber);
    coder.state_ = std::make_unique<State>(table.arrayValue());
    coder.state_->makers = std::move(check.makers);
    return coder.state_->object(coder, rootNumber, rootClass, archive::kRootKey);
  } catch (const PropertyListFailure& failure) {
    setError(error, failure.toError());
  } catch (const TypeError& wrong) {
    setError(error, coder.makerError(wrong.what()));
  } catch (const InternalInconsistency& wrong) {
    setError(error, coder.makerError(wrong.what()));
  }
  return nullptr;
}

ErrorPtr KeyedUnarchiver::makerError(const char* what) const {
  return PropertyListFailure(PropertyListError::kArchiveShape, what, PropertyListFailure::kNoOffset,
                             state_ == nullptr ? std::string() : objectPath(state_->current))
      .toError();
}

Value KeyedUnarchiver::decodeValue(std::string_view key) {
  return state_->field(archive::kValuesKey, key);
}

ArchivablePtr KeyedUnarchiver::decodeObject(std::string_view key, std::string_view className) {
  const Value reference = state_->field(archive::kReferencesKey, key);
  if (reference.isNull()) return nullptr;
  return state_->object(*this, reference.uidValue(), className, state_->path(key));
}

std::shared_ptr<ArchivableMap> KeyedUnarchiver::decodeObjectMap(std::string_view key,
                                                                std::string_view className) {
  const Value map = state_->field(archive::kMapsKey, key);
  if (map.isNull()) return nullptr;
  const ArrayView keys = map[archive::kMapKeysKey].arrayValue();
  const ArrayView objects = map[archive::kMapObjectsKey].arrayValue();
  auto result = std::make_shared<ArchivableMap>();
  result->reserve(keys.size());
  const std::string slot = state_->path(key);
  for (std::size_t i = 0; i < keys.size(); ++i) {
    result->set(keys[i], state_->object(*this, objects[i].uidValue(), className, slot));
  }
  return result;
}

}  // namespace kx
