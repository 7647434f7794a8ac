#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string_view>

#include "platform/foundation/EntryPeek.h"
#include "platform/foundation/Value.h"

namespace kx {

// One field of a record class: its key in the property list and its slot.
struct FieldKey {
  std::string_view key;
  std::uint8_t slot;
};

// The field values of one record. Until a field is set they are read where they stand, in the
// property list that the record was made from: a record then costs a handle and one byte a field.
// Any number of threads may read; setting needs the record alone.
class RecordFields {
 public:
  static constexpr std::size_t kSlots = 16;
  static constexpr std::uint8_t kAbsent = 0xFF;
  // By slot: the position of the entry in the dictionary, or kAbsent.
  using Positions = std::array<std::uint8_t, kSlots>;
  static constexpr Positions kNowhere = {kAbsent, kAbsent, kAbsent, kAbsent, kAbsent, kAbsent,
                                         kAbsent, kAbsent, kAbsent, kAbsent, kAbsent, kAbsent,
                                         kAbsent, kAbsent, kAbsent, kAbsent};

  RecordFields() = default;
  // Null gives null fields. Anything else that is no dictionary raises TypeError naming `what`.
  RecordFields(const Value& dictionary, std::span<const FieldKey> keys, std::string_view what);
  // Positions found before in a dictionary with the same keys in the same order.
  RecordFields(Value dictionary, const Positions& positions)
      : dictionary_(std::move(dictionary)), positions_(positions) {}

  // Finds the keys; false when one stands too far behind for a position.
  static bool findPositions(const DictionaryView& view, std::span<const FieldKey> keys,
                            Positions& positions);

  Value value(std::size_t slot) const;
  bool isNull(std::size_t slot) const {
    return positions_[slot] == kAbsent && (!values_ || (*values_)[slot].isNull());
  }
  // Readings that raise TypeError naming `key`; null stays null. Views live as long as the field.
  OptionalString string(std::size_t slot, std::string_view key) const {
    if (canPeek(slot)) {
      const EntryPeek entry = EntryPeek::valueOf(dictionary_, positions_[slot]);
      if (entry.kind() == Kind::kString) return entry.text();
    }
    return anyString(slot, key);
  }
  std::optional<Number> number(std::size_t slot, std::string_view key) const {
    if (canPeek(slot)) {
      const EntryPeek entry = EntryPeek::valueOf(dictionary_, positions_[slot]);
      if (entry.kind() == Kind::kNumber) return entry.number();
    }
    return anyNumber(slot, key);
  }
  // Elements of an array; 0 for everything else.
  std::size_t count(std::size_t slot) const;
  // Whether two slots were read from one and the same entry.
  bool sharesEntry(std::size_t slot, std::size_t other) const {
    return positions_[slot] != kAbsent && positions_[slot] == positions_[other];
  }

  void set(std::size_t slot, Value value);
  // Reads `slot` from the entry of `other` when it has none of its own.
  void fallBack(std::size_t slot, std::size_t other);

  // Null-tolerant equality of one slot in two records: both null, or equal values. Never raises.
  static bool equal(const RecordFields& a, const RecordFields& b, std::size_t slot);
  // The same of the elements of two arrays that have the same count, in their order.
  static bool equalElements(const RecordFields& a, const RecordFields& b, std::size_t slot);

 private:
  using Values = std::array<Value, kSlots>;
  void detach();
  bool canPeek(std::size_t slot) const {
    return positions_[slot] != kAbsent && EntryPeek::canContainer(dictionary_);
  }
  OptionalString anyString(std::size_t slot, std::string_view key) const;
  std::optional<Number> anyNumber(std::size_t slot, std::string_view key) const;

  Value dictionary_;                // a dictionary, or null
  Positions positions_ = kNowhere;  // kNowhere when there are values
  std::unique_ptr<Values> values_;  // all fields, once one was set
};

}  // namespace kx
