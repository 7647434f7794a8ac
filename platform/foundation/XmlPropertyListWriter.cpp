#include <charconv>
#include <cmath>

#include "platform/foundation/Calendar.h"
#include "platform/foundation/PropertyListFailure.h"
#include "platform/foundation/PropertyListWriters.h"
#include "platform/foundation/Utf8.h"

namespace kx {
namespace {

constexpr std::string_view kHead =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
constexpr std::string_view kTail = "</plist>\n";
constexpr std::size_t kBase64LineGroups = 19;

void appendBase64(std::string& out, std::span<const std::uint8_t> bytes) {
  static constexpr char kAlphabet[] =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  for (std::size_t i = 0; i < bytes.size(); i += 3) {
    if (i != 0 && i / 3 % kBase64LineGroups == 0) out += '\n';
    const std::size_t left = bytes.size() - i;
    std::uint32_t group = static_cast<std::uint32_t>(bytes[i]) << 16;
    if (left > 1) group |= static_cast<std::uint32_t>(bytes[i + 1]) << 8;
    if (left > 2) group |= bytes[i + 2];
    out += kAlphabet[group >> 18];
    out += kAlphabet[group >> 12 & 63];
    out += left > 1 ? kAlphabet[group >> 6 & 63] : '=';
    out += left > 2 ? kAlphabet[group & 63] : '=';
  }
}

// Carriage returns are written as references: readers turn bare ones into line feeds.
void appendEscaped(std::string& out, std::string_view text) {
  classifyText(text);
  for (std::size_t at = 0; at < text.size();) {
    const Utf8Unit unit = decodeUtf8(text, at);
    const bool isControl =
        unit.point < 0x20 && unit.point != '\t' && unit.point != '\n' && unit.point != '\r';
    if (isControl || unit.point == 0xFFFE || unit.point == 0xFFFF) {
      throw PropertyListFailure(PropertyListError::kWrite,
                                "a string holds a character that XML does not allow");
    }
    if (unit.point == '<') {
      out += "&lt;";
    } else if (unit.point == '>') {
      out += "&gt;";
    } else if (unit.point == '&') {
      out += "&amp;";
    } else if (unit.point == '\r') {
      out += "&#13;";
    } else {
      out.append(text, at, unit.length);
    }
    at += unit.length;
  }
}

std::string dateText(double secondsSinceReference) {
  requireDate(secondsSinceReference);
  const CivilTime time = civilTimeFromReference(secondsSinceReference).value();
  return padded(time.year, 4) + '-' + padded(time.month, 2) + '-' + padded(time.day, 2) + 'T' +
         padded(time.hour, 2) + ':' + padded(time.minute, 2) + ':' + padded(time.second, 2) + 'Z';
}

// A real that reads back as the same double, whatever width it has in a binary file.
std::string realText(const Number& number) {
  const double value = number.doubleValue();
  if (std::isnan(value)) return "nan";
  if (std::isinf(value)) return value > 0 ? "+infinity" : "-infinity";
  return Number::real(value).description();
}

class XmlWriter {
 public:
  std::string run(const Value& root) {
    out_ = kHead;
    try {
      write(root);
      while (!stack_.empty()) step();
    } catch (PropertyListFailure& failure) {
      failure.setPath(path());
      throw;
    }
    return std::move(out_ += kTail);
  }

 private:
  struct Level {
    Value container;
    std::size_t count;
    std::size_t next = 0;
  };

  void indent() { out_.append(stack_.size(), '\t'); }
  void element(std::string_view name, std::string_view text) {
    out_ += '<';
    out_ += name;
    out_ += '>';
    out_ += text;
    out_ += "</";
    out_ += name;
    out_ += ">\n";
  }
  void write(const Value& value) {
    indent();
    switch (value.kind()) {
      case Kind::kNumber:
        return writeNumber(value.numberValue());
      case Kind::kDate:
        return element("date", dateText(value.dateValue().secondsSinceReference));
      case Kind::kString:
        return writeText("string", value.stringValue());
      case Kind::kData:
        requireDataSize(value.dataValue().size());
        out_ += "<data>";
        appendBase64(out_, value.dataValue());
        out_ += "</data>\n";
        return;
      case Kind::kUid:
        throw PropertyListFailure(PropertyListError::kWrite, "a UID has no form in XML");
      case Kind::kNull:
        failNull();
      default:
        return open(value);
    }
  }
  void writeText(std::string_view name, std::string_view text) {
    out_ += '<';
    out_ += name;
    out_ += '>';
    appendEscaped(out_, text);
    out_ += "</";
    out_ += name;
    out_ += ">\n";
  }
  void writeNumber(const Number& number) {
    if (number.type() == Number::Type::kBoolean) {
      out_ += number.boolValue() ? "<true/>\n" : "<false/>\n";
    } else if (number.isReal()) {
      element("real", realText(number));
    } else {
      element("integer", number.description());
    }
  }
  void open(const Value& value) {
    if (stack_.size() >= limits::kNestingDepth) failDepth();
    const bool isArray = value.isArray();
    out_ += isArray ? "<array>\n" : "<dict>\n";
    const std::size_t count = isArray ? value.arrayValue().size() : value.dictionaryValue().size();
    stack_.push_back(Level{value, count});
  }
  void step() {
    Level& level = stack_.back();
    const bool isArray = level.container.isArray();
    if (level.next == level.count) {
      stack_.pop_back();
      indent();
      out_ += isArray ? "</array>\n" : "</dict>\n";
      return;
    }
    const std::size_t index = level.next++;
    requireFileSize(out_.size());
    if (isArray) {
      write(level.container.arrayValue()[index]);
      return;
    }
    const DictionaryView view = level.container.dictionaryValue();
    requireKey(view.keyAt(index));
    indent();
    writeText("key", view.keyAt(index));
    write(view.valueAt(index));
  }
  std::string path() const {
    std::string result;
    for (const Level& level : stack_) {
      if (level.next == 0) continue;
      if (level.container.isArray()) {
        appendArrayStep(result, level.next - 1);
      } else {
        appendDictionaryStep(result, level.container.dictionaryValue().keyAt(level.next - 1));
      }
    }
    return result;
  }

  std::string out_;
  std::vector<Level> stack_;
};

}  // namespace

std::vector<std::uint8_t> writeXmlPropertyList(const Value& root) {
  const std::string text = XmlWriter().run(root);
  return std::vector<std::uint8_t>(text.begin(), text.end());
}

}  // namespace kx
