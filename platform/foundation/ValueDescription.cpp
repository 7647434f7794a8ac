#include <vector>

#include "platform/foundation/Value.h"

namespace kx {
namespace {

constexpr std::size_t kMostBytes = std::size_t{1} << 20;
constexpr std::size_t kMostIndent = 64;
constexpr std::size_t kDataBytesShown = 16;

std::string quoted(std::string_view text) {
  std::string result = "\"";
  for (const char c : text) {
    if (c == '"' || c == '\\') result += '\\';
    result += c;
  }
  return result += '"';
}

bool isPlainWord(std::string_view text) {
  if (text.empty()) return false;
  for (const char c : text) {
    const bool plain =
        (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_';
    if (!plain) return false;
  }
  return true;
}

std::string describeData(std::span<const std::uint8_t> bytes) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string result = "<";
  for (std::size_t i = 0; i < bytes.size() && i < kDataBytesShown; ++i) {
    result += kDigits[bytes[i] >> 4];
    result += kDigits[bytes[i] & 15];
  }
  if (bytes.size() > kDataBytesShown) result += "... " + std::to_string(bytes.size()) + " bytes";
  return result += '>';
}

std::string describeScalar(const Value& value) {
  switch (value.kind()) {
    case Kind::kNumber:
      return value.numberValue().description();
    case Kind::kDate:
      return value.dateValue().description();
    case Kind::kString:
      return quoted(value.stringValue());
    case Kind::kData:
      return describeData(value.dataValue());
    case Kind::kUid:
      return "UID(" + std::to_string(value.uidValue()) + ")";
    default:
      return "(null)";
  }
}

// Writes with a stack of its own; stops with "..." when the text has grown too long for any log.
class Writer {
 public:
  std::string run(const Value& root) {
    open(root);
    while (!stack_.empty() && text_.size() < kMostBytes) step();
    if (!stack_.empty()) text_ += "...";
    return std::move(text_);
  }

 private:
  struct Level {
    Value container;
    std::size_t count;
    std::size_t next = 0;
  };

  void open(const Value& value) {
    if (!value.isArray() && !value.isDictionary()) {
      text_ += describeScalar(value);
      return;
    }
    const std::size_t count =
        value.isArray() ? value.arrayValue().size() : value.dictionaryValue().size();
    text_ += value.isArray() ? "(\n" : "{\n";
    stack_.push_back(Level{value, count});
  }
  void step() {
    Level& level = stack_.back();
    const bool isArray = level.container.isArray();
    if (level.next > 0) text_ += isArray ? (level.next < level.count ? ",\n" : "\n") : ";\n";
    if (level.next == level.count) {
      stack_.pop_back();
      indent();
      text_ += isArray ? ')' : '}';
      return;
    }
    indent();
    const std::size_t index = level.next++;
    if (isArray) {
      open(level.container.arrayValue()[index]);
      return;
    }
    const DictionaryView view = level.container.dictionaryValue();
    const std::string_view key = view.keyAt(index);
    text_ += isPlainWord(key) ? std::string(key) : quoted(key);
    text_ += " = ";
    open(view.valueAt(index));
  }
  void indent() { text_.append(4 * std::min(stack_.size(), kMostIndent), ' '); }

  std::string text_;
  std::vector<Level> stack_;
};

}  // namespace

std::string Value::description() const {
  if (kind_ == Kind::kString) return std::string(stringValue());
  if (kind_ != Kind::kArray && kind_ != Kind::kDictionary) return describeScalar(*this);
  return Writer().run(*this);
}

}  // namespace kx
