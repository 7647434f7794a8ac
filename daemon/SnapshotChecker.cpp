#include "daemon/SnapshotChecker.h"

#include <array>
#include <cmath>

#include "daemon/SyncRunner.h"
#include "platform/foundation/Limits.h"
#include "platform/foundation/PropertyList.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

// What a key's value must be.
enum class Rule : std::uint8_t {
  kAnything,
  kString,
  kNumber,
  kFiniteNumber,
  kStringArray,
  kArray,
  kDictionary,
  kFaces,
  kRectangle,
  kItemType,
  kUuid,
};

struct KeyRule {
  std::string_view key;
  Rule rule;
};

// No key has two meanings in two kinds of item, so one table serves all.
constexpr std::array kItemRules{
    KeyRule{"uuid", Rule::kUuid},
    KeyRule{"itemType", Rule::kItemType},
    KeyRule{"albumName", Rule::kString},
    KeyRule{"assetUUIDs", Rule::kStringArray},
    KeyRule{"parentUUID", Rule::kString},
    KeyRule{"subclass", Rule::kNumber},
    KeyRule{"keyAssetFaceIndex", Rule::kNumber},
    KeyRule{"keyAssetUUID", Rule::kString},
    KeyRule{"eventName", Rule::kString},
    KeyRule{"rating", Rule::kNumber},
    KeyRule{"isFlagged", Rule::kNumber},
    KeyRule{"isVideo", Rule::kNumber},
    KeyRule{"caption", Rule::kString},
    KeyRule{"eventUUID", Rule::kString},
    KeyRule{"adjustments", Rule::kArray},
    KeyRule{"exposureDate", Rule::kFiniteNumber},
    KeyRule{"modificationDate", Rule::kFiniteNumber},
    KeyRule{"longitude", Rule::kFiniteNumber},
    KeyRule{"latitude", Rule::kFiniteNumber},
    KeyRule{"originalFileName", Rule::kString},
    KeyRule{"faces", Rule::kFaces},
    KeyRule{"assetProperties", Rule::kDictionary},
};

constexpr std::array kFaceRules{
    KeyRule{"faceAlbumUUID", Rule::kString},
    KeyRule{"faceIndex", Rule::kNumber},
    KeyRule{"faceRectangle", Rule::kRectangle},
};

constexpr std::array kRectangleRules{
    KeyRule{"X", Rule::kFiniteNumber},
    KeyRule{"Y", Rule::kFiniteNumber},
    KeyRule{"Width", Rule::kFiniteNumber},
    KeyRule{"Height", Rule::kFiniteNumber},
};

// Rules by key. In a binary document a key's text is compared once, then known by its object index.
class RuleTable {
 public:
  template <std::size_t N>
  explicit RuleTable(const std::array<KeyRule, N>& rules) : rules_(rules.data()), count_(N) {}

  Rule ruleAt(const DictionaryView& dictionary, std::size_t index) {
    const auto object = dictionary.keyObjectIndexAt(index);
    if (!object) return ruleOf(dictionary.keyAt(index));
    if (known_.empty()) known_.resize(dictionary.documentObjectCount(), 0);
    std::uint8_t& known = known_[*object];
    if (known == 0) known = static_cast<std::uint8_t>(ruleOf(dictionary.keyAt(index))) + 1;
    return static_cast<Rule>(known - 1);
  }

 private:
  Rule ruleOf(std::string_view key) const {
    for (std::size_t i = 0; i < count_; ++i) {
      if (rules_[i].key == key) return rules_[i].rule;
    }
    return Rule::kAnything;
  }

  const KeyRule* rules_;
  std::size_t count_;
  std::vector<std::uint8_t> known_;  // by object index: rule + 1, 0 when not seen yet
};

// Raised within this file alone, with the text for people.
struct Refusal {
  std::string text;
};

class Checker {
 public:
  Checker(const Value& root, CheckedSnapshot& result) : root_(root), result_(result) {}

  void run() {
    if (!root_.isDictionary()) {
      throw Refusal{"its root is no dictionary but " + std::string(kindName(root_.kind()))};
    }
    const Value uuid = root_["libraryUUID"];
    if (uuid.isNull()) throw Refusal{"it has no \"libraryUUID\""};
    where_ = "the root";
    require(uuid, Kind::kString, "libraryUUID");
    result_.libraryUUID = uuid.stringValue();
    requireUnlessNull(root_["libraryKind"], Kind::kString, "libraryKind");
    requireUnlessNull(root_["TesselUserAgent"], Kind::kString, "TesselUserAgent");
    checkItems("updates", true);
    checkItems("deletes", false);
  }

 private:
  void checkItems(std::string_view list, bool areUpdates) {
    const Value value = root_[list];
    where_ = "the root";
    requireUnlessNull(value, Kind::kArray, list);
    if (value.isNull()) return;
    const ArrayView items = value.arrayValue();
    if (items.size() > limits::kAssets + limits::kContainers) overLimit("items", items.size());
    if (areUpdates) {
      result_.assetUUIDs.reserve(items.size());
      result_.identifiers.reserve(items.size());
    }
    list_ = list;
    for (index_ = 0; index_ < items.size(); ++index_) checkItem(items[index_], areUpdates);
  }

  void checkItem(const Value& item, bool isUpdate) {
    where_ = {};
    if (!item.isDictionary()) {
      refuse("expected dictionary, found " + std::string(kindName(item.kind())));
    }
    const DictionaryView fields = item.dictionaryValue();
    uuid_ = Value();
    type_ = Value();
    for (std::size_t i = 0; i < fields.size(); ++i) {
      const Rule rule = itemRules_.ruleAt(fields, i);
      if (rule != Rule::kAnything) checkField(rule, fields.keyAt(i), fields.valueAt(i));
    }
    if (type_.isNull()) refuse("it has no \"itemType\"");
    if (uuid_.isNull()) refuse("it has no \"uuid\"");
    const std::string_view type = type_.stringValue();
    const bool isAsset = type == "Asset";
    if (!isAsset && type != "Album" && type != "Event") {
      refuse("unknown \"itemType\" \"" + std::string(type.substr(0, 64)) + "\"");
    }
    count(isAsset ? ++assets_ : ++containers_, isAsset ? limits::kAssets : limits::kContainers,
          isAsset ? "assets" : "albums and events");
    if (isUpdate) note(isAsset);
  }

  void note(bool isAsset) {
    if (uuid_.stringValue().empty()) return;
    result_.identifiers.push_back(uuid_);
    const std::string_view uuid = result_.identifiers.back().stringValue();
    if (isAsset) {
      result_.assetUUIDs.insert(uuid);
    } else {
      result_.containerUUIDs.push_back(uuid);
    }
  }

  void checkField(Rule rule, std::string_view key, const Value& value) {
    switch (rule) {
      case Rule::kAnything:
        return;
      case Rule::kUuid:
        require(value, Kind::kString, key);
        uuid_ = value;
        return;
      case Rule::kItemType:
        require(value, Kind::kString, key);
        type_ = value;
        return;
      case Rule::kString:
        return require(value, Kind::kString, key);
      case Rule::kNumber:
        return require(value, Kind::kNumber, key);
      case Rule::kFiniteNumber:
        return requireFinite(value, key);
      case Rule::kArray:
        return require(value, Kind::kArray, key);
      case Rule::kDictionary:
        return require(value, Kind::kDictionary, key);
      case Rule::kStringArray:
        return checkMembers(value, key);
      case Rule::kFaces:
        return checkFaces(value, key);
      case Rule::kRectangle:
        return checkRectangle(value, key);
    }
  }

  void checkMembers(const Value& value, std::string_view key) {
    require(value, Kind::kArray, key);
    const ArrayView members = value.arrayValue();
    memberships_ += members.size();
    count(memberships_, limits::kMemberships, "album members");
    for (const Value& member : members) {
      if (!member.isString()) mismatch(key, "array of strings", member.kind());
    }
  }

  void checkFaces(const Value& value, std::string_view key) {
    require(value, Kind::kArray, key);
    const ArrayView faces = value.arrayValue();
    faces_ += faces.size();
    count(faces_, limits::kFaces, "faces");
    for (const Value& face : faces) {
      if (!face.isDictionary()) mismatch(key, "array of dictionaries", face.kind());
      checkFields(faceRules_, face.dictionaryValue());
    }
  }

  void checkRectangle(const Value& value, std::string_view key) {
    require(value, Kind::kDictionary, key);
    checkFields(rectangleRules_, value.dictionaryValue());
  }

  void checkFields(RuleTable& rules, const DictionaryView& fields) {
    for (std::size_t i = 0; i < fields.size(); ++i) {
      const Rule rule = rules.ruleAt(fields, i);
      if (rule != Rule::kAnything) checkField(rule, fields.keyAt(i), fields.valueAt(i));
    }
  }

  void require(const Value& value, Kind kind, std::string_view key) const {
    if (value.kind() != kind) mismatch(key, kindName(kind), value.kind());
  }
  void requireUnlessNull(const Value& value, Kind kind, std::string_view key) const {
    if (!value.isNull()) require(value, kind, key);
  }
  void requireFinite(const Value& value, std::string_view key) const {
    require(value, Kind::kNumber, key);
    const Number number = value.numberValue();
    if (number.isReal() && !std::isfinite(number.doubleValue())) {
      refuse("the number under \"" + std::string(key) + "\" is not finite");
    }
  }
  void count(std::uint64_t found, std::uint64_t limit, std::string_view what) const {
    if (found > limit) overLimit(what, found);
  }

  [[noreturn]] void overLimit(std::string_view what, std::uint64_t found) const {
    throw Refusal{"it has too many " + std::string(what) + " (" + std::to_string(found) +
                  " or more)"};
  }
  [[noreturn]] void mismatch(std::string_view key, std::string_view expected, Kind found) const {
    refuse("wrong type under \"" + std::string(key) + "\": expected " + std::string(expected) +
           ", found " + std::string(kindName(found)));
  }
  [[noreturn]] void refuse(const std::string& what) const {
    std::string place(where_);
    if (place.empty()) {
      place = std::string(list_) + "[" + std::to_string(index_) + "]";
      if (uuid_.isString()) place += " (" + std::string(uuid_.stringValue().substr(0, 64)) + ")";
    }
    throw Refusal{"in " + place + ": " + what};
  }

  const Value& root_;
  CheckedSnapshot& result_;
  RuleTable itemRules_{kItemRules};
  RuleTable faceRules_{kFaceRules};
  RuleTable rectangleRules_{kRectangleRules};
  std::string_view where_;
  std::string_view list_;
  std::size_t index_ = 0;
  Value uuid_;
  Value type_;
  std::uint64_t assets_ = 0, containers_ = 0, memberships_ = 0, faces_ = 0;
};

ErrorPtr badSnapshot(const std::string& what) {
  return Error::make(kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kBadSnapshot),
                     escapeControlCharacters("the host's snapshot is refused: " + what));
}

}  // namespace

std::optional<CheckedSnapshot> checkSnapshot(DataPtr bytes, ErrorPtr* error) {
  if (bytes->length() > limits::kSnapshotFileBytes) {
    setError(error, badSnapshot("it is larger than " + std::to_string(limits::kSnapshotFileBytes) +
                                " bytes"));
    return std::nullopt;
  }
  CheckedSnapshot result;
  ErrorPtr unreadable;
  result.root = readPropertyList(std::move(bytes), &unreadable);
  if (result.root.isNull()) {
    // The reader's own domain and code say more than ours would.
    setError(error, unreadable ? Error::make(unreadable->domain(), unreadable->code(),
                                             "the host's snapshot is no property list: " +
                                                 unreadable->message())
                               : badSnapshot("it is no property list"));
    return std::nullopt;
  }
  try {
    Checker(result.root, result).run();
  } catch (const Refusal& refusal) {
    setError(error, badSnapshot(refusal.text));
    return std::nullopt;
  }
  return result;
}

}  // namespace kx
