#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/foundation/PropertyList.h"
#include "platform/foundation/PropertyListFailure.h"

namespace kx {

// The lexical level of the XML reader: white space, comments, tags and character data of UTF-8
// text. Moves forward only, looks at each byte a fixed number of times, and holds no state but its
// place. Internal to platform/foundation; throws PropertyListFailure with offsets into the text.
class XmlScanner {
 public:
  enum class TagKind { kOpen, kClose, kEmpty };
  struct Tag {
    TagKind kind = TagKind::kOpen;
    std::string_view name;
    std::size_t offset = 0;  // of the "<"
    // Of the first attribute other than version="1.0", or kNone.
    std::size_t foreignAttribute = kNone;
  };
  static constexpr std::size_t kNone = static_cast<std::size_t>(-1);

  // The limits are used as long as the scanner is.
  explicit XmlScanner(const PropertyListLimits& limits) : limits_(limits) {}
  void setText(std::string_view text) {
    text_ = text;
    at_ = 0;
  }

  std::size_t offset() const { return at_; }
  bool atEnd() const { return at_ == text_.size(); }
  // Anything that is still to come is an error.
  void requireEnd() const;

  // The XML declaration, where there is one; `encodingOfBytes` is "UTF-8" or "UTF-16".
  void readDeclaration(std::string_view encodingOfBytes);
  // White space and comments; before the root also a document type declaration, which is skipped.
  void skipMisc(bool beforeRoot);
  // The next tag; anything else is an error.
  Tag readTag();
  // Character data up to the next tag, references resolved and line ends as "\n". The view is of
  // the text itself where that holds it as it is, else of `scratch`.
  std::string_view readText(std::string& scratch, bool& isInText);
  // Everything up to the next "<".
  std::string_view readRaw();

  [[noreturn]] void fail(PropertyListError code, std::string what, std::size_t offset) const;
  [[noreturn]] void failSyntax(std::string what, std::size_t offset) const {
    fail(PropertyListError::kXmlSyntax, std::move(what), offset);
  }

 private:
  bool startsWith(std::string_view word) const {
    return text_.compare(at_, word.size(), word) == 0;
  }
  void skipSpace();
  void skipComment();
  void skipDocumentType();
  [[noreturn]] void failMarkup() const;
  std::string_view readName();
  std::string_view readQuoted();
  void readAttributes(Tag& tag);
  // Checks the character at a place and returns its length in bytes.
  std::size_t checkCharacter(std::size_t at) const;
  // Moves over plain characters; stops before "<", "&" and carriage returns.
  void skipPlain();
  void appendReference(std::string& out);
  std::uint32_t readCharacterReference(std::string_view body, std::size_t offset) const;
  void appendCdata(std::string& out);
  void requireTextLimit(std::size_t size, std::size_t offset) const;

  std::string_view text_;
  const PropertyListLimits& limits_;
  std::size_t at_ = 0;
};

}  // namespace kx
