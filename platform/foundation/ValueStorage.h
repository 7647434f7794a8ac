#pragma once

#include <new>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/foundation/Value.h"

// The storage kinds behind Value. Internal to platform/foundation.
namespace kx {

// Text or data in one allocation, the bytes behind the header.
class BytesStorage final : public ValueStorage {
 public:
  static BytesStorage* make(const void* bytes, std::size_t length);
  void* content() const { return const_cast<BytesStorage*>(this) + 1; }
  ~BytesStorage() = default;

 private:
  BytesStorage() : ValueStorage(Type::kBytes) {}
};

class ArrayStorage final : public ValueStorage {
 public:
  explicit ArrayStorage(Array elements)
      : ValueStorage(Type::kArray), elements_(std::move(elements)) {}
  const Array& elements() const { return elements_; }
  ~ArrayStorage() = default;

 private:
  friend class ValueStorage;
  Array elements_;
};

// The entries of a dictionary in order of insertion. Small ones are scanned; larger ones have a
// hash index, made by the operation that lets them grow, so that reading is safe from any thread.
class DictionaryContent {
 public:
  struct Entry {
    Value key;
    Value value;
  };
  static constexpr std::size_t kNone = static_cast<std::size_t>(-1);

  const std::vector<Entry>& entries() const { return entries_; }
  std::size_t indexOf(std::string_view key) const;
  const Value* find(std::string_view key) const {
    const std::size_t index = indexOf(key);
    return index == kNone ? nullptr : &entries_[index].value;
  }
  void reserve(std::size_t count);
  // The key is known to be absent.
  void append(Value key, Value value);
  // Appends or replaces; the key is made when it is absent.
  template <typename MakeKey>
  void set(std::string_view key, Value value, const MakeKey& makeKey) {
    const std::size_t slot = slots_.empty() ? kNone : probe(key);
    const std::size_t index = slot == kNone ? scan(key) : std::size_t{slots_[slot]} - 1;
    if (index != kNone) {
      entries_[index].value = std::move(value);
    } else if (slot != kNone && (entries_.size() + 1) * 2 <= slots_.size()) {
      entries_.push_back(Entry{makeKey(), std::move(value)});
      slots_[slot] = static_cast<std::uint32_t>(entries_.size());
    } else {
      append(makeKey(), std::move(value));
    }
  }
  void removeAt(std::size_t index);

 private:
  friend class ValueStorage;
  static constexpr std::size_t kScanLimit = 12;
  std::size_t scan(std::string_view key) const;
  // The slot of the key, or the free one where it would go.
  std::size_t probe(std::string_view key) const;
  void link(std::size_t index);
  // For that many entries.
  void rebuildIndex(std::size_t count);

  std::vector<Entry> entries_;
  std::vector<std::uint32_t> slots_;  // entry index plus 1, 0 is free; empty for small contents
};

class DictionaryStorage final : public ValueStorage {
 public:
  explicit DictionaryStorage(std::unique_ptr<DictionaryContent> content)
      : ValueStorage(Type::kDictionary), content_(std::move(content)) {}
  const DictionaryContent& content() const { return *content_; }
  ~DictionaryStorage() = default;

 private:
  friend class ValueStorage;
  std::unique_ptr<DictionaryContent> content_;
};

class PropertyListDocument;

// Makes and opens values for the readers and writers of this folder. References that come back from
// it without a count live as long as the value they were taken from.
struct ValueAccess {
  static Value scalar(Kind kind, Number::Type type, std::uint64_t bits) {
    Value value;
    value.kind_ = kind;
    value.numberType_ = type;
    value.payload_.bits = bits;
    return value;
  }
  static Value textOrData(Kind kind, const ValueStorage* owner, const void* bytes,
                          std::uint32_t length) {
    Value value;
    owner->retain();
    value.owner_ = owner;
    value.kind_ = kind;
    value.payload_.pointer = bytes;
    value.size_ = length;
    value.inDocument_ = owner->type() == ValueStorage::Type::kDocument;
    return value;
  }
  // A container of a document: its object, and where its references start.
  struct Container {
    std::uint32_t object;
    std::uint32_t place;
  };
  static Value container(Kind kind, const ValueStorage* document, Container container,
                         std::uint32_t count) {
    Value value;
    document->retain();
    value.owner_ = document;
    value.kind_ = kind;
    value.payload_.bits = static_cast<std::uint64_t>(container.place) << 32 | container.object;
    value.size_ = count;
    value.inDocument_ = true;
    return value;
  }
  static Value adopt(Kind kind, const ValueStorage* owner, const void* bytes, std::size_t size);

  static const ValueStorage* owner(const Value& value) { return value.owner_; }
  static std::uint64_t bits(const Value& value) { return value.payload_.bits; }
  static std::uint32_t size(const Value& value) { return value.size_; }
  static Number::Type numberType(const Value& value) { return value.numberType_; }
  static bool inDocument(const Value& value) { return value.inDocument_; }
  static std::string_view text(const Value& value) {
    return {static_cast<const char*>(value.payload_.pointer), value.size_};
  }
  static Number number(Number::Type type, std::uint64_t bits) { return Number(type, bits); }
  static std::uint64_t numberBits(const Number& number) { return number.bits_; }

  // The document of a container read from a file, else null.
  static const PropertyListDocument* document(const Value& value);
  static std::uint32_t objectIndex(const Value& value) {
    return static_cast<std::uint32_t>(value.payload_.bits);
  }
  static std::uint32_t place(const Value& value) {
    return static_cast<std::uint32_t>(value.payload_.bits >> 32);
  }
  // For containers built in memory.
  static const Array& elements(const Value& value) {
    return static_cast<const ArrayStorage*>(value.owner_)->elements();
  }
  static const DictionaryContent& content(const Value& value) {
    return static_cast<const DictionaryStorage*>(value.owner_)->content();
  }
};

}  // namespace kx
