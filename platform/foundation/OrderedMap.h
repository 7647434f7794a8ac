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
    if (count * 2 > slots_.size()) rehash(count);
  }
  void clear() {
    entries_.clear();
    slots_.clear();
    live_ = 0;
    first_ = 0;
  }

  T* find(std::string_view key) {
    const std::size_t slot = findSlot(key);
    return slot == kNone ? nullptr : &entries_[slots_[slot] - 1].value;
  }
  const T* find(std::string_view key) const {
    const std::size_t slot = findSlot(key);
    return slot == kNone ? nullptr : &entries_[slots_[slot] - 1].value;
  }
  bool contains(std::string_view key) const { return findSlot(key) != kNone; }

  // Sets or replaces. The key must be a string value.
  T& set(Value key, T value) {
    const std::string_view text = key.stringValue();
    if (const std::size_t slot = findSlot(text); slot != kNone) {
      Entry& entry = entries_[slots_[slot] - 1];
      entry.value = std::move(value);
      return entry.value;
    }
    // Removed entries keep their place and their slot until the next rehash, so they count here: at
    // most half of the slots are ever taken and every probe meets a free one.
    if ((entries_.size() + 1) * 2 > slots_.size()) rehash(live_ + 1);
    entries_.push_back(Entry{std::move(key), std::move(value)});
    link(entries_.size() - 1);
    ++live_;
    return entries_.back().value;
  }
  T& set(std::string_view key, T value) { return set(Value::string(key), std::move(value)); }

  bool remove(std::string_view key) {
    const std::size_t slot = findSlot(key);
    if (slot == kNone) return false;
    Entry& entry = entries_[slots_[slot] - 1];
    entry.key = Value();
    entry.value = T();
    slots_[slot] = kTombstone;
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
  static constexpr std::size_t kNone = static_cast<std::size_t>(-1);
  static constexpr std::uint32_t kTombstone = static_cast<std::uint32_t>(-1);

  static std::size_t hashOf(std::string_view key) {
    return static_cast<std::size_t>(hashText(key));
  }

  std::size_t findSlot(std::string_view key) const {
    if (slots_.empty()) return kNone;
    const std::size_t mask = slots_.size() - 1;
    for (std::size_t slot = hashOf(key) & mask;; slot = (slot + 1) & mask) {
      const std::uint32_t stored = slots_[slot];
      if (stored == 0) return kNone;
      if (stored != kTombstone && entries_[stored - 1].key.stringValue() == key) return slot;
    }
  }
  void link(std::size_t index) {
    const std::size_t mask = slots_.size() - 1;
    std::size_t slot = hashOf(entries_[index].key.stringValue()) & mask;
    while (slots_[slot] != 0) slot = (slot + 1) & mask;
    slots_[slot] = static_cast<std::uint32_t>(index + 1);
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
    slots_.assign(capacity, 0);
    for (std::size_t i = 0; i < entries_.size(); ++i) link(i);
  }

  std::vector<Entry> entries_;
  std::vector<std::uint32_t> slots_;  // index into entries_ plus 1; 0 is free
  std::size_t live_ = 0;
  std::size_t first_ = 0;  // no entry before it is live
};

}  // namespace kx
