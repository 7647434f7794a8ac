#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/foundation/Hash.h"
#include "platform/foundation/Value.h"

namespace kx {

// Insertion-ordered dictionary from a string (a Value of kind string, whose text it keeps alive) to
// T. A replaced key keeps its first place; removal keeps the order of the rest. Look-ups, insertion
// and removal cost O(1) on average. Iterators give Entry&; removal during iteration is not allowed.
// Not for use from two threads at once.
template <typename T>
class OrderedMap {
 public:
  struct Entry {
    Value key;
    T value;
  };

  std::size_t size() const { return live_; }
  bool empty() const { return live_ == 0; }
  void reserve(std::size_t count) {
    entries_.reserve(count);
    if (count * 2 > slots_.size()) rehash((count + 1) / 2);
  }
  void clear() {
    entries_.clear();
    slots_.clear();
    live_ = 0;
    first_ = 0;
  }

  T* find(std::string_view key) {
    const std::uint32_t place = placeOf(key);
    return place == 0 ? nullptr : &entries_[place - 1].value;
  }
  const T* find(std::string_view key) const {
    const std::uint32_t place = placeOf(key);
    return place == 0 ? nullptr : &entries_[place - 1].value;
  }
  bool contains(std::string_view key) const { return placeOf(key) != 0; }

  // Where a run of look-ups has come to. Keys that are asked for in the order of the entries are
  // found without a probe.
  class Cursor {
   public:
    // The number of the entry found last: below places(), the same until the next set or remove.
    std::size_t place() const { return next_ - 1; }

   private:
    friend class OrderedMap;
    std::size_t next_ = 0;
  };
  std::size_t places() const { return entries_.size(); }
  const Entry* find(std::string_view key, Cursor& cursor) const {
    if (cursor.next_ < entries_.size()) {
      const Value& next = entries_[cursor.next_].key;
      if (!next.isNull() && next.stringValue() == key) return &entries_[cursor.next_++];
    }
    const std::uint32_t place = placeOf(key);
    if (place == 0) return nullptr;
    cursor.next_ = place;
    return &entries_[place - 1];
  }

  // Sets or replaces. The key must be a string value.
  T& set(Value key, T value) {
    const std::uint64_t hash = hashText(key.stringValue());
    return setHashed(std::move(key), std::move(value), hash);
  }
  T& set(std::string_view key, T value) { return set(Value::string(key), std::move(value)); }

  // For very many insertions: the hash of a key that is soon to be set, whose place in the table is
  // fetched into the processor's cache meanwhile; and `set` with that hash.
  std::uint64_t announce(std::string_view key) const {
    const std::uint64_t hash = hashText(key);
    if (!slots_.empty()) {
      __builtin_prefetch(&slots_[static_cast<std::size_t>(hash) & (slots_.size() - 1)]);
    }
    return hash;
  }
  T& setHashed(Value key, T value, std::uint64_t hash) {
    const std::string_view text = key.stringValue();
    if (slots_.empty()) rehash(1);
    std::size_t at = probe(text, hash);
    if (slots_[at].place != 0) {
      Entry& entry = entries_[slots_[at].place - 1];
      entry.value = std::move(value);
      return entry.value;
    }
    // Removed entries keep their place and their slot until the next rehash, so they count here: at
    // most half of the slots are ever taken and every probe meets a free one.
    if ((entries_.size() + 1) * 2 > slots_.size()) {
      rehash(live_ + 1);
      at = probe(text, hash);
    }
    entries_.push_back(Entry{std::move(key), std::move(value)});
    slots_[at] = Slot{static_cast<std::uint32_t>(entries_.size()), tagOf(hash)};
    ++live_;
    return entries_.back().value;
  }

  bool remove(std::string_view key) {
    if (slots_.empty()) return false;
    Slot& slot = slots_[probe(key, hashText(key))];
    if (slot.place == 0) return false;
    Entry& entry = entries_[slot.place - 1];
    entry.key = Value();
    entry.value = T();
    slot.place = kTombstone;
    --live_;
    while (first_ < entries_.size() && entries_[first_].key.isNull()) ++first_;
    return true;
  }

  template <bool IsConst>
  class BasicIterator {
   public:
    using Owner = std::conditional_t<IsConst, const OrderedMap, OrderedMap>;
    BasicIterator(Owner* map, std::size_t index) : map_(map), index_(index) { skip(); }
    auto& operator*() const { return map_->entries_[index_]; }
    auto* operator->() const { return &map_->entries_[index_]; }
    BasicIterator& operator++() {
      ++index_;
      skip();
      return *this;
    }
    bool operator==(const BasicIterator& other) const { return index_ == other.index_; }

   private:
    void skip() {
      while (index_ < map_->entries_.size() && map_->entries_[index_].key.isNull()) ++index_;
    }
    Owner* map_;
    std::size_t index_;
  };
  using iterator = BasicIterator<false>;
  using const_iterator = BasicIterator<true>;
  iterator begin() { return {this, first_}; }
  iterator end() { return {this, entries_.size()}; }
  const_iterator begin() const { return {this, first_}; }
  const_iterator end() const { return {this, entries_.size()}; }

 private:
  // Index into entries_ plus 1, 0 when free; and a part of the hash that the place does not tell,
  // so that other keys are not looked at.
  struct Slot {
    std::uint32_t place = 0;
    std::uint32_t tag = 0;
  };
  static constexpr std::uint32_t kTombstone = static_cast<std::uint32_t>(-1);

  static std::uint32_t tagOf(std::uint64_t hash) { return static_cast<std::uint32_t>(hash >> 32); }

  // The slot of the key, or the free one where it would go. There must be a free one.
  std::size_t probe(std::string_view key, std::uint64_t hash) const {
    const std::size_t mask = slots_.size() - 1;
    for (std::size_t at = static_cast<std::size_t>(hash) & mask;; at = (at + 1) & mask) {
      const Slot& slot = slots_[at];
      if (slot.place == 0) return at;
      if (slot.tag == tagOf(hash) && slot.place != kTombstone &&
          entries_[slot.place - 1].key.stringValue() == key) {
        return at;
      }
    }
  }
  // 0 when it is not there.
  std::uint32_t placeOf(std::string_view key) const {
    return slots_.empty() ? 0 : slots_[probe(key, hashText(key))].place;
  }
  void link(std::size_t index) {
    const std::uint64_t hash = hashText(entries_[index].key.stringValue());
    const std::size_t mask = slots_.size() - 1;
    std::size_t at = static_cast<std::size_t>(hash) & mask;
    while (slots_[at].place != 0) at = (at + 1) & mask;
    slots_[at] = Slot{static_cast<std::uint32_t>(index + 1), tagOf(hash)};
  }
  // Drops the places of removed entries and builds the table anew with room for twice `count`
  // entries: at least `count` further insertions go by before the next time.
  void rehash(std::size_t count) {
    if (live_ != entries_.size()) {
      std::erase_if(entries_, [](const Entry& entry) { return entry.key.isNull(); });
    }
    std::size_t capacity = 16;
    while (capacity < std::max(count, live_) * 4) capacity *= 2;
    first_ = 0;
    slots_.assign(capacity, Slot());
    for (std::size_t i = 0; i < entries_.size(); ++i) link(i);
  }

  std::vector<Entry> entries_;
  std::vector<Slot> slots_;
  std::size_t live_ = 0;
  std::size_t first_ = 0;  // no entry before it is live
};

}  // namespace kx
