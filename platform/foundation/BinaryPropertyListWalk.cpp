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

// Where the first byte stands that is NUL or not ASCII, or the length. 8 bytes are tested at once;
// at least 8 bytes must be readable behind the text.
std::size_t asciiPrefix(const std::uint8_t* text, std::size_t length) {
  constexpr std::uint64_t kOnes = 0x0101010101010101U;
  constexpr std::uint64_t kHigh = 0x8080808080808080U;
  const auto isBad = [](std::uint64_t word) { return (((word - kOnes) | word) & kHigh) != 0; };
  std::size_t at = 0;
  std::uint64_t word = 0;
  for (; at + 8 <= length; at += 8) {
    std::memcpy(&word, text + at, 8);
    if (isBad(word)) break;
  }
  if (at + 8 > length) {
    if (at == length) return length;
    std::memcpy(&word, text + at, 8);
    const std::uint64_t mask = (std::uint64_t{1} << (8 * (length - at))) - 1;
    if (!isBad((word & mask) | (kOnes & ~mask))) return length;
  }
  while (at < length && text[at] != 0 && text[at] < 0x80) ++at;
  return at;
}

unsigned loadUnit(const std::uint8_t* from) {
  return static_cast<unsigned>(from[0]) << 8 | from[1];
}

}  // namespace

void BinaryPropertyListReader::claim(std::size_t offset, std::size_t end) {
  claimed_ += end - offset;
  if (claimed_ > tableStart_ - kHeaderBytes) {
    fail(PropertyListError::kOffset, "objects overlap", offset);
  }
}

void BinaryPropertyListReader::requireFixed(std::size_t offset, std::size_t size) {
  if (tableStart_ - offset < 1 + size) {
    fail(PropertyListError::kOffset, "an object runs into the offset table", offset);
  }
  claim(offset, offset + 1 + size);
}

void BinaryPropertyListReader::readObject(std::uint32_t object) {
  const std::uint64_t place = offsetOf(object);
  if (place < kHeaderBytes || place >= tableStart_) {
    fail(PropertyListError::kOffset,
         "object " + std::to_string(object) + " stands at " + std::to_string(place),
         tableStart_ + std::size_t{object} * offsetSize_);
  }
  ++readCount_;
  const auto offset = static_cast<std::size_t>(place);
  DocumentNode& node = nodes_[object];
  const unsigned marker = base_[offset];
  switch (marker >> 4) {
    case 0x4:
      return readData(node, offset, marker);
    case 0x5:
      return readAscii(node, offset, marker);
    case 0x6:
      return readUtf16(node, offset, marker);
    case 0xA:
    case 0xD:
      return readContainer(node, offset, marker);
    default:
      return readScalar(node, offset, marker);
  }
}

void BinaryPropertyListReader::readScalar(DocumentNode& node, std::size_t offset, unsigned marker) {
  switch (marker) {
    case 0x08:
    case 0x09:
      requireFixed(offset, 0);
      node.detail = static_cast<std::uint8_t>(Number::Type::kBoolean);
      node.low = marker & 1;
      node.kind = Kind::kNumber;
      return;
    case 0x22: {
      requireFixed(offset, 4);
      const auto raw =
          static_cast<std::uint32_t>(PropertyListDocument::loadBig(base_ + offset + 1, 4));
      node.detail = static_cast<std::uint8_t>(Number::Type::kReal32);
      node.setBits(ValueAccess::numberBits(Number::real32(std::bit_cast<float>(raw))));
      node.kind = Kind::kNumber;
      return;
    }
    case 0x23:
      requireFixed(offset, 8);
      node.detail = static_cast<std::uint8_t>(Number::Type::kReal64);
      node.setBits(PropertyListDocument::loadBig(base_ + offset + 1, 8));
      node.kind = Kind::kNumber;
      return;
    case 0x33:
      return readDate(node, offset);
    default:
      break;
  }
  if (marker >= 0x10 && marker <= 0x14) return readInteger(node, offset, marker);
  if (marker >> 4 == 0x8) return readUid(node, offset, marker);
  fail(PropertyListError::kMarker, "unknown marker " + hex(marker), offset);
}

void BinaryPropertyListReader::readInteger(DocumentNode& node, std::size_t offset,
                                           unsigned marker) {
  const unsigned size = 1U << (marker & 0xF);
  requireFixed(offset, size);
  node.kind = Kind::kNumber;
  if (size == 16) return readWideInteger(node, offset);
  node.detail = static_cast<std::uint8_t>(Number::Type::kInteger);
  node.setBits(PropertyListDocument::loadBig(base_ + offset + 1, size));
}

// 16 bytes hold what exceeds a signed 64-bit integer; larger values have no type here.
void BinaryPropertyListReader::readWideInteger(DocumentNode& node, std::size_t offset) {
  const std::uint64_t high = PropertyListDocument::loadBig(base_ + offset + 1, 8);
  const std::uint64_t low = PropertyListDocument::loadBig(base_ + offset + 9, 8);
  const bool isNegative = high == ~std::uint64_t{0} && low >> 63 != 0;
  if (high != 0 && !isNegative) {
    fail(PropertyListError::kRange, "an integer exceeds 64 bits", offset);
  }
  const bool isUnsigned = !isNegative && low >> 63 != 0;
  node.detail =
      static_cast<std::uint8_t>(isUnsigned ? Number::Type::kUnsigned : Number::Type::kInteger);
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

// Reads a length and checks it against the bytes left before the table, each unit taking
// `unitBytes`.
BinaryPropertyListReader::Length BinaryPropertyListReader::readLength(std::size_t offset,
                                                                      unsigned marker,
                                                                      unsigned unitBytes) {
  Length length{marker & 0xF, offset + 1};
  if (length.count == 0xF) {
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
  }
  if (length.count > (tableStart_ - length.contentOffset) / unitBytes) {
    fail(PropertyListError::kLength,
         "a length of " + std::to_string(length.count) + " exceeds the bytes left", offset);
  }
  claim(offset, length.contentOffset + static_cast<std::size_t>(length.count) * unitBytes);
  return length;
}

void BinaryPropertyListReader::readData(DocumentNode& node, std::size_t offset, unsigned marker) {
  const Length length = readLength(offset, marker, 1);
  if (length.count > limits_.dataBytes) {
    fail(PropertyListError::kLimit,
         "data is longer than " + std::to_string(limits_.dataBytes) + " bytes", offset);
  }
  node.low = static_cast<std::uint32_t>(length.contentOffset);
  node.high = static_cast<std::uint32_t>(length.count);
  node.detail = DocumentNode::kInFile;
  node.kind = Kind::kData;
}

void BinaryPropertyListReader::readAscii(DocumentNode& node, std::size_t offset, unsigned marker) {
  const Length length = readLength(offset, marker, 1);
  if (length.count > limits_.stringBytes) {
    fail(PropertyListError::kLimit,
         "a string is longer than " + std::to_string(limits_.stringBytes) + " bytes", offset);
  }
  const auto count = static_cast<std::size_t>(length.count);
  const std::size_t good = asciiPrefix(base_ + length.contentOffset, count);
  if (good != count) {
    fail(PropertyListError::kTextEncoding,
         "an ASCII string holds the byte " + hex(base_[length.contentOffset + good]),
         length.contentOffset + good);
  }
  node.low = static_cast<std::uint32_t>(length.contentOffset);
  node.high = static_cast<std::uint32_t>(count);
  node.detail = DocumentNode::kInFile;
  node.kind = Kind::kString;
}

void BinaryPropertyListReader::readUtf16(DocumentNode& node, std::size_t offset, unsigned marker) {
  const Length length = readLength(offset, marker, 2);
  const auto units = static_cast<std::size_t>(length.count);
  const auto tooLong = [&] {
    fail(PropertyListError::kLimit,
         "a string is longer than " + std::to_string(limits_.stringBytes) + " bytes", offset);
  };
  if (units > limits_.stringBytes) tooLong();
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
  if (written > limits_.stringBytes) tooLong();
  node.low = arena.commit(written);
  node.high = static_cast<std::uint32_t>(written);
  node.detail = DocumentNode::kInArena;
  node.kind = Kind::kString;
}

void BinaryPropertyListReader::readContainer(DocumentNode& node, std::size_t offset,
                                             unsigned marker) {
  const bool isDictionary = marker >> 4 == 0xD;
  const Length length = readLength(offset, marker, referenceSize_ * (isDictionary ? 2 : 1));
  node.low = static_cast<std::uint32_t>(length.contentOffset);
  node.high = static_cast<std::uint32_t>(length.count);
  node.kind = isDictionary ? Kind::kDictionary : Kind::kArray;
}

void BinaryPropertyListReader::walk(std::uint32_t root) {
  stack_.reserve(limits_.nestingDepth);
  readObject(root);
  if (nodes_[root].kind != Kind::kArray && nodes_[root].kind != Kind::kDictionary) return;
  enter(root);
  while (!stack_.empty()) {
    Frame& frame = stack_.back();
    if (frame.next == frame.count) {
      leave();
    } else {
      advance(frame);
    }
  }
}

void BinaryPropertyListReader::enter(std::uint32_t object) {
  DocumentNode& node = nodes_[object];
  if (stack_.size() >= limits_.nestingDepth) {
    failDepth(offsetOf(object));
  }
  node.state = DocumentNode::kGrey;
  const bool isDictionary = node.kind == Kind::kDictionary;
  const std::size_t keyBytes = isDictionary ? std::size_t{node.high} * referenceSize_ : 0;
  const std::uint64_t visits = 1 + (isDictionary ? std::uint64_t{node.high} : 0);
  stack_.push_back(Frame{object, 0, node.high, static_cast<std::uint32_t>(visits),
                         base_ + node.low + keyBytes, 0});
  if (isDictionary) checkKeys(stack_.back());
}

void BinaryPropertyListReader::checkKeys(const Frame& frame) {
  const DocumentNode& node = nodes_[frame.object];
  const std::uint8_t* place = base_ + node.low;
  const bool isSmall = node.high <= PropertyListDocument::kScanLimit;
  if (isSmall) {
    const std::uint8_t*& good = goodKeys_[node.high];
    const std::size_t keyBytes = std::size_t{node.high} * referenceSize_;
    if (good != nullptr && std::memcmp(good, place, keyBytes) == 0) return;
  }
  for (std::uint32_t i = 0; i < node.high; ++i, place += referenceSize_) {
    const std::uint32_t object = referenceAt(place);
    DocumentNode& key = nodes_[object];
    if (key.kind == Kind::kNull) readObject(object);
    const auto offset = static_cast<std::uint64_t>(place - base_);
    if (key.kind != Kind::kString) {
      fail(PropertyListError::kKeyType, "a key is a " + std::string(kindName(key.kind)), offset);
    }
    if (key.extra == 0) {
      const std::string_view text = document_->text(key);
      if (text.size() > limits_.keyUnits && utf16Length(text) > limits_.keyUnits) {
        fail(PropertyListError::kLimit,
             "a key is longer than " + std::to_string(limits_.keyUnits) + " units", offset);
      }
      const std::uint32_t number = document_->internKey(object);
      if (number == lastDictionaryOfKey_.size()) lastDictionaryOfKey_.push_back(0);
    }
    std::uint32_t& last = lastDictionaryOfKey_[key.extra - 1];
    if (last == frame.object + 1) {
      fail(PropertyListError::kDupKey,
           "the key \"" + escapeControlCharacters(document_->text(key)) + "\" occurs twice",
           offset);
    }
    last = frame.object + 1;
  }
  if (isSmall) {
    goodKeys_[node.high] = base_ + node.low;
  } else {
    largeDictionaries_.push_back(frame.object);
  }
}

// Goes over elements up to the next container that has to be entered, or to the end.
void BinaryPropertyListReader::advance(Frame& frame) {
  const std::uint8_t* place = frame.values + std::size_t{frame.next} * referenceSize_;
  while (frame.next < frame.count) {
    ++frame.next;
    const std::uint32_t object = referenceAt(place);
    DocumentNode& node = nodes_[object];
    if (node.kind == Kind::kNull) readObject(object);
    if (node.kind == Kind::kArray || node.kind == Kind::kDictionary) {
      visitContainer(frame, object, place);
      return;
    }
    ++frame.visits;
    place += referenceSize_;
  }
}

void BinaryPropertyListReader::visitContainer(Frame& frame, std::uint32_t object,
                                              const std::uint8_t* place) {
  const DocumentNode& node = nodes_[object];
  if (node.state == DocumentNode::kWhite) {
    enter(object);
    return;
  }
  const auto offset = static_cast<std::uint64_t>(place - base_);
  if (node.state == DocumentNode::kGrey) {
    fail(PropertyListError::kCycle, "object " + std::to_string(object) + " holds itself", offset);
  }
  if (stack_.size() + node.height > limits_.nestingDepth) {
    failDepth(offset);
  }
  frame.height = std::max(frame.height, node.height);
  frame.visits += node.extra;
  if (frame.visits > limits_.visits) {
    failExpansion(offset);
  }
}

void BinaryPropertyListReader::leave() {
  const Frame frame = stack_.back();
  if (frame.visits > limits_.visits) {
    failExpansion(offsetOf(frame.object));
  }
  DocumentNode& node = nodes_[frame.object];
  node.state = DocumentNode::kBlack;
  node.height = static_cast<std::uint8_t>(frame.height + 1);
  node.extra = frame.visits;
  stack_.pop_back();
  if (stack_.empty()) return;
  Frame& parent = stack_.back();
  parent.height = std::max(parent.height, node.height);
  parent.visits += frame.visits;
  if (parent.visits > limits_.visits) {
    failExpansion(offsetOf(frame.object));
  }
}

}  // namespace kx
