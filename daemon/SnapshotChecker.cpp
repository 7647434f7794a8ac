#include "daemon/SnapshotChecker.h"

#include <array>
#include <cmath>
#include <unordered_map>

#include "daemon/SyncRunner.h"
#include "platform/foundation/EntryPeek.h"
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

// Rules by key. Most dictionaries of a file hold the same key objects in the same order: their keys
// are looked at once.
class RuleTable {
 public:
  template <std::size_t N>
  explicit RuleTable(const std::array<KeyRule, N>& rules) : rules_(rules.data()), count_(N) {}

  // By position; valid until the next call.
  const std::vector<Rule>& rulesOf(const Value& dictionary) {
    if (!EntryPeek::can(dictionary)) {
      fill(dictionary, scratch_);
      return scratch_;
    }
    const std::string_view keys = EntryPeek::keyBytes(dictionary);
    if (last_ != nullptr && keys == lastKeys_) return *last_;
    auto known = layouts_.find(std::string(keys));
    if (known == layouts_.end()) {
      if (layouts_.size() == kMostLayouts) layouts_.clear();
      known = layouts_.emplace(keys, std::vector<Rule>()).first;
      fill(dictionary, known->second);
    }
    lastKeys_ = known->first;
    last_ = &known->second;
    return *last_;
  }

 private:
  // Bounds the memory that a file of ever new layouts can take.
  static constexpr std::size_t kMostLayouts = 1024;

  void fill(const Value& dictionary, std::vector<Rule>& rules) const {
    const DictionaryView fields = dictionary.dictionaryValue();
    rules.clear();
    for (std::size_t i = 0; i < fields.size(); ++i) rules.push_back(ruleOf(fields.keyAt(i)));
  }
  Rule ruleOf(std::string_view key) const {
    for (std::size_t i = 0; i < count_; ++i) {
      if (rules_[i].key == key) return rules_[i].rule;
    }
    return Rule::kAnything;
  }

  const KeyRule* rules_;
  std::size_t count_;
  std::unordered_map<std::string, std::vector<Rule>> layouts_;  // by key objects
  std::string_view lastKeys_;                                   // views a key of layouts_
  const std::vector<Rule>* last_ = nullptr;
  std::vector<Rule> scratch_;
};

// Whether a look at an entry is enough to let it pass. What does not pass is checked again.
bool passesAtSight(Rule rule, const EntryPeek& entry) {
  switch (rule) {
    case Rule::kAnything:
      return true;
    case Rule::kUuid:
    case Rule::kItemType:
    case Rule::kString:
      return entry.kind() == Kind::kString;
    case Rule::kNumber:
      return entry.kind() == Kind::kNumber;
    case Rule::kFiniteNumber:
      return entry.kind() == Kind::kNumber &&
             (!entry.number().isReal() || std::isfinite(entry.number().doubleValue()));
    case Rule::kArray:
      return entry.kind() == Kind::kArray;
    case Rule::kDictionary:
      return entry.kind() == Kind::kDictionary;
    default:
      return false;
  }
}

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
    if (areUpdates) result_.assetUUIDs = TextNumbers(items.size());
    list_ = list;
    for (index_ = 0; index_ < items.size(); ++index_) checkItem(items[index_], areUpdates);
  }

  void checkItem(const Value& item, bool isUpdate) {
    where_ = {};
    if (!item.isDictionary()) {
      refuse("expected dictionary, found " + std::string(kindName(item.kind())));
    }
    uuid_.reset();
    type_.reset();
    checkFields(itemRules_, item);
    if (!type_) refuse("it has no \"itemType\"");
    if (!uuid_) refuse("it has no \"uuid\"");
    const std::string_view type = *type_;
    const bool isAsset = type == "Asset";
    if (!isAsset && type != "Album" && type != "Event") {
      refuse("unknown \"itemType\" \"" + std::string(type.substr(0, 64)) + "\"");
    }
    count(isAsset ? ++assets_ : ++containers_, isAsset ? limits::kAssets : limits::kContainers,
          isAsset ? "assets" : "albums and events");
    if (isUpdate) note(isAsset);
  }

  void note(bool isAsset) {
    if (uuid_->empty()) return;
    if (isAsset) {
      result_.assetUUIDs.add(*uuid_);
    } else {
      result_.containerUUIDs.push_back(*uuid_);
    }
  }

  void checkField(Rule rule, std::string_view key, const Value& value) {
    switch (rule) {
      case Rule::kAnything:
        return;
      case Rule::kUuid:
        require(value, Kind::kString, key);
        uuid_ = value.stringValue();
        return;
      case Rule::kItemType:
        require(value, Kind::kString, key);
        type_ = value.stringValue();
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
    const bool canPeek = EntryPeek::can(value);
    for (std::size_t i = 0; i < members.size(); ++i) {
      const Kind kind = canPeek ? EntryPeek::elementOf(value, i).kind() : members[i].kind();
      if (kind != Kind::kString) mismatch(key, "array of strings", kind);
    }
  }

  void checkFaces(const Value& value, std::string_view key) {
    require(value, Kind::kArray, key);
    const ArrayView faces = value.arrayValue();
    faces_ += faces.size();
    count(faces_, limits::kFaces, "faces");
    for (const Value& face : faces) {
      if (!face.isDictionary()) mismatch(key, "array of dictionaries", face.kind());
      checkFields(faceRules_, face);
    }
  }

  void checkRectangle(const Value& value, std::string_view key) {
    require(value, Kind::kDictionary, key);
    checkFields(rectangleRules_, value);
  }

  void checkFields(RuleTable& table, const Value& dictionary) {
    const std::vector<Rule>& rules = table.rulesOf(dictionary);
    const bool canPeek = EntryPeek::can(dictionary);
    for (std::size_t i = 0; i < rules.size(); ++i) {
      if (canPeek) {
        const EntryPeek entry = EntryPeek::valueOf(dictionary, i);
        if (passesAtSight(rules[i], entry)) {
          if (rules[i] == Rule::kUuid) uuid_ = entry.text();
          if (rules[i] == Rule::kItemType) type_ = entry.text();
          continue;
        }
      }
      const DictionaryView fields = dictionary.dictionaryValue();
      checkField(rules[i], fields.keyAt(i), fields.valueAt(i));
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
      if (uuid_) place += " (" + std::string(uuid_->substr(0, 64)) + ")";
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
  // Of the item under check: views of texts that the root keeps alive.
  OptionalString uuid_;
  OptionalString type_;
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
