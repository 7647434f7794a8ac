#include <unordered_map>

#include "platform/foundation/ArchiveLayout.h"
#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/PropertyListFailure.h"

namespace kx {

struct KeyedArchiver::State {
  std::vector<ArchivablePtr> objects;  // by number; kept alive so that an address stays one object
  std::unordered_map<const Archivable*, std::uint32_t> numbers;
  archive::Graph graph;
  // Of the object being encoded.
  Dictionary values;
  Dictionary references;
  Dictionary maps;

  // Objects met for the first time are encoded later, in the order of their numbers.
  Value reference(const ArchivablePtr& object) {
    const auto next = static_cast<std::uint32_t>(objects.size());
    const auto [place, isNew] = numbers.emplace(object.get(), next);
    if (isNew) objects.push_back(object);
    graph.edges.push_back(place->second);
    return Value::uid(place->second);
  }
  Value takeFields(std::string_view className) {
    Dictionary fields;
    fields.set(archive::kClassKey, Value::string(className));
    const auto take = [&fields](const char* key, Dictionary& section) {
      if (!section.empty()) fields.set(key, Value::dictionary(std::move(section)));
      section = Dictionary();
    };
    take(archive::kValuesKey, values);
    take(archive::kReferencesKey, references);
    take(archive::kMapsKey, maps);
    graph.closeObject();
    return Value::dictionary(std::move(fields));
  }
};

KeyedArchiver::KeyedArchiver() : state_(std::make_unique<State>()) {}
KeyedArchiver::~KeyedArchiver() = default;

std::vector<std::uint8_t> KeyedArchiver::archivedData(const ArchivablePtr& root, ErrorPtr* error) {
  try {
    if (root == nullptr) {
      throw PropertyListFailure(PropertyListError::kArchiveShape, "there is no root object");
    }
    KeyedArchiver coder;
    State& state = *coder.state_;
    state.objects.push_back(root);
    state.numbers.emplace(root.get(), 0);
    Array objects;
    for (std::size_t i = 0; i < state.objects.size(); ++i) {
      const ArchivablePtr object = state.objects[i];
      object->encodeWithCoder(coder);
      objects.push_back(state.takeFields(object->archiveClassName()));
    }
    archive::checkGraph(state.graph, 0);
    const Value file = Value::dictionary({
        {archive::kArchiverKey, Value::string(archive::kArchiverName)},
        {archive::kVersionKey, Value::integer(archive::kVersion)},
        {archive::kRootKey, Value::uid(0)},
        {archive::kObjectsKey, Value::array(std::move(objects))},
    });
    return writePropertyList(file, PropertyListFormat::kBinary, error);
  } catch (const PropertyListFailure& failure) {
    setError(error, failure.toError());
    return {};
  }
}

void KeyedArchiver::encodeValue(std::string_view key, const Value& value) {
  state_->values.setIfPresent(key, value);
}

void KeyedArchiver::encodeObject(std::string_view key, const ArchivablePtr& object) {
  if (object != nullptr) state_->references.set(key, state_->reference(object));
}

// Keys and objects stand in two arrays: a key of a map may be longer than a dictionary's key.
void KeyedArchiver::encodeObjectMap(std::string_view key, const ArchivableMap* map) {
  if (map == nullptr) return;
  Array keys;
  Array objects;
  keys.reserve(map->size());
  objects.reserve(map->size());
  for (const auto& entry : *map) {
    if (entry.value == nullptr) continue;
    keys.push_back(entry.key);
    objects.push_back(state_->reference(entry.value));
  }
  state_->maps.set(
      key, Value::dictionary({{archive::kMapKeysKey, Value::array(std::move(keys))},
                              {archive::kMapObjectsKey, Value::array(std::move(objects))}}));
}

ArchiveClasses& ArchiveClasses::add(std::string_view className, Maker maker) {
  for (auto& [name, known] : makers_) {
    if (name == className) {
      known = std::move(maker);
      return *this;
    }
  }
  makers_.emplace_back(className, std::move(maker));
  return *this;
}

const ArchiveClasses::Maker* ArchiveClasses::find(std::string_view className) const {
  for (const auto& [name, maker] : makers_) {
    if (name == className) return &maker;
  }
  return nullptr;
}

}  // namespace kx
