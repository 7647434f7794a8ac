#include <algorithm>
#include <cstring>

#include "platform/foundation/Exceptions.h"
#include "platform/foundation/Hash.h"
#include "platform/foundation/PropertyListDocument.h"
#include "platform/foundation/Value.h"
#include "platform/foundation/ValueStorage.h"

namespace kx {
namespace {

void requireIndex(std::size_t index, std::size_t size) {
  if (index >= size) throw InternalInconsistency("dictionary index out of bounds");
}

}  // namespace

std::size_t DictionaryContent::scan(std::string_view key) const {
  for (std::size_t i = 0; i < entries_.size(); ++i) {
    if (ValueAccess::text(entries_[i].key) == key) return i;
  }
  return kNone;
}

std::size_t DictionaryContent::probe(std::string_view key) const {
  const std::size_t mask = slots_.size() - 1;
  std::size_t slot = hashText(key) & mask;
  while (slots_[slot] != 0 && ValueAccess::text(entries_[slots_[slot] - 1].key) != key) {
    slot = (slot + 1) & mask;
  }
  return slot;
}

std::size_t DictionaryContent::indexOf(std::string_view key) const {
  if (slots_.empty()) return scan(key);
  const std::uint32_t found = slots_[probe(key)];
  return found == 0 ? kNone : found - 1;
}

void DictionaryContent::reserve(std::size_t count) {
  entries_.reserve(count);
  if (count > kScanLimit) rebuildIndex(std::max(count, entries_.size()));
}

void DictionaryContent::append(Value key, Value value) {
  entries_.push_back(Entry{std::move(key), std::move(value)});
  if (slots_.empty() && entries_.size() <= kScanLimit) return;
  if (entries_.size() * 2 > slots_.size()) {
    rebuildIndex(entries_.size());
  } else {
    link(entries_.size() - 1);
  }
}

void DictionaryContent::removeAt(std::size_t index) {
  entries_.erase(entries_.begin() + static_cast<std::ptrdiff_t>(index));
  if (!slots_.empty()) rebuildIndex(entries_.size());
}

void DictionaryContent::link(std::size_t index) {
  slots_[probe(ValueAccess::text(entries_[index].key))] = static_cast<std::uint32_t>(index + 1);
}

void DictionaryContent::rebuildIndex(std::size_t count) {
  std::size_t capacity = 32;
  while (capacity < count * 3) capacity *= 2;
  slots_.assign(capacity, 0);
  for (std::size_t i = 0; i < entries_.size(); ++i) link(i);
}

std::size_t DictionaryView::size() const { return ValueAccess::size(value_); }

std::string_view DictionaryView::keyAt(std::size_t index) const {
  requireIndex(index, size());
  if (const PropertyListDocument* document = ValueAccess::document(value_)) {
    return document->text(document->node(document->reference(ValueAccess::place(value_), index)));
  }
  return ValueAccess::text(ValueAccess::content(value_).entries()[index].key);
}

Value DictionaryView::keyValueAt(std::size_t index) const {
  requireIndex(index, size());
  if (const PropertyListDocument* document = ValueAccess::document(value_)) {
    return document->valueAt(document->reference(ValueAccess::place(value_), index));
  }
  return ValueAccess::content(value_).entries()[index].key;
}

Value DictionaryView::valueAt(std::size_t index) const {
  requireIndex(index, size());
  if (const PropertyListDocument* document = ValueAccess::document(value_)) {
    return document->valueAt(document->reference(ValueAccess::place(value_), size() + index));
  }
  return ValueAccess::content(value_).entries()[index].value;
}

Value DictionaryView::find(std::string_view key) const { return value_[key]; }

bool DictionaryView::contains(std::string_view key) const {
  if (const PropertyListDocument* document = ValueAccess::document(value_)) {
    return document->positionOf(value_, key) != PropertyListDocument::kNone;
  }
  return ValueAccess::content(value_).find(key) != nullptr;
}

std::optional<std::uint32_t> DictionaryView::keyObjectIndexAt(std::size_t index) const {
  requireIndex(index, size());
  const PropertyListDocument* document = ValueAccess::document(value_);
  if (document == nullptr) return std::nullopt;
  return document->reference(ValueAccess::place(value_), index);
}

std::size_t DictionaryView::documentObjectCount() const {
  const PropertyListDocument* document = ValueAccess::document(value_);
  return document == nullptr ? 0 : document->count();
}

Dictionary::Dictionary() : content_(std::make_unique<DictionaryContent>()) {}

Dictionary::Dictionary(std::initializer_list<std::pair<std::string_view, Value>> entries)
    : Dictionary() {
  content_->reserve(entries.size());
  for (const auto& [key, value] : entries) set(key, value);
}

Dictionary::Dictionary(const DictionaryView& view) : Dictionary() {
  const std::size_t count = view.size();
  content_->reserve(count);
  for (std::size_t i = 0; i < count; ++i) content_->append(view.keyValueAt(i), view.valueAt(i));
}

Dictionary::Dictionary(const Dictionary& other)
    : content_(other.content_ == nullptr ? std::make_unique<DictionaryContent>()
                                         : std::make_unique<DictionaryContent>(*other.content_)) {}
// The other one stays usable, empty.
Dictionary::Dictionary(Dictionary&& other) noexcept : content_(std::move(other.content_)) {}
Dictionary& Dictionary::operator=(Dictionary other) noexcept {
  content_.swap(other.content_);
  return *this;
}
Dictionary::~Dictionary() = default;

void Dictionary::reserve(std::size_t count) {
  if (content_ == nullptr) content_ = std::make_unique<DictionaryContent>();
  content_->reserve(count);
}

void Dictionary::set(std::string_view key, Value value) {
  if (value.isNull()) {
    throw InternalInconsistency("null stored under \"" + std::string(key) + "\"");
  }
  if (content_ == nullptr) content_ = std::make_unique<DictionaryContent>();
  content_->set(key, std::move(value), [&] { return Value::string(key); });
}

void Dictionary::set(const Value& key, Value value) {
  const std::string_view text = key.stringValue();
  if (value.isNull()) {
    throw InternalInconsistency("null stored under \"" + std::string(text) + "\"");
  }
  if (content_ == nullptr) content_ = std::make_unique<DictionaryContent>();
  content_->set(text, std::move(value), [&] { return key; });
}

void Dictionary::setIfPresent(std::string_view key, Value value) {
  if (!value.isNull()) set(key, std::move(value));
}

void Dictionary::remove(std::string_view key) {
  if (content_ == nullptr) return;
  const std::size_t index = content_->indexOf(key);
  if (index != DictionaryContent::kNone) content_->removeAt(index);
}

Value Dictionary::find(std::string_view key) const {
  const Value* found = content_ == nullptr ? nullptr : content_->find(key);
  return found == nullptr ? Value() : *found;
}

bool Dictionary::contains(std::string_view key) const {
  return content_ != nullptr && content_->indexOf(key) != DictionaryContent::kNone;
}

std::size_t Dictionary::size() const {
  return content_ == nullptr ? 0 : content_->entries().size();
}

std::string_view Dictionary::keyAt(std::size_t index) const {
  requireIndex(index, size());
  return ValueAccess::text(content_->entries()[index].key);
}

const Value& Dictionary::valueAt(std::size_t index) const {
  requireIndex(index, size());
  return content_->entries()[index].value;
}

}  // namespace kx
