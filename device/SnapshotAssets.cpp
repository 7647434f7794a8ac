#include "device/SnapshotAssets.h"

#include <algorithm>
#include <string>

#include "platform/foundation/EntryPeek.h"
#include "platform/foundation/Exceptions.h"
#include "platform/foundation/Limits.h"

namespace kx {
namespace {

// Host dates count from 1904-01-01, ours from 2001-01-01.
constexpr double kHostDateOffset = 3061152000.0;
constexpr std::string_view kItemType = "itemType";
constexpr std::string_view kUUID = "uuid";
constexpr std::string_view kModificationDate = "modificationDate";
constexpr std::string_view kAsset = "Asset";

struct Item {
  std::string_view uuid;
  double modified = 0;
};

// Null for an item that is no asset or has no identifier. Raises TypeError.
std::optional<Item> readItem(const Value& item) {
  if (item[kItemType].asString(kItemType) != OptionalString(kAsset)) return std::nullopt;
  const OptionalString uuid = item[kUUID].asString(kUUID);
  if (!uuid) return std::nullopt;
  const auto modified = item[kModificationDate].asNumber(kModificationDate);
  return Item{*uuid, (modified ? modified->doubleValue() : 0.0) - kHostDateOffset};
}

// Where the fields of an item stand. Most items hold the same key objects in the same order as the
// one before: their keys are not looked at again.
class ItemPeek {
 public:
  // False for an item whose fields are not to be seen at a glance, which may be any.
  bool read(const Value& item, std::optional<Item>* result) {
    if (!item.isDictionary() || !EntryPeek::can(item)) return false;
    const std::string_view keys = EntryPeek::keyBytes(item);
    if (keys != keys_ || !isKnown_) {
      keys_ = keys;
      isKnown_ = true;
      learn(item.dictionaryValue());
    }
    if (!usable_) return false;
    const EntryPeek type = EntryPeek::valueOf(item, type_);
    if (type.kind() != Kind::kString) return false;
    if (type.text() != kAsset) {
      result->reset();
      return true;
    }
    const EntryPeek uuid = EntryPeek::valueOf(item, uuid_);
    const EntryPeek modified = EntryPeek::valueOf(item, modified_);
    if (uuid.kind() != Kind::kString || modified.kind() != Kind::kNumber) return false;
    *result = Item{uuid.text(), modified.number().doubleValue() - kHostDateOffset};
    return true;
  }

 private:
  void learn(const DictionaryView& item) {
    int types = 0, uuids = 0, dates = 0;
    const auto note = [](std::size_t position, std::size_t* place, int* count) {
      *place = position;
      ++*count;
    };
    for (std::size_t i = 0; i < item.size(); ++i) {
      const std::string_view key = item.keyAt(i);
      if (key == kItemType) note(i, &type_, &types);
      if (key == kUUID) note(i, &uuid_, &uuids);
      if (key == kModificationDate) note(i, &modified_, &dates);
    }
    usable_ = types == 1 && uuids == 1 && dates == 1;
  }

  std::string_view keys_;  // of an item that the property list keeps
  bool isKnown_ = false;
  bool usable_ = false;
  std::size_t type_ = 0, uuid_ = 0, modified_ = 0;
};

}  // namespace

SnapshotAssets::SnapshotAssets(std::size_t most) : most_(most), uuids_(most) {
  assets_.reserve(most);
}

std::optional<SnapshotAssets> SnapshotAssets::of(const Value& root, std::string* why) {
  try {
    const std::optional<ArrayView> updates = root["updates"].asArray("updates");
    const std::size_t count = updates ? updates->size() : 0;
    // The list may name one item any number of times.
    SnapshotAssets assets(std::min(count, static_cast<std::size_t>(limits::kAssets)));
    ItemPeek peek;
    for (std::size_t i = 0; i < count; ++i) {
      const Value item = (*updates)[i];
      std::optional<Item> read;
      if (!peek.read(item, &read)) read = readItem(item);
      if (read && !assets.set(read->uuid, read->modified)) {
        *why = "the snapshot lists more than " + std::to_string(limits::kAssets) + " assets";
        return std::nullopt;
      }
    }
    return assets;
  } catch (const TypeError& problem) {
    *why = problem.what();
    return std::nullopt;
  }
}

bool SnapshotAssets::set(std::string_view uuid, double modified) {
  if (uuids_.size() == most_ && !uuids_.contains(uuid)) return false;
  const std::uint32_t number = uuids_.add(uuid);
  if (number == assets_.size()) assets_.emplace_back();
  assets_[number].modified = modified;
  return true;
}

SnapshotAssets::Asset* SnapshotAssets::find(std::string_view uuid) {
  const std::uint32_t number = uuids_.find(uuid, next_);
  if (number == TextNumbers::kNone) return nullptr;
  next_ = number + 1;
  return &assets_[number];
}

OptionalString SnapshotAssets::firstNotProved() const {
  for (std::size_t number = 0; number < assets_.size(); ++number) {
    if (!assets_[number].proved) return uuids_.texts()[number];
  }
  return std::nullopt;
}

}  // namespace kx
