#pragma once

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string_view>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Hash.h"
#include "platform/foundation/ValueStorage.h"

// The storage of everything read from one file: its bytes and a table with one node per object.
// Internal to platform/foundation.
namespace kx {

// One object of a document. A scalar keeps its 64 bits in low and high; text and data keep a place
// and a length in bytes; a container keeps where its references start and its number of entries.
struct DocumentNode {
  // Where text or data stands: in the file's bytes at `low`, or in the arena.
  enum Place : std::uint8_t { kInFile, kInArena };

  std::uint32_t low;
  std::uint32_t high;
  // String: its number among the document's keys plus 1, 0 when it is no key. Container while it is
  // read: visits below it, itself included. Large dictionary afterwards: the number of its index.
  std::uint32_t extra;
  Kind kind;
  std::uint8_t detail;  // Number::Type, or Place

  std::uint64_t bits() const { return static_cast<std::uint64_t>(high) << 32 | low; }
  void setBits(std::uint64_t bits) {
    low = static_cast<std::uint32_t>(bits);
    high = static_cast<std::uint32_t>(bits >> 32);
  }
};
static_assert(sizeof(DocumentNode) == 16);

struct FreeMemory {
  void operator()(void* memory) const { std::free(memory); }
};
// Zeroed memory that costs nothing until it is touched.
template <typename T>
using LazyArray = std::unique_ptr<T[], FreeMemory>;
template <typename T>
LazyArray<T> makeLazyArray(std::size_t count) {
  void* memory = std::calloc(count == 0 ? 1 : count, sizeof(T));
  if (memory == nullptr) throw std::bad_alloc();
  return LazyArray<T>(static_cast<T*>(memory));
}
// Memory whose content is nothing yet.
template <typename T>
LazyArray<T> makeRawArray(std::size_t count) {
  void* memory = std::malloc((count == 0 ? 1 : count) * sizeof(T));
  if (memory == nullptr) throw std::bad_alloc();
  return LazyArray<T>(static_cast<T*>(memory));
}

// Converted text and decoded data. Places are 32 bits: number of the block and offset inside it.
class DocumentArena {
 public:
  static constexpr std::size_t kBlockBytes = std::size_t{1} << 21;

  // Room for `most` bytes; `firstBlock` caps the first block. Null when the arena is full.
  char* begin(std::size_t most, std::size_t firstBlock);
  // Keeps `used` bytes of what begin() gave and returns their place.
  std::uint32_t commit(std::size_t used);
  const char* at(std::uint32_t place) const {
    return blocks_[place >> kShift].get() + (place & (kBlockBytes - 1));
  }

 private:
  static constexpr unsigned kShift = 21;
  std::vector<std::unique_ptr<char[]>> blocks_;
  std::size_t capacity_ = 0;  // of the last block
  std::size_t used_ = 0;
};

class PropertyListDocument final : public ValueStorage {
 public:
  explicit PropertyListDocument(DataPtr bytes);
  ~PropertyListDocument();

  Value valueAt(std::uint32_t object) const;
  std::uint32_t count() const { return count_; }
  const DocumentNode& node(std::uint32_t object) const { return nodes_[object]; }
  // Fetches an object's node into the processor's cache; and of an object whose node is there, its
  // content.
  void prefetchNode(std::uint32_t object) const { __builtin_prefetch(&nodes_[object]); }
  void prefetchContent(std::uint32_t object) const {
    const DocumentNode& node = nodes_[object];
    if (referenceSize_ == 0 || node.kind != Kind::kDictionary) return;
    __builtin_prefetch(base_ + node.low);
    __builtin_prefetch(base_ + node.low + 64);
  }
  std::string_view text(const DocumentNode& node) const {
    const char* from = node.detail == DocumentNode::kInFile
                           ? reinterpret_cast<const char*>(base_) + node.low
                           : arena_.at(node.low);
    return {from, node.high};
  }
  // The position-th reference of the container whose references start at `place`; of a dictionary,
  // keys come first, then values.
  std::uint32_t reference(std::uint32_t place, std::size_t position) const {
    if (referenceSize_ == 0) return references_[place + position];
    return static_cast<std::uint32_t>(
        loadBigShifted(base_ + place + position * referenceSize_, referenceShift_));
  }
  // The first `count` references of a container as they are stored. Within one document equal bytes
  // are equal references.
  std::string_view referenceBytes(std::uint32_t place, std::size_t count) const {
    if (referenceSize_ == 0) {
      return {reinterpret_cast<const char*>(&references_[place]), count * sizeof(std::uint32_t)};
    }
    return {reinterpret_cast<const char*>(base_) + place, count * referenceSize_};
  }
  // Position of a key in a dictionary of this document, or kNone. Found at once at `expected`.
  std::size_t positionOf(const Value& dictionary, std::string_view key,
                         std::uint32_t expected = 0) const;
  static constexpr std::size_t kNone = static_cast<std::size_t>(-1);
  // Dictionaries up to this size are scanned, larger ones get an index; in the smallest the texts
  // are compared, in the others the keys' numbers.
  static constexpr std::size_t kScanLimit = 24;
  static constexpr std::size_t kTextScanLimit = 8;

  // Reads a big-endian integer of 1 to 8 bytes; 8 bytes from `from` on must be readable.
  static std::uint64_t loadBig(const std::uint8_t* from, unsigned size) {
    return loadBigShifted(from, shiftOf(size));
  }
  // The same for loops: with the shift for that size.
  static unsigned shiftOf(unsigned size) { return 64 - 8 * size; }
  static std::uint64_t loadBigShifted(const std::uint8_t* from, unsigned shift) {
    std::uint64_t raw;
    std::memcpy(&raw, from, sizeof(raw));
    return __builtin_bswap64(raw) >> shift;
  }

 private:
  friend class BinaryPropertyListReader;
  friend class XmlPropertyListReader;

  // Position plus 1 by key number, open addressing.
  struct LargeIndex {
    std::vector<std::uint32_t> slots;
  };

  bool isText(std::uint32_t object, std::string_view text) const {
    const DocumentNode& node = nodes_[object];
    return node.high == text.size() && this->text(node) == text;
  }

  // The number of the key with this text, or kNoKey.
  static constexpr std::uint32_t kNoKey = 0xFFFFFFFF;
  std::uint32_t keyNumber(std::string_view text) const;
  // Gives the string object a key number; equal texts have one number.
  std::uint32_t internKey(std::uint32_t object);
  void growKeyTable();
  // Called once, after the last change.
  void indexLargeDictionaries(const std::vector<std::uint32_t>& objects);
  const LargeIndex& largeIndex(const Value& dictionary) const;

  DataPtr data_;
  const std::uint8_t* base_;
  std::size_t length_;
  LazyArray<DocumentNode> nodes_;
  std::uint32_t count_ = 0;
  unsigned referenceSize_ = 0;  // bytes of a reference in the file; 0: references_ holds them
  unsigned referenceShift_ = 0;
  LazyArray<std::uint32_t> references_;
  DocumentArena arena_;

  struct Key {
    std::uint32_t hash;  // its low bits
    std::uint32_t object;
  };
  const HashSeed seed_;
  std::vector<Key> keys_;
  std::vector<std::uint32_t> keySlots_;  // key number plus 1, 0 is free

  std::unique_ptr<std::atomic<const LargeIndex*>[]> largeIndexes_;
  std::size_t largeCount_ = 0;
};

}  // namespace kx
