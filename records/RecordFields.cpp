#include "records/RecordFields.h"

#include "platform/foundation/EntryPeek.h"
#include "platform/foundation/Exceptions.h"

namespace kx {
namespace {

// Texts of one file mostly are one and the same.
bool equalTexts(std::string_view a, std::string_view b) {
  return a.size() == b.size() && (a.data() == b.data() || a == b);
}

// Two entries compared where they stand; containers are left to Value.
bool equalEntries(const Value& a, std::size_t positionA, const Value& b, std::size_t positionB) {
  const EntryPeek entryA = EntryPeek::valueOf(a, positionA);
  const EntryPeek entryB = EntryPeek::valueOf(b, positionB);
  if (entryA.kind() != entryB.kind()) return false;
  if (entryA.kind() == Kind::kString) return equalTexts(entryA.text(), entryB.text());
  if (entryA.kind() == Kind::kNumber) return entryA.number() == entryB.number();
  return a.dictionaryValue().valueAt(positionA) == b.dictionaryValue().valueAt(positionB);
}

}  // namespace

RecordFields::RecordFields(const Value& dictionary, std::span<const FieldKey> keys,
                           std::string_view what) {
  const std::optional<DictionaryView> view = dictionary.asDictionary(what);
  if (!view) return;
  dictionary_ = dictionary;
  if (findPositions(*view, keys, positions_)) return;
  positions_ = kNowhere;
  dictionary_ = Value();
  values_ = std::make_unique<Values>();
  for (const FieldKey& field : keys) (*values_)[field.slot] = view->find(field.key);
}

bool RecordFields::findPositions(const DictionaryView& view, std::span<const FieldKey> keys,
                                 Positions& positions) {
  positions = kNowhere;
  const std::size_t count = view.size();
  std::size_t left = keys.size();
  for (std::size_t position = 0; position < count && left > 0; ++position) {
    if (position >= kAbsent) return false;
    const std::string_view key = view.keyAt(position);
    for (const FieldKey& field : keys) {
      if (field.key != key) continue;
      positions[field.slot] = static_cast<std::uint8_t>(position);
      --left;
      break;
    }
  }
  return true;
}

Value RecordFields::value(std::size_t slot) const {
  if (values_) return (*values_)[slot];
  if (positions_[slot] == kAbsent) return Value();
  if (EntryPeek::can(dictionary_)) return EntryPeek::valueOf(dictionary_, positions_[slot]).value();
  return dictionary_.dictionaryValue().valueAt(positions_[slot]);
}

OptionalString RecordFields::anyString(std::size_t slot, std::string_view key) const {
  if (values_) return (*values_)[slot].asString(key);
  if (positions_[slot] == kAbsent) return std::nullopt;
  // The text belongs to the dictionary's storage, not to the handle made here.
  return dictionary_.dictionaryValue().valueAt(positions_[slot]).asString(key);
}

std::optional<Number> RecordFields::anyNumber(std::size_t slot, std::string_view key) const {
  if (values_) return (*values_)[slot].asNumber(key);
  if (positions_[slot] == kAbsent) return std::nullopt;
  return dictionary_.dictionaryValue().valueAt(positions_[slot]).asNumber(key);
}

std::size_t RecordFields::count(std::size_t slot) const {
  if (!values_ && positions_[slot] != kAbsent && EntryPeek::can(dictionary_)) {
    const EntryPeek entry = EntryPeek::valueOf(dictionary_, positions_[slot]);
    return entry.kind() == Kind::kArray ? entry.count() : 0;
  }
  const Value array = value(slot);
  return array.isArray() ? array.arrayValue().size() : 0;
}

void RecordFields::set(std::size_t slot, Value value) {
  detach();
  (*values_)[slot] = std::move(value);
}

void RecordFields::fallBack(std::size_t slot, std::size_t other) {
  if (!isNull(slot)) return;
  if (values_) {
    (*values_)[slot] = (*values_)[other];
  } else {
    positions_[slot] = positions_[other];
  }
}

bool RecordFields::equal(const RecordFields& a, const RecordFields& b, std::size_t slot) {
  const bool nullA = a.isNull(slot);
  if (nullA || b.isNull(slot)) return nullA && b.isNull(slot);
  if (!a.values_ && !b.values_ && EntryPeek::can(a.dictionary_) && EntryPeek::can(b.dictionary_)) {
    return equalEntries(a.dictionary_, a.positions_[slot], b.dictionary_, b.positions_[slot]);
  }
  return a.value(slot) == b.value(slot);
}

bool RecordFields::equalElements(const RecordFields& a, const RecordFields& b, std::size_t slot) {
  const std::size_t count = a.count(slot);
  if (count == 0) return true;
  const Value arrayA = a.value(slot);
  const Value arrayB = b.value(slot);
  const bool canPeek = EntryPeek::can(arrayA) && EntryPeek::can(arrayB);
  for (std::size_t i = 0; i < count; ++i) {
    if (canPeek) {
      const EntryPeek elementA = EntryPeek::elementOf(arrayA, i);
      const EntryPeek elementB = EntryPeek::elementOf(arrayB, i);
      if (elementA.kind() == Kind::kString && elementB.kind() == Kind::kString) {
        if (!equalTexts(elementA.text(), elementB.text())) return false;
        continue;
      }
    }
    if (!(arrayA.arrayValue()[i] == arrayB.arrayValue()[i])) return false;
  }
  return true;
}

void RecordFields::detach() {
  if (values_) return;
  auto values = std::make_unique<Values>();
  for (std::size_t slot = 0; slot < kSlots; ++slot) (*values)[slot] = value(slot);
  values_ = std::move(values);
  positions_ = kNowhere;
  dictionary_ = Value();
}

}  // namespace kx
