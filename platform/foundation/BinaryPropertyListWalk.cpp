// The hot part of the binary reader: the walk from the root and the reading of objects on its way.
#include <algorithm>
#include <bit>
#include <cmath>
#include <cstring>

#include "platform/foundation/BinaryPropertyListReader.h"
#include "platform/foundation/Calendar.h"
#include "platform/foundation/Text.h"
#include "platform/foundation/Utf8.h"

namespace kx {
namespace {

constexpr std::size_t kHeaderBytes = 8;

std::string hex(unsigned byte) {
  static constexpr char kDigits[] = "0123456789abcdef";
  return {'0', 'x', kDigits[byte >> 4 & 15], kDigits[byte & 15]};
}

constexpr std::uint64_t kOnes = 0x0101010101010101U;

bool isBadAscii(std::uint8_t byte) { return byte == 0 || byte >= 0x80; }

// Whether no byte is NUL or above ASCII. 8 bytes are tested at once; at least 8 bytes must be
// readable behind the text.
[[gnu::always_inline]] inline bool isGoodAscii(const std::uint8_t* text, std::size_t length) {
  constexpr std::uint64_t kHigh = 0x8080808080808080U;
  std::uint64_t bad = 0;
  std::uint64_t word = 0;
  for (; length >= 16; text += 16, length -= 16) {
    std::uint64_t more = 0;
    std::memcpy(&word, text, 8);
    std::memcpy(&more, text + 8, 8);
    bad |= (word - kOnes) | word | (more - kOnes) | more;
  }
  if (length >= 8) {
    std::memcpy(&word, text, 8);
    bad |= (word - kOnes) | word;
    text += 8;
    length -= 8;
  }
  std::memcpy(&word, text, 8);
  const std::uint64_t mask = (std::uint64_t{1} << (8 * length)) - 1;
  word = (word & mask) | (kOnes & ~mask);
  bad |= (word - kOnes) | word;
  return (bad & kHigh) == 0;
}

unsigned loadUnit(const std::uint8_t* from) {
  return static_cast<unsigned>(from[0]) << 8 | from[1];
}

}  // namespace

[[gnu::always_inline]] inline void BinaryPropertyListReader::claim(std::size_t offset,
                                                                   std::size_t bytes) {
  if (bytes > unclaimed_) failOverlap(offset);
  unclaimed_ -= bytes;
}

[[gnu::always_inline]] inline void BinaryPropertyListReader::requireFixed(std::size_t offset,
                                                                          std::size_t size) {
  if (tableStart_ - offset < 1 + size) failEnd(offset);
  claim(offset, 1 + size);
}

void BinaryPropertyListReader::failOverlap(std::size_t offset) const {
  fail(PropertyListError::kOffset, "objects overlap", offset);
}

void BinaryPropertyListReader::failEnd(std::size_t offset) const {
  fail(PropertyListError::kOffset, "an object runs into the offset table", offset);
}

void BinaryPropertyListReader::failLength(std::uint64_t count, std::size_t offset) const {
  fail(PropertyListError::kLength,
       "a length of " + std::to_string(count) + " exceeds the bytes left", offset);
}

void BinaryPropertyListReader::failPlace(std::uint32_t object, std::uint64_t place) const {
  fail(PropertyListError::kOffset,
       "object " + std::to_string(object) + " stands at " + std::to_string(place),
       tableStart_ + std::size_t{object} * offsetSize_);
}

void BinaryPropertyListReader::failStringLength(std::size_t offset) const {
  fail(PropertyListError::kLimit,
       "a string is longer than " + std::to_string(limits_.stringBytes) + " bytes", offset);
}

void BinaryPropertyListReader::failAscii(std::size_t offset, std::size_t length) const {
  const std::uint8_t* const bad = std::find_if(base_ + offset, base_ + offset + length, isBadAscii);
  fail(PropertyListError::kTextEncoding, "an ASCII string holds the byte " + hex(*bad),
       static_cast<std::uint64_t>(bad - base_));
}

// A length that is an integer of its own.
BinaryPropertyListReader::Length BinaryPropertyListReader::readLongLength(
    std::size_t offset) const {
  Length length{0, offset + 1};
  const std::size_t left = tableStart_ - length.contentOffset;
  const unsigned sizeMarker = left == 0 ? 0 : base_[length.contentOffset];
  if (left == 0 || sizeMarker < 0x10 || sizeMarker > 0x13) {
    fail(PropertyListError::kLength, "a length is no integer", length.contentOffset);
  }
  const unsigned size = 1U << (sizeMarker & 0xF);
  if (left < 1 + size) {
    fail(PropertyListError::kLength, "a length is cut", length.contentOffset);
  }
  length.count = PropertyListDocument::loadBig(base_ + length.contentOffset + 1, size);
  if (size == 8 && length.count >> 63 != 0) {
    fail(PropertyListError::kLength, "a length is negative", length.contentOffset);
  }
  length.contentOffset += 1 + size;
  return length;
}

// Reads a length and checks it against the bytes left before the table, each unit taking
// `unitBytes`.
[[gnu::always_inline]] inline BinaryPropertyListReader::Length BinaryPropertyListReader::readLength(
    std::size_t offset, unsigned marker, unsigned unitBytes) {
  Length length{marker & 0xF, offset + 1};
  if (length.count == 0xF) {
    // Most lengths of their own have one byte; what is read here lies before the end of the file.
    length = base_[offset + 1] == 0x10 && offset + 2 < tableStart_
                 ? Length{base_[offset + 2], offset + 3}
                 : readLongLength(offset);
  }
  std::uint64_t bytes = 0;
  if (__builtin_mul_overflow(length.count, std::uint64_t{unitBytes}, &bytes) ||
      bytes > tableStart_ - length.contentOffset) {
    failLength(length.count, offset);
  }
  claim(offset, length.contentOffset + static_cast<std::size_t>(bytes) - offset);
  return length;
}

[[gnu::always_inline]] inline void BinaryPropertyListReader::readAscii(DocumentNode& node,
                                                                       std::size_t offset,
                                                                       unsigned marker) {
  const Length length = readLength(offset, marker, 1);
  if (length.count > limits_.stringBytes) failStringLength(offset);
  const auto count = static_cast<std::size_t>(length.count);
  if (!isGoodAscii(base_ + length.contentOffset, count)) failAscii(length.contentOffset, count);
  node = {static_cast<std::uint32_t>(length.contentOffset), static_cast<std::uint32_t>(count), 0,
          Kind::kString, DocumentNode::kInFile};
}

[[gnu::always_inline]] inline void BinaryPropertyListReader::readContainer(DocumentNode& node,
                                                                           std::size_t offset,
                                                                           unsigned marker) {
  const bool isDictionary = marker >> 4 == 0xD;
  const Length length = readLength(offset, marker, referenceSize_ * (isDictionary ? 2 : 1));
  node = {static_cast<std::uint32_t>(length.contentOffset),
          static_cast<std::uint32_t>(length.count), 0,
          isDictionary ? Kind::kDictionary : Kind::kArray, 0};
}

// What there is most of stands here, the rest elsewhere.
[[gnu::always_inline]] inline void BinaryPropertyListReader::readObjectInLine(
    std::uint32_t object) {
  const std::uint64_t place = offsetOf(object);
  if (place < kHeaderBytes || place >= tableStart_) failPlace(object, place);
  states_[object] = kRead;
  const auto offset = static_cast<std::size_t>(place);
  DocumentNode& node = nodes_[object];
  const unsigned marker = base_[offset];
  if (marker >> 4 == 0x5) {
    readAscii(node, offset, marker);
  } else if (marker == 0x23) {
    requireFixed(offset, 8);
    node = {0, 0, 0, Kind::kNumber, static_cast<std::uint8_t>(Number::Type::kReal64)};
    node.setBits(PropertyListDocument::loadBig(base_ + offset + 1, 8));
  } else if (marker >> 4 == 0xD || marker >> 4 == 0xA) {
    readContainer(node, offset, marker);
  } else {
    readRare(node, offset, marker);
  }
}

void BinaryPropertyListReader::readObject(std::uint32_t object) { readObjectInLine(object); }

void BinaryPropertyListReader::readRare(DocumentNode& node, std::size_t offset, unsigned marker) {
  node = {0, 0, 0, Kind::kNumber, 0};
  switch (marker) {
    case 0x08:
    case 0x09:
      requireFixed(offset, 0);
      node.detail = static_cast<std::uint8_t>(Number::Type::kBoolean);
      node.low = marker & 1;
      return;
    case 0x22: {
      requireFixed(offset, 4);
      const auto raw =
          static_cast<std::uint32_t>(PropertyListDocument::loadBig(base_ + offset + 1, 4));
      node.detail = static_cast<std::uint8_t>(Number::Type::kReal32);
      node.setBits(ValueAccess::numberBits(Number::real32(std::bit_cast<float>(raw))));
      return;
    }
    case 0x33:
      return readDate(node, offset);
    default:
      break;
  }
  if (marker >= 0x10 && marker <= 0x14) return readInteger(node, offset, marker);
  switch (marker >> 4) {
    case 0x4:
      return readData(node, offset, marker);
    case 0x6:
      return readUtf16(node, offset, marker);
    case 0x8:
      return readUid(node, offset, marker);
    default:
      fail(PropertyListError::kMarker, "unknown marker " + hex(marker), offset);
  }
}

// 16 bytes hold what exceeds a signed 64-bit integer; larger values have no type here.
void BinaryPropertyListReader::readInteger(DocumentNode& node, std::size_t offset,
                                           unsigned marker) {
  const unsigned size = 1U << (marker & 0xF);
  requireFixed(offset, size);
  node.detail = static_cast<std::uint8_t>(Number::Type::kInteger);
  if (size < 16) return node.setBits(PropertyListDocument::loadBig(base_ + offset + 1, size));
  const std::uint64_t high = PropertyListDocument::loadBig(base_ + offset + 1, 8);
  const std::uint64_t low = PropertyListDocument::loadBig(base_ + offset + 9, 8);
  const bool isNegative = high == ~std::uint64_t{0} && low >> 63 != 0;
  if (high != 0 && !isNegative) {
    fail(PropertyListError::kRange, "an integer exceeds 64 bits", offset);
  }
  if (!isNegative && low >> 63 != 0) {
    node.detail = static_cast<std::uint8_t>(Number::Type::kUnsigned);
  }
  node.setBits(low);
}

void BinaryPropertyListReader::readDate(DocumentNode& node, std::size_t offset) {
  requireFixed(offset, 8);
  const std::uint64_t bits = PropertyListDocument::loadBig(base_ + offset + 1, 8);
  const auto seconds = std::bit_cast<double>(bits);
  if (!isDateInRange(seconds) || std::fpclassify(seconds) == FP_SUBNORMAL) {
    fail(PropertyListError::kRange, "a date is not in the years 1 to 9999", offset);
  }
  node.setBits(bits);
  node.kind = Kind::kDate;
}

void BinaryPropertyListReader::readUid(DocumentNode& node, std::size_t offset, unsigned marker) {
  const std::size_t size = (marker & 0xF) + 1;
  requireFixed(offset, size);
  std::uint64_t value = 0;
  for (std::size_t i = 1; i <= size; ++i) {
    value = value << 8 | base_[offset + i];
    if (value > 0xFFFFFFFF) fail(PropertyListError::kRange, "a UID exceeds 32 bits", offset);
  }
  node.low = static_cast<std::uint32_t>(value);
  node.kind = Kind::kUid;
}

void BinaryPropertyListReader::readData(DocumentNode& node, std::size_t offset, unsigned marker) {
  const Length length = readLength(offset, marker, 1);
  if (length.count > limits_.dataBytes) {
    fail(PropertyListError::kLimit,
         "data is longer than " + std::to_string(limits_.dataBytes) + " bytes", offset);
  }
  node = {static_cast<std::uint32_t>(length.contentOffset),
          static_cast<std::uint32_t>(length.count), 0, Kind::kData, DocumentNode::kInFile};
}

void BinaryPropertyListReader::readUtf16(DocumentNode& node, std::size_t offset, unsigned marker) {
  const Length length = readLength(offset, marker, 2);
  const auto units = static_cast<std::size_t>(length.count);
  if (units > limits_.stringBytes) failStringLength(offset);
  DocumentArena& arena = document_->arena_;
  char* const out = arena.begin(units * 3, length_ / 2 * 3);
  if (out == nullptr) {
    fail(PropertyListError::kLimit, "too much text for the memory of a decoding", offset);
  }
  std::size_t written = 0;
  const std::uint8_t* const text = base_ + length.contentOffset;
  for (std::size_t i = 0; i < units; ++i) {
    std::uint32_t point = loadUnit(text + 2 * i);
    const std::size_t at = length.contentOffset + 2 * i;
    if (point == 0) fail(PropertyListError::kTextEncoding, "a string holds a NUL", at);
    if (point >= 0xD800 && point <= 0xDFFF) {
      const unsigned low = i + 1 < units ? loadUnit(text + 2 * i + 2) : 0;
      if (point >= 0xDC00 || low < 0xDC00 || low > 0xDFFF) {
        fail(PropertyListError::kTextEncoding, "a surrogate stands alone", at);
      }
      point = 0x10000 + ((point - 0xD800) << 10) + (low - 0xDC00);
      ++i;
    }
    written += encodeUtf8(point, out + written);
  }
  if (written > limits_.stringBytes) failStringLength(offset);
  node = {arena.commit(written), static_cast<std::uint32_t>(written), 0, Kind::kString,
          DocumentNode::kInArena};
}

void BinaryPropertyListReader::walk(std::uint32_t root) {
  readObject(root);
  if (nodes_[root].kind != Kind::kArray && nodes_[root].kind != Kind::kDictionary) return;
  enter(root);
  while (depth_ != 0) {
    Frame& frame = stack_[depth_ - 1];
    if (frame.next == frame.count) {
      leave();
    } else {
      advance(frame);
    }
  }
}

inline void BinaryPropertyListReader::enter(std::uint32_t object) {
  if (depth_ >= limits_.nestingDepth) {
    failDepth(offsetOf(object));
  }
  states_[object] = kOpen;
  const DocumentNode& node = nodes_[object];
  const bool isDictionary = node.kind == Kind::kDictionary;
  const std::uint32_t keys = isDictionary ? node.high : 0;
  stack_[depth_++] = {
      object, 0, node.high, 1 + keys, base_ + node.low + std::size_t{keys} * referenceSize_, 0};
  if (isDictionary) checkKeys(object);
}

inline void BinaryPropertyListReader::checkKeys(std::uint32_t object) {
  const DocumentNode& node = nodes_[object];
  const std::uint8_t* place = base_ + node.low;
  const bool isSmall = node.high <= PropertyListDocument::kScanLimit;
  if (isSmall) {
    const std::uint8_t*& good = goodKeys_[node.high];
    const std::size_t keyBytes = std::size_t{node.high} * referenceSize_;
    if (good != nullptr && std::memcmp(good, place, keyBytes) == 0) return;
  }
  for (std::uint32_t i = 0; i < node.high; ++i, place += referenceSize_) {
    std::uint32_t& last = lastDictionaryOfKey_[readKey(place)];
    if (last == object + 1) {
      const std::string_view text = document_->text(nodes_[referenceAt(place)]);
      fail(PropertyListError::kDupKey,
           "the key \"" + escapeControlCharacters(text) + "\" occurs twice",
           static_cast<std::uint64_t>(place - base_));
    }
    last = object + 1;
  }
  if (isSmall) {
    goodKeys_[node.high] = base_ + node.low;
  } else {
    largeDictionaries_.push_back(object);
  }
}

std::uint32_t BinaryPropertyListReader::readKey(const std::uint8_t* place) {
  const std::uint32_t object = referenceAt(place);
  if (states_[object] == kUnread) readObject(object);
  const DocumentNode& key = nodes_[object];
  const auto offset = static_cast<std::uint64_t>(place - base_);
  if (key.kind != Kind::kString) {
    fail(PropertyListError::kKeyType, "a key is a " + std::string(kindName(key.kind)), offset);
  }
  if (key.extra != 0) return key.extra - 1;
  const std::string_view text = document_->text(key);
  if (text.size() > limits_.keyUnits && utf16Length(text) > limits_.keyUnits) {
    fail(PropertyListError::kLimit,
         "a key is longer than " + std::to_string(limits_.keyUnits) + " units", offset);
  }
  const std::uint32_t number = document_->internKey(object);
  if (number == lastDictionaryOfKey_.size()) lastDictionaryOfKey_.push_back(0);
  return number;
}

// Goes over elements up to the next container that has to be entered, or to the end.
void BinaryPropertyListReader::advance(Frame& frame) {
  const unsigned size = referenceSize_;
  const std::uint32_t count = frame.count;
  const std::uint8_t* place = frame.values + std::size_t{frame.next} * size;
  std::uint32_t scalars = 0;
  for (std::uint32_t next = frame.next; next < count; place += size) {
    frame.next = ++next;  // where path() looks
    const std::uint32_t object = referenceAt(place);
    const State state = states_[object];
    if (state == kUnread) {
      readObjectInLine(object);
      const Kind kind = nodes_[object].kind;
      if (kind == Kind::kArray || kind == Kind::kDictionary) {
        frame.visits += scalars;
        return enter(object);
      }
    } else if (state != kRead) {
      frame.visits += scalars;
      scalars = 0;
      visitAgain(frame, object, place);
      continue;
    }
    ++scalars;
  }
  frame.visits += scalars;
}

// A container that has been entered before.
void BinaryPropertyListReader::visitAgain(Frame& frame, std::uint32_t object,
                                          const std::uint8_t* place) {
  const auto offset = static_cast<std::uint64_t>(place - base_);
  if (states_[object] == kOpen) {
    fail(PropertyListError::kCycle, "object " + std::to_string(object) + " holds itself", offset);
  }
  const auto height = static_cast<std::uint8_t>(states_[object] - kWalked);
  if (depth_ + height > limits_.nestingDepth) {
    failDepth(offset);
  }
  frame.height = std::max(frame.height, height);
  frame.visits += nodes_[object].extra;
  if (frame.visits > limits_.visits) {
    failExpansion(offset);
  }
}

inline void BinaryPropertyListReader::leave() {
  const Frame& frame = stack_[depth_ - 1];
  if (frame.visits > limits_.visits) {
    failExpansion(offsetOf(frame.object));
  }
  const auto height = static_cast<std::uint8_t>(frame.height + 1);
  states_[frame.object] = static_cast<State>(kWalked + height);
  nodes_[frame.object].extra = frame.visits;
  if (--depth_ == 0) return;
  Frame& parent = stack_[depth_ - 1];
  parent.height = std::max(parent.height, height);
  parent.visits += frame.visits;
  if (parent.visits > limits_.visits) {
    failExpansion(offsetOf(frame.object));
  }
}

}  // namespace kx
