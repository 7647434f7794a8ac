#include "platform/foundation/PropertyListDocument.h"

#include <algorithm>

namespace kx {

char* DocumentArena::begin(std::size_t most, std::size_t firstBlock) {
  if (blocks_.empty() || most > capacity_ - used_) {
    if (blocks_.size() >= (std::size_t{1} << (32 - kShift))) return nullptr;
    capacity_ = blocks_.empty() ? std::min(kBlockBytes, firstBlock) : kBlockBytes;
    capacity_ = std::max(capacity_, most);
    used_ = 0;
    blocks_.push_back(std::make_unique_for_overwrite<char[]>(capacity_));
  }
  return blocks_.back().get() + used_;
}

std::uint32_t DocumentArena::commit(std::size_t used) {
  const auto block = static_cast<std::uint32_t>(blocks_.size() - 1);
  const std::uint32_t place = block << kShift | static_cast<std::uint32_t>(used_);
  used_ += used;
  // A place inside a block has 21 bits: what lies beyond is never begun.
  if (used_ >= kBlockBytes) used_ = capacity_;
  return place;
}

PropertyListDocument::PropertyListDocument(DataPtr bytes)
    : ValueStorage(Type::kDocument),
      data_(std::move(bytes)),
      base_(data_->bytes()),
      length_(data_->length()),
      seed_(processHashSeed()) {}

PropertyListDocument::~PropertyListDocument() {
  for (std::size_t i = 0; i < largeCount_; ++i) delete largeIndexes_[i].load();
}

Value PropertyListDocument::valueAt(std::uint32_t object) const {
  const DocumentNode& node = nodes_[object];
  switch (node.kind) {
    case Kind::kString:
    case Kind::kData:
      return ValueAccess::textOrData(node.kind, this, text(node).data(), node.high);
    case Kind::kArray:
    case Kind::kDictionary:
      return ValueAccess::container(node.kind, this, {object, node.low}, node.high);
    default:
      return ValueAccess::scalar(node.kind, static_cast<Number::Type>(node.detail), node.bits());
  }
}

std::uint32_t PropertyListDocument::keyNumber(std::string_view text) const {
  if (keySlots_.empty()) return kNoKey;
  const auto hash = static_cast<std::uint32_t>(hashBytes(text.data(), text.size(), seed_));
  const std::size_t mask = keySlots_.size() - 1;
  for (std::size_t slot = hash & mask; keySlots_[slot] != 0; slot = (slot + 1) & mask) {
    const std::uint32_t number = keySlots_[slot] - 1;
    const Key& key = keys_[number];
    if (key.hash == hash && this->text(nodes_[key.object]) == text) return number;
  }
  return kNoKey;
}

std::uint32_t PropertyListDocument::internKey(std::uint32_t object) {
  if ((keys_.size() + 1) * 2 > keySlots_.size()) growKeyTable();
  const std::string_view text = this->text(nodes_[object]);
  const auto hash = static_cast<std::uint32_t>(hashBytes(text.data(), text.size(), seed_));
  const std::size_t mask = keySlots_.size() - 1;
  std::size_t slot = hash & mask;
  for (; keySlots_[slot] != 0; slot = (slot + 1) & mask) {
    const std::uint32_t number = keySlots_[slot] - 1;
    const Key& key = keys_[number];
    if (key.hash == hash && this->text(nodes_[key.object]) == text) {
      nodes_[object].extra = number + 1;
      return number;
    }
  }
  const auto number = static_cast<std::uint32_t>(keys_.size());
  keys_.push_back(Key{hash, object});
  keySlots_[slot] = number + 1;
  nodes_[object].extra = number + 1;
  return number;
}

void PropertyListDocument::growKeyTable() {
  const std::size_t capacity = std::max<std::size_t>(64, keySlots_.size() * 2);
  keySlots_.assign(capacity, 0);
  const std::size_t mask = capacity - 1;
  for (std::size_t i = 0; i < keys_.size(); ++i) {
    std::size_t slot = keys_[i].hash & mask;
    while (keySlots_[slot] != 0) slot = (slot + 1) & mask;
    keySlots_[slot] = static_cast<std::uint32_t>(i + 1);
  }
}

std::size_t PropertyListDocument::positionOf(const Value& dictionary, std::string_view key,
                                             std::uint32_t expected) const {
  const std::uint32_t place = ValueAccess::place(dictionary);
  const std::uint32_t count = ValueAccess::size(dictionary);
  if (expected < count && isText(reference(place, expected), key)) return expected;
  if (count <= kTextScanLimit) {
    for (std::uint32_t i = 0; i < count; ++i) {
      if (isText(reference(place, i), key)) return i;
    }
    return kNone;
  }
  const std::uint32_t number = keyNumber(key);
  if (number == kNoKey) return kNone;
  const std::uint32_t wanted = number + 1;
  if (count <= kScanLimit) {
    for (std::uint32_t i = 0; i < count; ++i) {
      if (nodes_[reference(place, i)].extra == wanted) return i;
    }
    return kNone;
  }
  const LargeIndex& index = largeIndex(dictionary);
  const std::size_t mask = index.slots.size() - 1;
  for (std::size_t slot = number & mask; index.slots[slot] != 0; slot = (slot + 1) & mask) {
    const std::uint32_t position = index.slots[slot] - 1;
    if (nodes_[reference(place, position)].extra == wanted) return position;
  }
  return kNone;
}

void PropertyListDocument::indexLargeDictionaries(const std::vector<std::uint32_t>& objects) {
  largeCount_ = objects.size();
  if (largeCount_ == 0) return;
  largeIndexes_ = std::make_unique<std::atomic<const LargeIndex*>[]>(largeCount_);
  for (std::size_t i = 0; i < largeCount_; ++i) {
    nodes_[objects[i]].extra = static_cast<std::uint32_t>(i);
  }
}

// Made by the first look-up; when two threads make it at once, one of the two is dropped.
const PropertyListDocument::LargeIndex& PropertyListDocument::largeIndex(
    const Value& dictionary) const {
  const std::uint32_t references = ValueAccess::place(dictionary);
  const std::uint32_t count = ValueAccess::size(dictionary);
  std::atomic<const LargeIndex*>& place =
      largeIndexes_[nodes_[ValueAccess::objectIndex(dictionary)].extra];
  if (const LargeIndex* made = place.load(std::memory_order_acquire)) return *made;
  auto fresh = std::make_unique<LargeIndex>();
  std::size_t capacity = 64;
  while (capacity < std::size_t{count} * 2) capacity *= 2;
  fresh->slots.assign(capacity, 0);
  const std::size_t mask = capacity - 1;
  for (std::uint32_t i = 0; i < count; ++i) {
    std::size_t slot = (nodes_[reference(references, i)].extra - 1) & mask;
    while (fresh->slots[slot] != 0) slot = (slot + 1) & mask;
    fresh->slots[slot] = i + 1;
  }
  const LargeIndex* expected = nullptr;
  if (place.compare_exchange_strong(expected, fresh.get(), std::memory_order_acq_rel)) {
    return *fresh.release();
  }
  return *expected;
}

}  // namespace kx
