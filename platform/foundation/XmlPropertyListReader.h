#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/PropertyList.h"
#include "platform/foundation/PropertyListDocument.h"
#include "platform/foundation/XmlScanner.h"

namespace kx {

// Reads an XML property list into a document of the same form as a binary one: text without
// references stays a view of the file's bytes, equal keys are one object. One pass, time linear in
// the file; a document type declaration is skipped unread and one with an internal subset refused,
// so nothing expands. Internal to platform/foundation; throws PropertyListFailure.
class XmlPropertyListReader {
 public:
  XmlPropertyListReader(DataPtr bytes, const PropertyListLimits& limits);
  Value read();

  // Whether the bytes, after a byte order mark and white space, begin with markup.
  static bool isXml(const std::uint8_t* bytes, std::size_t length);

 private:
  struct Frame {
    std::uint32_t object;
    bool isDictionary;
    bool hasKey;          // a key was read whose value comes next
    std::size_t pending;  // where its elements start in pending_
    std::size_t undo;     // where its keys start in undo_
  };
  enum Shared { kFalse, kTrue, kEmptyString, kEmptyData, kSharedCount };

  void prepare();
  Value readDocument();
  void reserveTables();
  void readElement(const XmlScanner::Tag& tag);
  void readKey(const XmlScanner::Tag& tag);
  void readScalar(const XmlScanner::Tag& tag);
  void openContainer(const XmlScanner::Tag& tag);
  void closeContainer(const XmlScanner::Tag& tag);
  void closeDictionary(const Frame& frame);
  std::uint32_t addString(std::string_view text, bool isInText, std::size_t offset);
  std::uint32_t addData(std::string_view base64, std::size_t offset);
  std::uint32_t addInteger(std::string_view text, std::size_t offset);
  std::uint32_t addReal(std::string_view text, std::size_t offset);
  std::uint32_t addDate(std::string_view text, std::size_t offset);
  std::uint32_t addBits(Kind kind, Number::Type type, std::uint64_t bits);
  std::uint32_t addNode(Kind kind);
  std::uint32_t shared(Shared which, Kind kind, std::uint32_t bits);
  // The element just read becomes the root or an element of the open container.
  void place(std::uint32_t object);
  // The text of an element; empty for one written <name/>.
  std::string_view elementText(const XmlScanner::Tag& tag, bool& isInText);
  void requireEnd(const XmlScanner::Tag& tag);
  std::string path() const;
  std::uint64_t offsetInFile(std::uint64_t offset) const;

  static constexpr std::uint32_t kNoObject = 0xFFFFFFFF;

  const PropertyListLimits limits_;
  DataPtr bytes_;
  bool isUtf16_ = false;
  std::string_view text_;  // UTF-8, without byte order mark
  std::size_t textStart_ = 0;
  PropertyListDocument* document_ = nullptr;  // owned by keeper_
  Value keeper_;
  DocumentNode* nodes_ = nullptr;
  std::uint32_t capacity_ = 0;
  std::size_t referenceCount_ = 0;
  std::uint32_t root_ = kNoObject;
  XmlScanner scanner_;
  std::vector<Frame> stack_;
  std::vector<std::uint32_t> pending_;  // elements of the open containers; dictionaries: key, value
  std::vector<std::uint32_t> lastDictionaryOfKey_;  // object plus 1, by key number
  std::vector<std::uint32_t> undo_;  // what the keys of the open dictionaries replaced in it
  std::vector<std::uint32_t> largeDictionaries_;
  std::array<std::uint32_t, kSharedCount> shared_;
  std::string scratch_;
};

}  // namespace kx
