#include "platform/foundation/XmlPropertyListReader.h"

#include <algorithm>
#include <cstring>

#include "platform/foundation/PropertyListWriters.h"
#include "platform/foundation/Utf8.h"

namespace kx {
namespace {

constexpr std::size_t kSmallestElement = 6;  // "<key/>"

bool isUtf16Mark(const std::uint8_t* bytes, std::size_t length) {
  return length >= 2 &&
         ((bytes[0] == 0xFE && bytes[1] == 0xFF) || (bytes[0] == 0xFF && bytes[1] == 0xFE));
}

std::size_t utf8MarkLength(const std::uint8_t* bytes, std::size_t length) {
  return length >= 3 && std::memcmp(bytes, "\xEF\xBB\xBF", 3) == 0 ? 3 : 0;
}

[[noreturn]] void failEncoding(const char* what, std::size_t offset) {
  throw PropertyListFailure(PropertyListError::kTextEncoding, what, offset);
}

// UTF-16 with a byte order mark as UTF-8 without one.
std::vector<std::uint8_t> utf8FromUtf16(const std::uint8_t* bytes, std::size_t length) {
  const bool isBig = bytes[0] == 0xFE;
  const auto unitAt = [&](std::size_t at) {
    const unsigned first = bytes[at];
    const unsigned second = bytes[at + 1];
    return isBig ? first << 8 | second : second << 8 | first;
  };
  if (length % 2 != 0) failEncoding("UTF-16 text with an odd number of bytes", length - 1);
  std::size_t size = 0;
  char out[4];
  std::vector<std::uint8_t> result;
  // Two rounds, measuring and writing: the result takes no more memory than it needs.
  for (const bool writes : {false, true}) {
    if (writes) result.resize(size);
    size = 0;
    for (std::size_t at = 2; at < length; at += 2) {
      std::uint32_t point = unitAt(at);
      if (point >= 0xD800 && point <= 0xDFFF) {
        const unsigned low = at + 2 < length ? unitAt(at + 2) : 0;
        if (point >= 0xDC00 || low < 0xDC00 || low > 0xDFFF) {
          failEncoding("a surrogate stands alone", at);
        }
        point = 0x10000 + ((point - 0xD800) << 10) + (low - 0xDC00);
        at += 2;
      }
      const std::size_t count = encodeUtf8(point, out);
      if (writes) std::memcpy(result.data() + size, out, count);
      size += count;
    }
  }
  return result;
}

}  // namespace

bool XmlPropertyListReader::isXml(const std::uint8_t* bytes, std::size_t length) {
  if (isUtf16Mark(bytes, length)) return true;
  std::size_t at = utf8MarkLength(bytes, length);
  while (at < length && (bytes[at] == ' ' || (bytes[at] >= '\t' && bytes[at] <= '\r'))) ++at;
  return at < length && bytes[at] == '<';
}

XmlPropertyListReader::XmlPropertyListReader(DataPtr bytes, const PropertyListLimits& limits)
    : limits_(limits), bytes_(std::move(bytes)), scanner_(limits_) {
  shared_.fill(kNoObject);
}

Value XmlPropertyListReader::read() {
  prepare();
  try {
    return readDocument();
  } catch (PropertyListFailure& failure) {
    failure.setPath(path());
    failure.setOffset(offsetInFile(failure.offset()));
    throw;
  }
}

void XmlPropertyListReader::prepare() {
  if (isUtf16Mark(bytes_->bytes(), bytes_->length())) {
    isUtf16_ = true;
    bytes_ = std::make_shared<const Data>(utf8FromUtf16(bytes_->bytes(), bytes_->length()));
  } else {
    textStart_ = utf8MarkLength(bytes_->bytes(), bytes_->length());
  }
  document_ = new PropertyListDocument(bytes_);
  keeper_ = ValueAccess::adopt(Kind::kData, document_, nullptr, 0);
  text_ = std::string_view(reinterpret_cast<const char*>(bytes_->bytes()), bytes_->length())
              .substr(textStart_);
  scanner_.setText(text_);
}

std::uint64_t XmlPropertyListReader::offsetInFile(std::uint64_t offset) const {
  if (!isUtf16_) return offset + textStart_;
  const auto at = static_cast<std::size_t>(offset);
  return 2 + 2 * std::uint64_t{utf16Length(text_.substr(0, std::min(at, text_.size())))};
}

std::string XmlPropertyListReader::path() const {
  std::string result;
  for (std::size_t i = 0; i < stack_.size(); ++i) {
    const Frame& frame = stack_[i];
    const std::size_t end = i + 1 < stack_.size() ? stack_[i + 1].pending : pending_.size();
    if (!frame.isDictionary) {
      appendArrayStep(result, end - frame.pending);
    } else if (frame.hasKey) {
      appendDictionaryStep(result, document_->text(nodes_[pending_[end - 1]]));
    }
  }
  return result;
}

// No file has more elements than "<" or than the smallest element would allow; memory for tables is
// used only as far as elements come.
void XmlPropertyListReader::reserveTables() {
  const auto markup = static_cast<std::uint64_t>(std::count(text_.begin(), text_.end(), '<'));
  const std::uint64_t elements =
      std::min<std::uint64_t>(markup, text_.size() / kSmallestElement) + 1;
  capacity_ = static_cast<std::uint32_t>(std::min(elements, limits_.objects));
  document_->nodes_ = makeLazyArray<DocumentNode>(capacity_);
  document_->references_ = makeLazyArray<std::uint32_t>(static_cast<std::size_t>(elements));
  nodes_ = document_->nodes_.get();
}

Value XmlPropertyListReader::readDocument() {
  scanner_.readDeclaration(isUtf16_ ? "UTF-16" : "UTF-8");
  scanner_.skipMisc(true);
  const XmlScanner::Tag top = scanner_.readTag();
  if (top.name != "plist" || top.kind != XmlScanner::TagKind::kOpen) {
    scanner_.failSyntax("the root element is not <plist>", top.offset);
  }
  reserveTables();
  for (;;) {
    scanner_.skipMisc(false);
    const XmlScanner::Tag tag = scanner_.readTag();
    if (tag.kind == XmlScanner::TagKind::kClose) {
      if (stack_.empty()) {
        if (tag.name != "plist") scanner_.failSyntax("a closing tag that fits none", tag.offset);
        if (root_ == kNoObject) scanner_.failSyntax("<plist> without a value", tag.offset);
        break;
      }
      closeContainer(tag);
    } else {
      readElement(tag);
    }
  }
  scanner_.skipMisc(false);
  scanner_.requireEnd();
  document_->indexLargeDictionaries(largeDictionaries_);
  return document_->valueAt(root_);
}

void XmlPropertyListReader::readElement(const XmlScanner::Tag& tag) {
  if (stack_.empty() && root_ != kNoObject) {
    scanner_.failSyntax("<plist> with a second value", tag.offset);
  }
  const bool isInDictionary = !stack_.empty() && stack_.back().isDictionary;
  if (tag.name == "key") {
    if (!isInDictionary || stack_.back().hasKey) {
      scanner_.failSyntax("a key where a value is expected", tag.offset);
    }
    return readKey(tag);
  }
  if (isInDictionary && !stack_.back().hasKey) {
    scanner_.failSyntax("a value without a key", tag.offset);
  }
  if (tag.name == "dict" || tag.name == "array") return openContainer(tag);
  readScalar(tag);
}

void XmlPropertyListReader::openContainer(const XmlScanner::Tag& tag) {
  if (stack_.size() >= limits_.nestingDepth) {
    scanner_.fail(PropertyListError::kDepth,
                  "nested deeper than " + std::to_string(limits_.nestingDepth) + " levels",
                  tag.offset);
  }
  const bool isDictionary = tag.name == "dict";
  const std::uint32_t object = addNode(isDictionary ? Kind::kDictionary : Kind::kArray);
  if (tag.kind == XmlScanner::TagKind::kEmpty) return place(object);
  stack_.push_back(Frame{object, isDictionary, false, pending_.size(), undo_.size()});
}

void XmlPropertyListReader::closeContainer(const XmlScanner::Tag& tag) {
  const Frame frame = stack_.back();
  if (tag.name != (frame.isDictionary ? "dict" : "array")) {
    scanner_.failSyntax("a closing tag that fits none", tag.offset);
  }
  if (frame.hasKey) scanner_.failSyntax("a key without a value", tag.offset);
  DocumentNode& node = nodes_[frame.object];
  node.low = static_cast<std::uint32_t>(referenceCount_);
  std::uint32_t* references = document_->references_.get() + referenceCount_;
  const std::size_t count = pending_.size() - frame.pending;
  if (frame.isDictionary) {
    closeDictionary(frame);
  } else {
    node.high = static_cast<std::uint32_t>(count);
    std::copy_n(pending_.data() + frame.pending, count, references);
  }
  referenceCount_ += count;
  pending_.resize(frame.pending);
  stack_.pop_back();
  place(frame.object);
}

// Keys first, then values; what the keys replaced for the dictionaries around is put back.
void XmlPropertyListReader::closeDictionary(const Frame& frame) {
  DocumentNode& node = nodes_[frame.object];
  const std::size_t count = (pending_.size() - frame.pending) / 2;
  std::uint32_t* references = document_->references_.get() + referenceCount_;
  for (std::size_t i = 0; i < count; ++i) {
    const std::uint32_t key = pending_[frame.pending + 2 * i];
    references[i] = key;
    references[count + i] = pending_[frame.pending + 2 * i + 1];
    lastDictionaryOfKey_[nodes_[key].extra - 1] = undo_[frame.undo + i];
  }
  undo_.resize(frame.undo);
  node.high = static_cast<std::uint32_t>(count);
  if (count > PropertyListDocument::kScanLimit) largeDictionaries_.push_back(frame.object);
}

void XmlPropertyListReader::readKey(const XmlScanner::Tag& tag) {
  bool isInText = true;
  const std::string_view text = elementText(tag, isInText);
  if (text.size() > limits_.keyUnits && utf16Length(text) > limits_.keyUnits) {
    scanner_.fail(PropertyListError::kLimit,
                  "a key is longer than " + std::to_string(limits_.keyUnits) + " units",
                  tag.offset);
  }
  std::uint32_t number = document_->keyNumber(text);
  if (number == PropertyListDocument::kNoKey) {
    const std::uint32_t object = addString(text, isInText, tag.offset);
    number = document_->internKey(object);
    lastDictionaryOfKey_.push_back(0);
  }
  Frame& frame = stack_.back();
  std::uint32_t& last = lastDictionaryOfKey_[number];
  if (last == frame.object + 1) {
    scanner_.fail(PropertyListError::kDupKey, "the key \"" + std::string(text) + "\" occurs twice",
                  tag.offset);
  }
  undo_.push_back(last);
  last = frame.object + 1;
  pending_.push_back(document_->keys_[number].object);
  frame.hasKey = true;
}

void XmlPropertyListReader::place(std::uint32_t object) {
  if (stack_.empty()) {
    root_ = object;
    return;
  }
  pending_.push_back(object);
  stack_.back().hasKey = false;
}

std::string_view XmlPropertyListReader::elementText(const XmlScanner::Tag& tag, bool& isInText) {
  isInText = true;
  if (tag.kind == XmlScanner::TagKind::kEmpty) return {};
  const std::string_view text = scanner_.readText(scratch_, isInText);
  requireEnd(tag);
  return text;
}

void XmlPropertyListReader::requireEnd(const XmlScanner::Tag& tag) {
  const std::size_t offset = scanner_.offset();
  const XmlScanner::Tag end = scanner_.readTag();
  if (end.kind != XmlScanner::TagKind::kClose || end.name != tag.name) {
    scanner_.failSyntax("<" + std::string(tag.name) + "> is not closed", offset);
  }
}

void XmlPropertyListReader::readScalar(const XmlScanner::Tag& tag) {
  if (tag.name == "data") {
    const bool isEmpty = tag.kind == XmlScanner::TagKind::kEmpty;
    const std::size_t offset = scanner_.offset();
    const std::string_view base64 = isEmpty ? std::string_view() : scanner_.readRaw();
    const std::uint32_t object = addData(base64, offset);
    if (!isEmpty) requireEnd(tag);
    return place(object);
  }
  const bool isTrue = tag.name == "true";
  const bool isKnown = isTrue || tag.name == "false" || tag.name == "string" ||
                       tag.name == "integer" || tag.name == "real" || tag.name == "date";
  if (!isKnown) scanner_.failSyntax("unknown element", tag.offset);
  bool isInText = true;
  const std::size_t offset = scanner_.offset();
  const std::string_view text = elementText(tag, isInText);
  if (tag.name == "string") return place(addString(text, isInText, tag.offset));
  if (tag.name == "integer") return place(addInteger(text, offset));
  if (tag.name == "real") return place(addReal(text, offset));
  if (tag.name == "date") return place(addDate(text, offset));
  if (!text.empty()) scanner_.failSyntax("a boolean with text", offset);
  place(shared(isTrue ? kTrue : kFalse, Kind::kNumber, isTrue ? 1 : 0));
}

}  // namespace kx
