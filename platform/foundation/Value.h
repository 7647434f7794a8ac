#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/foundation/Date.h"
#include "platform/foundation/Number.h"

namespace kx {

class ArrayView;
class Dictionary;
class DictionaryContent;
class DictionaryView;
class Value;
struct ValueAccess;

using Array = std::vector<Value>;

// A nullable string view: null, "" and a text are three different things.
using OptionalString = std::optional<std::string_view>;

enum class Kind : std::uint8_t {
  kNull,
  kNumber,  // booleans included
  kDate,
  kString,
  kData,
  kUid,
  kArray,
  kDictionary,
};

// "null", "number", "date", "string", "data", "uid", "array", "dictionary".
std::string_view kindName(Kind kind);

// Counted storage behind values: text or data, an array, a dictionary, or a whole document.
// Internal: its kinds are in ValueStorage.h. Releasing the last reference never recurses over
// nested storage.
class ValueStorage {
 public:
  enum class Type : std::uint8_t { kBytes, kArray, kDictionary, kDocument };
  ValueStorage(const ValueStorage&) = delete;
  ValueStorage& operator=(const ValueStorage&) = delete;

  Type type() const noexcept { return type_; }
  void retain() const noexcept { references_.fetch_add(1, std::memory_order_relaxed); }
  void release() const noexcept {
    if (dropReference()) destroy(this);
  }

 protected:
  explicit ValueStorage(Type type) noexcept : type_(type) {}
  ~ValueStorage() = default;

 private:
  bool dropReference() const noexcept {
    return references_.fetch_sub(1, std::memory_order_acq_rel) == 1;
  }
  static void destroy(const ValueStorage* storage) noexcept;
  static void destroyOne(const ValueStorage* storage) noexcept;

  mutable std::atomic<std::uint32_t> references_{1};
  const Type type_;
  mutable const ValueStorage* nextToDestroy_ = nullptr;
};

// One immutable property-list value, or null (which no property list holds: it stands for an absent
// value). A value read from a file is a handle into its document: strings, data and containers stay
// views of the document's bytes, which live as long as any value made from it. Copying costs at
// most one atomic increment; releasing a tree never recurses over its depth. Threads: values may be
// read and copied from any thread; one Value object is not to be assigned while another thread
// reads it.
class Value {
 public:
  Value() noexcept = default;
  Value(const Value& other) noexcept { copyFrom(other); }
  Value(Value&& other) noexcept { takeFrom(other); }
  Value& operator=(const Value& other) noexcept {
    if (this != &other) {
      Value copy(other);
      swap(copy);
    }
    return *this;
  }
  Value& operator=(Value&& other) noexcept {
    Value taken(std::move(other));
    swap(taken);
    return *this;
  }
  ~Value() {
    if (owner_ != nullptr) owner_->release();
  }

  Value(const Number& number) noexcept;  // NOLINT: a number is a value
  static Value boolean(bool value) { return Value(Number::boolean(value)); }
  static Value integer(std::int64_t value) { return Value(Number::integer(value)); }
  static Value unsignedInteger(std::uint64_t value) {
    return Value(Number::unsignedInteger(value));
  }
  static Value real(double value) { return Value(Number::real(value)); }
  static Value date(Date value);
  // UTF-8 text; the caller vouches for its encoding (the writers refuse invalid text).
  static Value string(std::string_view text);
  static Value data(std::span<const std::uint8_t> bytes);
  static Value uid(std::uint32_t value);
  static Value array(Array elements);
  static Value dictionary(Dictionary entries);
  static Value optionalString(OptionalString text) { return text ? string(*text) : Value(); }
  static Value optionalNumber(const std::optional<Number>& n) { return n ? Value(*n) : Value(); }

  Kind kind() const noexcept { return kind_; }
  bool isNull() const noexcept { return kind_ == Kind::kNull; }
  bool isString() const noexcept { return kind_ == Kind::kString; }
  bool isNumber() const noexcept { return kind_ == Kind::kNumber; }
  bool isArray() const noexcept { return kind_ == Kind::kArray; }
  bool isDictionary() const noexcept { return kind_ == Kind::kDictionary; }

  // Readings that raise TypeError naming `key` when the value is neither null nor of that kind.
  // Views live as long as this value or a copy of it.
  OptionalString asString(std::string_view key) const;
  std::optional<Number> asNumber(std::string_view key) const;
  std::optional<Date> asDate(std::string_view key) const;
  std::optional<std::span<const std::uint8_t>> asData(std::string_view key) const;
  std::optional<ArrayView> asArray(std::string_view key) const;
  std::optional<DictionaryView> asDictionary(std::string_view key) const;

  // Readings of a value known to be of that kind; TypeError otherwise, null included.
  std::string_view stringValue() const;
  Number numberValue() const;
  Date dateValue() const;
  std::span<const std::uint8_t> dataValue() const;
  std::uint32_t uidValue() const;
  ArrayView arrayValue() const;
  DictionaryView dictionaryValue() const;

  // The entry of a dictionary, null when it is absent or this is no dictionary.
  Value operator[](std::string_view key) const;

  // Same kind and equal content; numbers by numeric equality; dictionaries whatever their order.
  friend bool operator==(const Value& a, const Value& b);

  // Readable text for logs: strings bare at the top level and quoted inside containers, containers
  // over several lines, null as "(null)". Cut with "..." after about 1 MiB.
  std::string description() const;

 private:
  friend class ValueStorage;
  friend struct ValueAccess;

  void copyFrom(const Value& other) noexcept {
    owner_ = other.owner_;
    payload_ = other.payload_;
    size_ = other.size_;
    kind_ = other.kind_;
    numberType_ = other.numberType_;
    inDocument_ = other.inDocument_;
    if (owner_ != nullptr) owner_->retain();
  }
  void takeFrom(Value& other) noexcept {
    owner_ = std::exchange(other.owner_, nullptr);
    payload_ = other.payload_;
    size_ = other.size_;
    kind_ = std::exchange(other.kind_, Kind::kNull);
    numberType_ = other.numberType_;
    inDocument_ = other.inDocument_;
  }
  void swap(Value& other) noexcept {
    std::swap(owner_, other.owner_);
    std::swap(payload_, other.payload_);
    std::swap(size_, other.size_);
    std::swap(kind_, other.kind_);
    std::swap(numberType_, other.numberType_);
    std::swap(inDocument_, other.inDocument_);
  }

  union Payload {
    std::uint64_t bits;   // number, date (bits of the double), uid; container: see ValueStorage.h
    const void* pointer;  // string, data
  };

  const ValueStorage* owner_ = nullptr;  // counted; null for numbers, dates, uids
  Payload payload_{0};
  std::uint32_t size_ = 0;  // bytes of a string or data, elements of a container
  Kind kind_ = Kind::kNull;
  Number::Type numberType_ = Number::Type::kInteger;
  bool inDocument_ = false;  // owner_ is a document
};

static_assert(sizeof(Value) <= 24);

// Read access to an array value. Keeps the underlying storage alive.
class ArrayView {
 public:
  std::size_t size() const;
  bool empty() const { return size() == 0; }
  Value operator[](std::size_t index) const;
  // The text of an element as its asString gives it, without making a value; it lives as long as
  // the array.
  OptionalString stringAt(std::size_t index, std::string_view key) const;
  // For loops over very many elements of a file: has the processor fetch what stands some elements
  // behind this one.
  void prefetchBehind(std::size_t index) const;

  class Iterator {
   public:
    Iterator(const ArrayView* view, std::size_t index) : view_(view), index_(index) {}
    Value operator*() const { return (*view_)[index_]; }
    Iterator& operator++() {
      ++index_;
      return *this;
    }
    bool operator==(const Iterator& other) const { return index_ == other.index_; }

   private:
    const ArrayView* view_;
    std::size_t index_;
  };
  Iterator begin() const { return {this, 0}; }
  Iterator end() const { return {this, size()}; }

 private:
  friend class Value;
  explicit ArrayView(Value value) : value_(std::move(value)) {}
  Value value_;
};

// Read access to a dictionary value, entries in file order (order of insertion). Keys are strings.
// find costs a scan for small dictionaries and one hash look-up for large ones.
class DictionaryView {
 public:
  std::size_t size() const;
  bool empty() const { return size() == 0; }
  std::string_view keyAt(std::size_t index) const;
  Value keyValueAt(std::size_t index) const;
  Value valueAt(std::size_t index) const;
  // Null when absent.
  Value find(std::string_view key) const;
  bool contains(std::string_view key) const;

  // For a dictionary read from a binary file: the key's object index in that file, so that equal
  // keys can be recognised without comparing text; nullopt for any other dictionary.
  std::optional<std::uint32_t> keyObjectIndexAt(std::size_t index) const;
  // Number of objects of the document, 0 for a dictionary that was built in memory.
  std::size_t documentObjectCount() const;

 private:
  friend class Value;
  explicit DictionaryView(Value value) : value_(std::move(value)) {}
  Value value_;
};

// A dictionary being built: string keys, order of insertion; setting a key again keeps its place.
// Setting a null value raises InternalInconsistency. Removal costs a move of the later entries, all
// else O(1) on average. Not for use from two threads at once.
class Dictionary {
 public:
  Dictionary();
  Dictionary(std::initializer_list<std::pair<std::string_view, Value>> entries);
  explicit Dictionary(const DictionaryView& view);
  Dictionary(const Dictionary& other);
  Dictionary(Dictionary&& other) noexcept;
  Dictionary& operator=(Dictionary other) noexcept;
  ~Dictionary();

  // Before very many entries are set.
  void reserve(std::size_t count);
  void set(std::string_view key, Value value);
  void set(const Value& key, Value value);  // key is a string value; shares its text
  // Sets only a value that is not null.
  void setIfPresent(std::string_view key, Value value);
  void remove(std::string_view key);
  Value find(std::string_view key) const;
  bool contains(std::string_view key) const;
  std::size_t size() const;
  bool empty() const { return size() == 0; }
  std::string_view keyAt(std::size_t index) const;
  const Value& valueAt(std::size_t index) const;

 private:
  friend class Value;
  std::unique_ptr<DictionaryContent> content_;
};

}  // namespace kx
