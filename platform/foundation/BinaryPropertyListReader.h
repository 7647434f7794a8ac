#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "platform/foundation/PropertyList.h"
#include "platform/foundation/PropertyListDocument.h"
#include "platform/foundation/PropertyListFailure.h"

namespace kx {

// Reads a binary property list into a document, in one walk from the root: an object is read when
// the first reference to it is met, so errors come in document order. Objects that nothing refers
// to are read at the end. Time is linear in the file: each object is read once, and objects that
// overlap are refused. Internal to platform/foundation; throws PropertyListFailure.
class BinaryPropertyListReader {
 public:
  BinaryPropertyListReader(DataPtr bytes, const PropertyListLimits& limits);
  Value read();

  static bool isBinary(const std::uint8_t* bytes, std::size_t length);

 private:
  // How far an object has been read; a container that has been walked has kWalked plus the nesting
  // at and below it.
  enum State : std::uint8_t { kUnread, kRead, kOpen, kWalked };

  // A container that is being walked.
  struct Frame {
    std::uint32_t object;
    std::uint32_t next;
    std::uint32_t count;
    std::uint32_t visits;
    const std::uint8_t* values;  // the references to its elements
    std::uint8_t height;         // of the highest element so far
  };
  struct Length {
    std::uint64_t count;
    std::size_t contentOffset;
  };

  [[noreturn]] void fail(PropertyListError code, std::string what, std::uint64_t offset) const;
  [[noreturn]] void failReference(std::uint64_t object, const std::uint8_t* place) const;
  [[noreturn]] void failDepth(std::uint64_t offset) const;
  [[noreturn]] void failExpansion(std::uint64_t offset) const;
  std::string path() const;

  void readTrailer();
  // At least the trailer follows each table entry, so that 8 bytes can always be loaded.
  std::uint64_t offsetOf(std::uint32_t object) const {
    return PropertyListDocument::loadBigShifted(
        base_ + tableStart_ + std::size_t{object} * offsetSize_, offsetShift_);
  }
  // Reads the object's own bytes into its node. The second stands in line in the loop that it is
  // for.
  void readObject(std::uint32_t object);
  void readObjectInLine(std::uint32_t object);
  void readContainer(DocumentNode& node, std::size_t offset, unsigned marker);
  void readAscii(DocumentNode& node, std::size_t offset, unsigned marker);
  void readRare(DocumentNode& node, std::size_t offset, unsigned marker);
  void readInteger(DocumentNode& node, std::size_t offset, unsigned marker);
  void readDate(DocumentNode& node, std::size_t offset);
  void readUid(DocumentNode& node, std::size_t offset, unsigned marker);
  void readData(DocumentNode& node, std::size_t offset, unsigned marker);
  void readUtf16(DocumentNode& node, std::size_t offset, unsigned marker);
  [[noreturn]] void failOverlap(std::size_t offset) const;
  [[noreturn]] void failEnd(std::size_t offset) const;
  [[noreturn]] void failLength(std::uint64_t count, std::size_t offset) const;
  [[noreturn]] void failPlace(std::uint32_t object, std::uint64_t place) const;
  [[noreturn]] void failAscii(std::size_t offset, std::size_t length) const;
  [[noreturn]] void failStringLength(std::size_t offset) const;
  Length readLength(std::size_t offset, unsigned marker, unsigned unitBytes);
  Length readLongLength(std::size_t offset) const;
  // Counts the bytes of an object: together they never exceed the bytes that hold objects.
  void claim(std::size_t offset, std::size_t bytes);
  void requireFixed(std::size_t offset, std::size_t size);

  std::uint32_t referenceAt(const std::uint8_t* place) const {
    const std::uint64_t object = PropertyListDocument::loadBigShifted(place, referenceShift_);
    if (object >= count_) failReference(object, place);
    return static_cast<std::uint32_t>(object);
  }
  void walk(std::uint32_t root);
  void enter(std::uint32_t object);
  void checkKeys(std::uint32_t object);
  // The number of a key's text.
  std::uint32_t readKey(const std::uint8_t* place);
  void advance(Frame& frame);
  void visitAgain(Frame& frame, std::uint32_t object, const std::uint8_t* place);
  void leave();
  void readUnreferenced();

  const PropertyListLimits limits_;
  PropertyListDocument* document_;  // owned by keeper_
  Value keeper_;
  const std::uint8_t* base_;
  std::size_t length_;
  unsigned offsetSize_ = 0;
  unsigned referenceSize_ = 0;
  unsigned offsetShift_ = 0;
  unsigned referenceShift_ = 0;
  std::uint32_t count_ = 0;
  std::uint32_t root_ = 0;
  std::size_t tableStart_ = 0;
  std::size_t unclaimed_ = 0;  // of the bytes that hold objects
  DocumentNode* nodes_ = nullptr;
  LazyArray<State> states_;
  std::array<Frame, limits::kNestingDepth> stack_;  // the first depth_ are in use
  std::size_t depth_ = 0;
  std::vector<std::uint32_t> lastDictionaryOfKey_;  // object plus 1, by key number
  std::vector<std::uint32_t> largeDictionaries_;
  // By number of entries: the keys of the last small dictionary that were found good. Dictionaries
  // of one kind list the same keys one after the other.
  std::array<const std::uint8_t*, PropertyListDocument::kScanLimit + 1> goodKeys_{};
};

}  // namespace kx
