#include "platform/foundation/BinaryPropertyListReader.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstring>

#include "platform/foundation/Text.h"
#include "platform/foundation/Utf8.h"

namespace kx {
namespace {

constexpr std::size_t kHeaderBytes = 8;
constexpr std::size_t kTrailerBytes = 32;
constexpr char kMagic[] = "bplist00";
constexpr std::size_t kMagicWordBytes = 6;

}  // namespace

bool BinaryPropertyListReader::isBinary(const std::uint8_t* bytes, std::size_t length) {
  return length >= kMagicWordBytes && std::memcmp(bytes, kMagic, kMagicWordBytes) == 0;
}

BinaryPropertyListReader::BinaryPropertyListReader(DataPtr bytes, const PropertyListLimits& limits)
    : limits_(limits), document_(new PropertyListDocument(std::move(bytes))) {
  keeper_ = ValueAccess::adopt(Kind::kData, document_, nullptr, 0);
  base_ = document_->base_;
  length_ = document_->length_;
}

void BinaryPropertyListReader::fail(PropertyListError code, std::string what,
                                    std::uint64_t offset) const {
  throw PropertyListFailure(code, std::move(what), offset, path());
}

// The keys and indexes that lead from the root to the value at which the walk stands.
std::string BinaryPropertyListReader::path() const {
  std::string result;
  for (const Frame& frame : stack_) {
    if (frame.next == 0) continue;
    const std::uint32_t position = frame.next - 1;
    if (nodes_[frame.object].kind == Kind::kArray) {
      result += '[' + std::to_string(position) + ']';
      continue;
    }
    const DocumentNode& key = nodes_[document_->reference(nodes_[frame.object], position)];
    if (!result.empty()) result += '.';
    result += escapeControlCharacters(document_->text(key));
  }
  return result;
}

Value BinaryPropertyListReader::read() {
  readTrailer();
  document_->count_ = count_;
  document_->referenceSize_ = referenceSize_;
  document_->nodes_ = makeLazyArray<DocumentNode>(count_);
  nodes_ = document_->nodes_.get();
  walk(root_);
  readUnreferenced();
  document_->indexLargeDictionaries(largeDictionaries_);
  return document_->valueAt(root_);
}

void BinaryPropertyListReader::readTrailer() {
  if (length_ < kHeaderBytes + kTrailerBytes) {
    fail(PropertyListError::kMagic, "the file has " + std::to_string(length_) + " bytes", 0);
  }
  if (std::memcmp(base_, kMagic, kHeaderBytes) != 0) {
    fail(PropertyListError::kMagic, "unknown version", kMagicWordBytes);
  }
  const std::size_t trailer = length_ - kTrailerBytes;
  offsetSize_ = base_[trailer + 6];
  referenceSize_ = base_[trailer + 7];
  if (offsetSize_ < 1 || offsetSize_ > 8) {
    fail(PropertyListError::kTrailer, "offset size " + std::to_string(offsetSize_), trailer + 6);
  }
  if (referenceSize_ < 1 || referenceSize_ > 8) {
    fail(PropertyListError::kTrailer, "reference size " + std::to_string(referenceSize_),
         trailer + 7);
  }
  const auto field = [&](std::size_t at) {
    return PropertyListDocument::loadBig(base_ + trailer + at, 8);
  };
  const std::uint64_t count = field(8);
  const std::uint64_t root = field(16);
  const std::uint64_t table = field(24);
  std::uint64_t tableBytes = 0;
  std::uint64_t tableEnd = 0;
  if (count == 0 || count > length_) {
    fail(PropertyListError::kTable, "object count " + std::to_string(count), trailer + 8);
  }
  if (root >= count) {
    fail(PropertyListError::kTable, "root object " + std::to_string(root), trailer + 16);
  }
  if (table <= kHeaderBytes || table > trailer ||
      __builtin_mul_overflow(count, std::uint64_t{offsetSize_}, &tableBytes) ||
      __builtin_add_overflow(table, tableBytes, &tableEnd) || tableEnd > trailer) {
    fail(PropertyListError::kTable, "offset table at " + std::to_string(table), trailer + 24);
  }
  if (count > limits_.objects) {
    fail(PropertyListError::kLimit, "more than " + std::to_string(limits_.objects) + " objects",
         trailer + 8);
  }
  if (count * sizeof(DocumentNode) >
      limits_.decodeBaseBytes + limits::kDecodeBytesPerFileByte * length_) {
    fail(PropertyListError::kLimit, "too many objects for the memory of a decoding", trailer + 8);
  }
  count_ = static_cast<std::uint32_t>(count);
  root_ = static_cast<std::uint32_t>(root);
  tableStart_ = static_cast<std::size_t>(table);
}

// At least the trailer follows each table entry, so that 8 bytes can always be loaded.
std::uint64_t BinaryPropertyListReader::offsetOf(std::uint32_t object) const {
  return PropertyListDocument::loadBig(base_ + tableStart_ + std::size_t{object} * offsetSize_,
                                       offsetSize_);
}

std::uint32_t BinaryPropertyListReader::referenceAt(const std::uint8_t* place) const {
  const std::uint64_t object = PropertyListDocument::loadBig(place, referenceSize_);
  if (object >= count_) {
    fail(PropertyListError::kRef,
         "reference to object " + std::to_string(object) + " of " + std::to_string(count_),
         static_cast<std::uint64_t>(place - base_));
  }
  return static_cast<std::uint32_t>(object);
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
    fail(PropertyListError::kDepth,
         "nested deeper than " + std::to_string(limits_.nestingDepth) + " levels",
         offsetOf(object));
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
  if (node.high > PropertyListDocument::kScanLimit) largeDictionaries_.push_back(frame.object);
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
    fail(PropertyListError::kDepth,
         "nested deeper than " + std::to_string(limits_.nestingDepth) + " levels", offset);
  }
  frame.height = std::max(frame.height, node.height);
  frame.visits += node.extra;
  if (frame.visits > limits_.visits) {
    fail(PropertyListError::kExpansion,
         "more than " + std::to_string(limits_.visits) + " values when shared ones are counted",
         offset);
  }
}

void BinaryPropertyListReader::leave() {
  const Frame frame = stack_.back();
  if (frame.visits > limits_.visits) {
    fail(PropertyListError::kExpansion,
         "more than " + std::to_string(limits_.visits) + " values when shared ones are counted",
         offsetOf(frame.object));
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
    fail(PropertyListError::kExpansion,
         "more than " + std::to_string(limits_.visits) + " values when shared ones are counted",
         offsetOf(frame.object));
  }
}

// Nothing reaches these objects, but the file is checked whole.
void BinaryPropertyListReader::readUnreferenced() {
  if (readCount_ == count_) return;
  for (std::uint32_t object = 0; object < count_; ++object) {
    DocumentNode& node = nodes_[object];
    if (node.kind != Kind::kNull) continue;
    readObject(object);
    const bool isDictionary = node.kind == Kind::kDictionary;
    if (!isDictionary && node.kind != Kind::kArray) continue;
    const std::size_t references = std::size_t{node.high} * (isDictionary ? 2 : 1);
    for (std::size_t i = 0; i < references; ++i) {
      referenceAt(base_ + node.low + i * referenceSize_);
    }
  }
}

}  // namespace kx
