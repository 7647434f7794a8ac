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

void BinaryPropertyListReader::failReference(std::uint64_t object,
                                             const std::uint8_t* place) const {
  fail(PropertyListError::kRef,
       "reference to object " + std::to_string(object) + " of " + std::to_string(count_),
       static_cast<std::uint64_t>(place - base_));
}

void BinaryPropertyListReader::failDepth(std::uint64_t offset) const {
  fail(PropertyListError::kDepth,
       "nested deeper than " + std::to_string(limits_.nestingDepth) + " levels", offset);
}

void BinaryPropertyListReader::failExpansion(std::uint64_t offset) const {
  fail(PropertyListError::kExpansion,
       "more than " + std::to_string(limits_.visits) + " values when shared ones are counted",
       offset);
}

// The keys and indexes that lead from the root to the value at which the walk stands.
std::string BinaryPropertyListReader::path() const {
  std::string result;
  for (std::size_t i = 0; i < depth_; ++i) {
    const Frame& frame = stack_[i];
    if (frame.next == 0) continue;
    const std::uint32_t position = frame.next - 1;
    if (nodes_[frame.object].kind == Kind::kArray) {
      result += '[' + std::to_string(position) + ']';
      continue;
    }
    const std::uint32_t key = document_->reference(nodes_[frame.object].low, position);
    if (!result.empty()) result += '.';
    result += escapeControlCharacters(document_->text(nodes_[key]));
  }
  return result;
}

Value BinaryPropertyListReader::read() {
  readTrailer();
  document_->count_ = count_;
  document_->referenceSize_ = referenceSize_;
  document_->referenceShift_ = referenceShift_;
  // Every node is written before it is read: the walk and readUnreferenced() meet every object.
  document_->nodes_ = makeRawArray<DocumentNode>(count_);
  nodes_ = document_->nodes_.get();
  states_ = makeLazyArray<State>(count_);
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
  offsetShift_ = PropertyListDocument::shiftOf(offsetSize_);
  referenceShift_ = PropertyListDocument::shiftOf(referenceSize_);
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
  unclaimed_ = tableStart_ - kHeaderBytes;
}

// Nothing reaches these objects, but the file is checked whole.
void BinaryPropertyListReader::readUnreferenced() {
  const State* const end = states_.get() + count_;
  for (const State* at = states_.get(); (at = std::find(at, end, kUnread)) != end;) {
    const auto object = static_cast<std::uint32_t>(at - states_.get());
    readObject(object);
    const DocumentNode& node = nodes_[object];
    const bool isDictionary = node.kind == Kind::kDictionary;
    if (!isDictionary && node.kind != Kind::kArray) continue;
    const std::size_t references = std::size_t{node.high} * (isDictionary ? 2 : 1);
    for (std::size_t i = 0; i < references; ++i) {
      referenceAt(base_ + node.low + i * referenceSize_);
    }
  }
}

}  // namespace kx
