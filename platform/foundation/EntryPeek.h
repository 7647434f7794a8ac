#pragma once

#include <cstddef>
#include <optional>
#include <string_view>

#include "platform/foundation/PropertyListDocument.h"
#include "platform/foundation/Value.h"
#include "platform/foundation/ValueStorage.h"

namespace kx {

// A look at the entries of a dictionary or array that was read from a file, where they stand: no
// value is made and nothing is counted, so what is seen lives as long as the container's value
// does. For loops over very many records; Value and its views say the same of any value. Any
// thread.
class EntryPeek {
 public:
  // Whether entries of the value can be looked at: a dictionary or array read from a file.
  static bool can(const Value& container) {
    return ValueAccess::inDocument(container) && (container.isDictionary() || container.isArray());
  }
  // The same of a value that is a dictionary, an array or null.
  static bool canContainer(const Value& container) { return ValueAccess::inDocument(container); }

  // Names the file that a container was read from, as long as the container's value lives.
  static const void* document(const Value& container) { return documentOf(container); }

  // Entries of a dictionary, elements of an array.
  static std::size_t count(const Value& container) { return ValueAccess::size(container); }

  // The value of the position-th entry of a dictionary.
  static EntryPeek valueOf(const Value& dictionary, std::size_t position) {
    const PropertyListDocument* document = documentOf(dictionary);
    const std::size_t count = ValueAccess::size(dictionary);
    return EntryPeek(*document,
                     document->reference(ValueAccess::place(dictionary), count + position));
  }
  // The value under a key of a dictionary, which is found fastest at the expected position.
  static std::optional<EntryPeek> find(const Value& dictionary, std::string_view key,
                                       std::uint32_t expected) {
    const std::size_t position = documentOf(dictionary)->positionOf(dictionary, key, expected);
    if (position == PropertyListDocument::kNone) return std::nullopt;
    return valueOf(dictionary, position);
  }
  // The index-th element of an array.
  static EntryPeek elementOf(const Value& array, std::size_t index) {
    const PropertyListDocument* document = documentOf(array);
    return EntryPeek(*document, document->reference(ValueAccess::place(array), index));
  }
  // Bytes that are equal for two dictionaries of one document exactly when they hold the same key
  // objects in the same order.
  static std::string_view keyBytes(const Value& dictionary) {
    return documentOf(dictionary)
        ->referenceBytes(ValueAccess::place(dictionary), ValueAccess::size(dictionary));
  }

  Kind kind() const { return node_.kind; }
  // Of a value of that kind.
  std::string_view text() const { return document_.text(node_); }
  Number number() const {
    return ValueAccess::number(static_cast<Number::Type>(node_.detail), node_.bits());
  }
  // A value of its own, which keeps the file.
  Value value() const { return document_.valueAt(object_); }
  // Elements of an array, entries of a dictionary.
  std::size_t count() const { return node_.high; }

 private:
  static const PropertyListDocument* documentOf(const Value& container) {
    return static_cast<const PropertyListDocument*>(ValueAccess::owner(container));
  }
  EntryPeek(const PropertyListDocument& document, std::uint32_t object)
      : document_(document), node_(document.node(object)), object_(object) {}

  const PropertyListDocument& document_;
  const DocumentNode& node_;
  std::uint32_t object_;
};

}  // namespace kx
