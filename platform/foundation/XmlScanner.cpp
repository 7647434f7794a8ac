#include "platform/foundation/XmlScanner.h"

#include <algorithm>

#include "platform/foundation/Utf8.h"

namespace kx {
namespace {

constexpr std::string_view kCommentStart = "<!--";
constexpr std::string_view kCommentEnd = "-->";
constexpr std::string_view kCdataStart = "<![CDATA[";
constexpr std::string_view kCdataEnd = "]]>";
constexpr std::string_view kDocumentTypeStart =
    "<!DOC"
    "TYPE";

bool isSpace(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }

bool isNameCharacter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' ||
         c == '-' || c == '.' || c == ':' || static_cast<unsigned char>(c) >= 0x80;
}

// Printable ASCII without the characters that need a closer look.
bool isPlain(char c) {
  return static_cast<unsigned char>(c) >= 0x20 && static_cast<unsigned char>(c) < 0x80 &&
         c != '<' && c != '&' && c != ']';
}

bool isXmlCharacter(std::uint32_t point) {
  if (point < 0x20) return point == '\t' || point == '\n' || point == '\r';
  return !(point >= 0xD800 && point <= 0xDFFF) && point != 0xFFFE && point != 0xFFFF &&
         point <= 0x10FFFF;
}

bool equalsIgnoringCase(std::string_view a, std::string_view b) {
  const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; };
  return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                    [&](char x, char y) { return lower(x) == lower(y); });
}

}  // namespace

void XmlScanner::fail(PropertyListError code, std::string what, std::size_t offset) const {
  throw PropertyListFailure(code, std::move(what), offset);
}

std::size_t XmlScanner::checkCharacter(std::size_t at) const {
  const Utf8Unit unit = decodeUtf8(text_, at);
  if (unit.length == 0) fail(PropertyListError::kTextEncoding, "the text is not UTF-8", at);
  if (unit.point == 0) fail(PropertyListError::kTextEncoding, "the text holds a NUL", at);
  if (!isXmlCharacter(unit.point)) {
    fail(PropertyListError::kXmlChar, "a character that XML does not allow", at);
  }
  return unit.length;
}

void XmlScanner::requireTextLimit(std::size_t size, std::size_t offset) const {
  if (size > limits_.xmlTextBytes) {
    fail(PropertyListError::kXmlLimit,
         "text is longer than " + std::to_string(limits_.xmlTextBytes) + " bytes", offset);
  }
}

void XmlScanner::readDeclaration(std::string_view encodingOfBytes) {
  constexpr std::string_view kStart = "<?xml";
  const std::size_t start = at_;
  if (!startsWith(kStart) || at_ + kStart.size() >= text_.size() ||
      !isSpace(text_[at_ + kStart.size()])) {
    return;
  }
  at_ += kStart.size();
  std::string_view previous;
  for (skipSpace(); !startsWith("?>"); skipSpace()) {
    const std::size_t nameOffset = at_;
    const std::string_view name = readName();
    skipSpace();
    if (!startsWith("=")) failSyntax("bad XML declaration", at_);
    ++at_;
    skipSpace();
    const std::size_t valueOffset = at_;
    const std::string_view value = readQuoted();
    if (name == "version" && previous.empty()) {
      if (value != "1.0") failSyntax("unknown XML version", valueOffset);
    } else if (name == "encoding" && previous == "version") {
      const bool isAscii =
          equalsIgnoringCase(value, "US-ASCII") || equalsIgnoringCase(value, "ASCII");
      if (!equalsIgnoringCase(value, encodingOfBytes) && !(isAscii && encodingOfBytes == "UTF-8")) {
        fail(PropertyListError::kTextEncoding,
             "the declared encoding is not that of the bytes, " + std::string(encodingOfBytes),
             valueOffset);
      }
    } else if (name != "standalone" || previous.empty() || previous == name) {
      failSyntax("bad XML declaration", nameOffset);
    }
    previous = name;
  }
  if (previous.empty()) failSyntax("bad XML declaration", start);
  at_ += 2;
}

void XmlScanner::skipSpace() {
  while (at_ < text_.size() && isSpace(text_[at_])) ++at_;
}

void XmlScanner::skipMisc(bool beforeRoot) {
  bool typeSeen = false;
  for (;;) {
    skipSpace();
    if (startsWith(kCommentStart)) {
      skipComment();
    } else if (beforeRoot && !typeSeen && startsWith(kDocumentTypeStart)) {
      skipDocumentType();
      typeSeen = true;
    } else {
      return;
    }
  }
}

void XmlScanner::skipComment() {
  const std::size_t start = at_;
  const std::size_t from = start + kCommentStart.size();
  const std::size_t window =
      std::min(text_.size() - from, limits_.xmlTextBytes + kCommentEnd.size());
  const std::size_t length = text_.substr(from, window).find(kCommentEnd);
  if (length == std::string_view::npos) {
    requireTextLimit(text_.size() - from, start);
    failSyntax("a comment does not end", start);
  }
  const std::size_t end = from + length;
  const std::size_t dashes = text_.substr(from, length + 1).find("--");
  if (dashes != std::string_view::npos) failSyntax("\"--\" inside a comment", from + dashes);
  for (std::size_t at = from; at < end;) at += checkCharacter(at);
  at_ = end + kCommentEnd.size();
}

// Skipped unread: nothing that it names is ever fetched or used.
void XmlScanner::skipDocumentType() {
  const std::size_t start = at_;
  char quote = 0;
  for (at_ += kDocumentTypeStart.size(); at_ < text_.size(); ++at_) {
    requireTextLimit(at_ - start, start);
    const char c = text_[at_];
    if (quote != 0) {
      if (c == quote) quote = 0;
    } else if (c == '"' || c == '\'') {
      quote = c;
    } else if (c == '[') {
      fail(PropertyListError::kXmlDtd, "a document type with an internal subset", at_);
    } else if (c == '<') {
      failSyntax("a document type declaration does not end", start);
    } else if (c == '>') {
      ++at_;
      return;
    }
  }
  failSyntax("a document type declaration does not end", start);
}

void XmlScanner::requireEnd() const {
  if (atEnd()) return;
  checkCharacter(at_);
  failSyntax("something follows the root", at_);
}

// What stands here is neither a tag nor a comment.
void XmlScanner::failMarkup() const {
  if (atEnd()) failSyntax("the file ends early", at_);
  if (text_[at_] != '<') {
    checkCharacter(at_);
    failSyntax("text where an element is expected", at_);
  }
  for (const std::string_view word :
       {kDocumentTypeStart, std::string_view("<!ENTITY"), std::string_view("<!ELEMENT"),
        std::string_view("<!ATTLIST"), std::string_view("<!NOTATION")}) {
    if (startsWith(word)) {
      fail(PropertyListError::kXmlDtd, "a declaration that is not allowed here", at_);
    }
  }
  failSyntax("unknown markup", at_);
}

std::string_view XmlScanner::readName() {
  const std::size_t start = at_;
  while (at_ < text_.size() && isNameCharacter(text_[at_])) {
    ++at_;
    if (at_ - start > limits_.xmlNameBytes) {
      fail(PropertyListError::kXmlLimit,
           "a name is longer than " + std::to_string(limits_.xmlNameBytes) + " bytes", start);
    }
  }
  if (at_ == start) {
    if (!atEnd()) checkCharacter(at_);
    failSyntax("a name is missing", at_);
  }
  for (std::size_t at = start; at < at_;) at += checkCharacter(at);
  return text_.substr(start, at_ - start);
}

std::string_view XmlScanner::readQuoted() {
  const std::size_t start = at_;
  if (atEnd() || (text_[at_] != '"' && text_[at_] != '\'')) {
    failSyntax("an attribute value is not quoted", at_);
  }
  const char quote = text_[at_++];
  while (at_ < text_.size() && text_[at_] != quote) {
    if (text_[at_] == '<') failSyntax("\"<\" inside an attribute value", at_);
    at_ += checkCharacter(at_);
    requireTextLimit(at_ - start - 1, start);
  }
  if (atEnd()) failSyntax("an attribute value does not end", start);
  return text_.substr(start + 1, at_++ - start - 1);
}

void XmlScanner::readAttributes(Tag& tag) {
  std::size_t count = 0;
  for (;;) {
    const std::size_t before = at_;
    skipSpace();
    if (atEnd()) failSyntax("a tag does not end", tag.offset);
    if (text_[at_] == '>' || text_[at_] == '/') return;
    const std::size_t start = at_;
    if (before == start) failSyntax("bad tag", start);
    if (++count > limits_.xmlAttributes) {
      fail(PropertyListError::kXmlLimit,
           "more than " + std::to_string(limits_.xmlAttributes) + " attributes", start);
    }
    const std::string_view name = readName();
    skipSpace();
    if (!startsWith("=")) failSyntax("an attribute without a value", start);
    ++at_;
    skipSpace();
    const std::string_view value = readQuoted();
    if (name != "version" || value != "1.0") tag.foreignAttribute = start;
    if (tag.name != "plist") tag.foreignAttribute = start;
  }
}

XmlScanner::Tag XmlScanner::readTag() {
  if (atEnd() || text_[at_] != '<' || at_ + 1 == text_.size()) failMarkup();
  const char next = text_[at_ + 1];
  if (next == '!' || next == '?') failMarkup();
  Tag tag;
  tag.offset = at_++;
  if (next == '/') {
    ++at_;
    tag.kind = TagKind::kClose;
    tag.name = readName();
    skipSpace();
  } else {
    tag.name = readName();
    readAttributes(tag);
    if (startsWith("/")) {
      tag.kind = TagKind::kEmpty;
      ++at_;
    }
  }
  if (atEnd()) failSyntax("a tag does not end", tag.offset);
  if (text_[at_] != '>') failSyntax("bad tag", at_);
  ++at_;
  if (tag.foreignAttribute != kNone) failSyntax("unknown attribute", tag.foreignAttribute);
  return tag;
}

std::string_view XmlScanner::readRaw() {
  const std::size_t start = at_;
  at_ = std::min(text_.find('<', at_), text_.size());
  return text_.substr(start, at_ - start);
}

void XmlScanner::skipPlain() {
  for (;;) {
    while (at_ < text_.size() && isPlain(text_[at_])) ++at_;
    if (atEnd()) return;
    const char c = text_[at_];
    if (c == '<' || c == '&' || c == '\r') return;
    if (startsWith(kCdataEnd)) failSyntax("\"]]>\" outside a CDATA section", at_);
    at_ += checkCharacter(at_);
  }
}

std::string_view XmlScanner::readText(std::string& scratch, bool& isInText) {
  const std::size_t start = at_;
  skipPlain();
  requireTextLimit(at_ - start, start);
  const auto isComment = [this] { return startsWith(kCommentStart); };
  const auto isCdata = [this] { return startsWith(kCdataStart); };
  isInText = atEnd() || (text_[at_] == '<' && !isComment() && !isCdata());
  if (isInText) return text_.substr(start, at_ - start);
  scratch.assign(text_, start, at_ - start);
  while (!atEnd()) {
    const char c = text_[at_];
    if (c == '&') {
      appendReference(scratch);
    } else if (c == '\r') {
      scratch += '\n';
      at_ += startsWith("\r\n") ? 2 : 1;
    } else if (c != '<') {
      const std::size_t from = at_;
      skipPlain();
      scratch.append(text_, from, at_ - from);
    } else if (isCdata()) {
      appendCdata(scratch);
    } else if (isComment()) {
      skipComment();
    } else {
      break;
    }
    requireTextLimit(scratch.size(), start);
  }
  return scratch;
}

void XmlScanner::appendReference(std::string& out) {
  struct Named {
    std::string_view name;
    char character;
  };
  static constexpr Named kNamed[] = {
      {"lt", '<'}, {"gt", '>'}, {"amp", '&'}, {"quot", '"'}, {"apos", '\''}};
  const std::size_t start = at_;
  const std::string_view rest = text_.substr(start + 1, limits_.xmlNameBytes + 1);
  const std::size_t length = rest.find(';');
  if (length == std::string_view::npos || length == 0) {
    failSyntax("a reference does not end", start);
  }
  const std::string_view body = rest.substr(0, length);
  at_ = start + length + 2;
  if (body.front() == '#') return appendUtf8(out, readCharacterReference(body, start));
  for (const char c : body) {
    if (!isNameCharacter(c)) failSyntax("a reference does not end", start);
  }
  for (const Named& named : kNamed) {
    if (named.name == body) {
      out += named.character;
      return;
    }
  }
  fail(PropertyListError::kXmlDtd, "an entity that is not defined", start);
}

std::uint32_t XmlScanner::readCharacterReference(std::string_view body, std::size_t offset) const {
  const bool isHex = body.size() > 1 && body[1] == 'x';
  const std::string_view digits = body.substr(isHex ? 2 : 1);
  if (digits.empty()) failSyntax("a character reference without digits", offset);
  std::uint32_t point = 0;
  for (const char c : digits) {
    std::uint32_t digit = 16;
    if (c >= '0' && c <= '9') digit = static_cast<std::uint32_t>(c - '0');
    if (isHex && c >= 'a' && c <= 'f') digit = static_cast<std::uint32_t>(c - 'a' + 10);
    if (isHex && c >= 'A' && c <= 'F') digit = static_cast<std::uint32_t>(c - 'A' + 10);
    if (digit == 16) failSyntax("a character reference with a bad digit", offset);
    point = std::min<std::uint32_t>(point * (isHex ? 16 : 10) + digit, 0x110000);
  }
  if (point == 0 || !isXmlCharacter(point)) {
    fail(PropertyListError::kXmlChar, "a reference to a character that XML does not allow", offset);
  }
  return point;
}

void XmlScanner::appendCdata(std::string& out) {
  const std::size_t start = at_;
  const std::size_t from = start + kCdataStart.size();
  const std::size_t window = std::min(text_.size() - from, limits_.xmlTextBytes + kCdataEnd.size());
  const std::size_t length = text_.substr(from, window).find(kCdataEnd);
  if (length == std::string_view::npos) {
    requireTextLimit(text_.size() - from, start);
    failSyntax("a CDATA section does not end", start);
  }
  for (std::size_t at = from; at < from + length;) {
    const std::size_t size = checkCharacter(at);
    if (text_[at] == '\r') {
      out += '\n';
      at += text_.compare(at, 2, "\r\n") == 0 && at + 1 < from + length ? 2 : 1;
    } else {
      out.append(text_, at, size);
      at += size;
    }
  }
  at_ = from + length + kCdataEnd.size();
}

}  // namespace kx
