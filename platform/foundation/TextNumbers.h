#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#include "platform/foundation/Hash.h"

namespace kx {

// Numbers texts from 0 on, in the order in which each came first. Keeps views: what they view
// outlives this. Adding and finding cost O(1) on average, whatever the texts. One thread at a time.
class TextNumbers {
 public:
  static constexpr std::uint32_t kNone = static_cast<std::uint32_t>(-1);

  explicit TextNumbers(std::size_t expected = 0) {
    texts_.reserve(expected);
    grow(expected);
  }

  // By number.
  const std::vector<std::string_view>& texts() const { return texts_; }
  std::size_t size() const { return texts_.size(); }
  bool empty() const { return texts_.empty(); }

  // The number of the text, its own from now on when it had none.
  std::uint32_t add(std::string_view text) {
    if ((texts_.size() + 1) * 2 > slots_.size()) grow(texts_.size() + 1);
    const std::uint64_t hash = hashText(text);
    Slot& slot = slots_[probe(text, hash)];
    if (slot.number == kNone) {
      slot = {static_cast<std::uint32_t>(texts_.size()), tagOf(hash)};
      texts_.push_back(text);
    }
    return slot.number;
  }
  // kNone for a text without one. A number that is guessed right costs no probe.
  std::uint32_t find(std::string_view text, std::uint32_t guess = kNone) const {
    if (guess < texts_.size() && texts_[guess] == text) return guess;
    return slots_[probe(text, hashText(text))].number;
  }
  bool contains(std::string_view text) const { return find(text) != kNone; }

 private:
  // The tag is a part of the hash that the slot's place does not tell, so that other texts are not
  // looked at.
  struct Slot {
    std::uint32_t number = kNone;
    std::uint32_t tag = 0;
  };

  static std::uint32_t tagOf(std::uint64_t hash) { return static_cast<std::uint32_t>(hash >> 32); }

  // The slot of the text, or the free one where it would go; half of the slots are free.
  std::size_t probe(std::string_view text, std::uint64_t hash) const {
    const std::size_t mask = slots_.size() - 1;
    std::size_t at = static_cast<std::size_t>(hash) & mask;
    while (slots_[at].number != kNone &&
           (slots_[at].tag != tagOf(hash) || texts_[slots_[at].number] != text)) {
      at = (at + 1) & mask;
    }
    return at;
  }
  // Room for so many texts.
  void grow(std::size_t count) {
    std::size_t capacity = 16;
    while (capacity < count * 2) capacity *= 2;
    slots_.assign(capacity, Slot());
    for (std::uint32_t number = 0; number < texts_.size(); ++number) {
      const std::uint64_t hash = hashText(texts_[number]);
      slots_[probe(texts_[number], hash)] = {number, tagOf(hash)};
    }
  }

  std::vector<std::string_view> texts_;  // by number
  std::vector<Slot> slots_;
};

}  // namespace kx
