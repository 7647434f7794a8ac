#include "platform/foundation/Value.h"

#include <bit>
#include <cstring>
#include <limits>

#include "platform/foundation/Exceptions.h"
#include "platform/foundation/PropertyListDocument.h"
#include "platform/foundation/ValueStorage.h"

namespace kx {
namespace {

// How many elements ahead of a loop it is worth to fetch.
constexpr std::size_t kNear = 8;

// As ValueAccess::document, in line.
inline const PropertyListDocument* documentOf(const Value& value) {
  return ValueAccess::inDocument(value)
             ? static_cast<const PropertyListDocument*>(ValueAccess::owner(value))
             : nullptr;
}

void requireRoom(std::size_t size) {
  if (size > std::numeric_limits<std::uint32_t>::max() - 1) {
    throw InternalInconsistency("a value is too large");
  }
}

[[noreturn]] void wrongKind(std::string_view key, Kind expected, Kind found) {
  throw TypeError(key, kindName(expected), kindName(found));
}

bool isPresent(const Value& value, Kind expected, std::string_view key) {
  if (value.isNull()) return false;
  if (value.kind() != expected) wrongKind(key, expected, value.kind());
  return true;
}

void require(const Value& value, Kind expected) {
  if (value.kind() != expected) wrongKind("", expected, value.kind());
}

}  // namespace

std::string_view kindName(Kind kind) {
  switch (kind) {
    case Kind::kNull:
      return "null";
    case Kind::kNumber:
      return "number";
    case Kind::kDate:
      return "date";
    case Kind::kString:
      return "string";
    case Kind::kData:
      return "data";
    case Kind::kUid:
      return "uid";
    case Kind::kArray:
      return "array";
    case Kind::kDictionary:
      return "dictionary";
  }
  return "null";
}

BytesStorage* BytesStorage::make(const void* bytes, std::size_t length) {
  requireRoom(length);
  void* memory = ::operator new(sizeof(BytesStorage) + length);
  auto* storage = new (memory) BytesStorage();
  if (length != 0) std::memcpy(storage->content(), bytes, length);
  return storage;
}

Value ValueAccess::adopt(Kind kind, const ValueStorage* owner, const void* bytes,
                         std::size_t size) {
  Value value;
  value.owner_ = owner;
  value.kind_ = kind;
  value.payload_.pointer = bytes;
  value.size_ = static_cast<std::uint32_t>(size);
  return value;
}

const PropertyListDocument* ValueAccess::document(const Value& value) {
  return value.inDocument_ ? static_cast<const PropertyListDocument*>(value.owner_) : nullptr;
}

void ValueStorage::destroyOne(const ValueStorage* storage) noexcept {
  switch (storage->type_) {
    case Type::kBytes: {
      auto* bytes = const_cast<BytesStorage*>(static_cast<const BytesStorage*>(storage));
      bytes->~BytesStorage();
      ::operator delete(bytes);
      break;
    }
    case Type::kArray:
      delete static_cast<const ArrayStorage*>(storage);
      break;
    case Type::kDictionary:
      delete static_cast<const DictionaryStorage*>(storage);
      break;
    case Type::kDocument:
      delete static_cast<const PropertyListDocument*>(storage);
      break;
  }
}

// Storage whose last reference is gone waits in a list through nextToDestroy_; its children are
// released from here, so that their own destructors find nothing left to do.
void ValueStorage::destroy(const ValueStorage* storage) noexcept {
  storage->nextToDestroy_ = nullptr;
  const ValueStorage* pending = storage;
  const auto detach = [&pending](Value& child) {
    const ValueStorage* owner = std::exchange(child.owner_, nullptr);
    if (owner == nullptr || !owner->dropReference()) return;
    owner->nextToDestroy_ = pending;
    pending = owner;
  };
  while (pending != nullptr) {
    const ValueStorage* current = pending;
    pending = current->nextToDestroy_;
    if (current->type_ == Type::kArray) {
      auto* array = const_cast<ArrayStorage*>(static_cast<const ArrayStorage*>(current));
      for (Value& element : array->elements_) detach(element);
    } else if (current->type_ == Type::kDictionary) {
      const auto* dictionary = static_cast<const DictionaryStorage*>(current);
      for (auto& entry : dictionary->content_->entries_) {
        detach(entry.key);
        detach(entry.value);
      }
    }
    destroyOne(current);
  }
}

Value::Value(const Number& number) noexcept : kind_(Kind::kNumber), numberType_(number.type()) {
  payload_.bits = number.bits_;
}

Value Value::date(Date value) {
  return ValueAccess::scalar(Kind::kDate, Number::Type::kReal64,
                             std::bit_cast<std::uint64_t>(value.secondsSinceReference));
}

Value Value::string(std::string_view text) {
  BytesStorage* storage = BytesStorage::make(text.data(), text.size());
  return ValueAccess::adopt(Kind::kString, storage, storage->content(), text.size());
}

Value Value::data(std::span<const std::uint8_t> bytes) {
  BytesStorage* storage = BytesStorage::make(bytes.data(), bytes.size());
  return ValueAccess::adopt(Kind::kData, storage, storage->content(), bytes.size());
}

Value Value::uid(std::uint32_t value) {
  return ValueAccess::scalar(Kind::kUid, Number::Type::kInteger, value);
}

Value Value::array(Array elements) {
  requireRoom(elements.size());
  const std::size_t count = elements.size();
  return ValueAccess::adopt(Kind::kArray, new ArrayStorage(std::move(elements)), nullptr, count);
}

Value Value::dictionary(Dictionary entries) {
  std::unique_ptr<DictionaryContent> content = std::move(entries.content_);
  if (content == nullptr) content = std::make_unique<DictionaryContent>();
  const std::size_t count = content->entries().size();
  requireRoom(count);
  return ValueAccess::adopt(Kind::kDictionary, new DictionaryStorage(std::move(content)), nullptr,
                            count);
}

OptionalString Value::asString(std::string_view key) const {
  if (!isPresent(*this, Kind::kString, key)) return std::nullopt;
  return ValueAccess::text(*this);
}

std::optional<Number> Value::asNumber(std::string_view key) const {
  if (!isPresent(*this, Kind::kNumber, key)) return std::nullopt;
  return Number(numberType_, payload_.bits);
}

std::optional<Date> Value::asDate(std::string_view key) const {
  if (!isPresent(*this, Kind::kDate, key)) return std::nullopt;
  return Date{std::bit_cast<double>(payload_.bits)};
}

std::optional<std::span<const std::uint8_t>> Value::asData(std::string_view key) const {
  if (!isPresent(*this, Kind::kData, key)) return std::nullopt;
  return dataValue();
}

std::optional<ArrayView> Value::asArray(std::string_view key) const {
  if (!isPresent(*this, Kind::kArray, key)) return std::nullopt;
  return ArrayView(*this);
}

std::optional<DictionaryView> Value::asDictionary(std::string_view key) const {
  if (!isPresent(*this, Kind::kDictionary, key)) return std::nullopt;
  return DictionaryView(*this);
}

std::string_view Value::stringValue() const {
  require(*this, Kind::kString);
  return ValueAccess::text(*this);
}

Number Value::numberValue() const {
  require(*this, Kind::kNumber);
  return Number(numberType_, payload_.bits);
}

Date Value::dateValue() const {
  require(*this, Kind::kDate);
  return Date{std::bit_cast<double>(payload_.bits)};
}

std::span<const std::uint8_t> Value::dataValue() const {
  require(*this, Kind::kData);
  return {static_cast<const std::uint8_t*>(payload_.pointer), size_};
}

std::uint32_t Value::uidValue() const {
  require(*this, Kind::kUid);
  return static_cast<std::uint32_t>(payload_.bits);
}

ArrayView Value::arrayValue() const {
  require(*this, Kind::kArray);
  return ArrayView(*this);
}

DictionaryView Value::dictionaryValue() const {
  require(*this, Kind::kDictionary);
  return DictionaryView(*this);
}

Value Value::operator[](std::string_view key) const {
  if (kind_ != Kind::kDictionary) return Value();
  if (const PropertyListDocument* document = documentOf(*this)) {
    const std::size_t position = document->positionOf(*this, key);
    if (position == PropertyListDocument::kNone) return Value();
    return document->valueAt(document->reference(ValueAccess::place(*this), size_ + position));
  }
  const Value* found = ValueAccess::content(*this).find(key);
  return found == nullptr ? Value() : *found;
}

std::size_t ArrayView::size() const { return ValueAccess::size(value_); }

OptionalString ArrayView::stringAt(std::size_t index, std::string_view key) const {
  if (index >= ValueAccess::size(value_)) throw InternalInconsistency("array index out of bounds");
  const PropertyListDocument* document = documentOf(value_);
  if (document == nullptr) return ValueAccess::elements(value_)[index].asString(key);
  if (index + kNear < ValueAccess::size(value_)) {
    document->prefetchNode(document->reference(ValueAccess::place(value_), index + kNear));
  }
  const DocumentNode& node = document->node(document->reference(ValueAccess::place(value_), index));
  if (node.kind != Kind::kString) {
    throw TypeError(key, kindName(Kind::kString), kindName(node.kind));
  }
  return document->text(node);
}

void ArrayView::prefetchBehind(std::size_t index) const {
  const PropertyListDocument* document = documentOf(value_);
  if (document == nullptr || index + 2 * kNear >= ValueAccess::size(value_)) return;
  const std::uint32_t place = ValueAccess::place(value_);
  document->prefetchNode(document->reference(place, index + 2 * kNear));
  document->prefetchContent(document->reference(place, index + kNear));
}

Value ArrayView::operator[](std::size_t index) const {
  if (index >= ValueAccess::size(value_)) throw InternalInconsistency("array index out of bounds");
  if (const PropertyListDocument* document = documentOf(value_)) {
    return document->valueAt(document->reference(ValueAccess::place(value_), index));
  }
  return ValueAccess::elements(value_)[index];
}

}  // namespace kx
