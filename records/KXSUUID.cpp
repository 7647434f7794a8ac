#include "records/KXSUUID.h"

#include "platform/foundation/Exceptions.h"
#include "platform/library/KXPhotoLibrary.h"
#include "records/KXSBase64.h"
#include "records/TransportKeys.h"

namespace kx {
namespace {

constexpr std::size_t kTextLength = 36;
constexpr std::size_t kPhotoTextLength = 22;

constexpr bool isHyphenPlace(std::size_t index) {
  return index == 8 || index == 13 || index == 18 || index == 23;
}

int digitValue(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  return -1;
}

// Null unless the text is canonical.
DataPtr bytesOfText(std::string_view text) {
  if (text.size() != kTextLength) return nullptr;
  std::vector<std::uint8_t> bytes;
  bytes.reserve(KXSUUID::numberBytes());
  for (std::size_t i = 0; i < kTextLength;) {
    if (isHyphenPlace(i)) {
      if (text[i] != '-') return nullptr;
      ++i;
      continue;
    }
    const int high = digitValue(text[i]);
    const int low = digitValue(text[i + 1]);
    if (high < 0 || low < 0) return nullptr;
    bytes.push_back(static_cast<std::uint8_t>(high * 16 + low));
    i += 2;
  }
  return std::make_shared<Data>(std::move(bytes));
}

// Characters as UTF-16 counts them: one for each lead byte, two for the leads of four bytes.
std::size_t characterCount(std::string_view text) {
  std::size_t count = 0;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if ((byte & 0xC0U) != 0x80U) count += byte >= 0xF0U ? 2 : 1;
  }
  return count;
}

}  // namespace

KXSUUIDPtr KXSUUID::init() { return initWithString(UUIDString()); }

KXSUUIDPtr KXSUUID::initWithData(const DataPtr& data) {
  if (!data) return nullptr;
  return std::make_shared<KXSUUID>(std::make_shared<Data>(data->bytes(), data->length()));
}

KXSUUIDPtr KXSUUID::initWithBytesLength(const void* bytes, std::size_t length) {
  if (bytes == nullptr) return nullptr;
  return std::make_shared<KXSUUID>(std::make_shared<Data>(bytes, length));
}

KXSUUIDPtr KXSUUID::initWithString(OptionalString text) {
  if (!text) return nullptr;
  DataPtr bytes = bytesOfText(*text);
  return bytes ? std::make_shared<KXSUUID>(std::move(bytes)) : nullptr;
}

KXSUUIDPtr KXSUUID::initWithPhotoBase64String(OptionalString text) {
  if (!text || characterCount(*text) != kPhotoTextLength) return nullptr;
  return initWithData(KXSBase64Decoder::decoderForPhotoUUID().decodeString(*text));
}

KXSUUIDPtr KXSUUID::initWithCoder(KeyedUnarchiver& coder) {
  const Value value = coder.decodeValue(kKXSUUIDDataKey);
  const auto bytes = value.asData(kKXSUUIDDataKey);
  if (!bytes) return std::make_shared<KXSUUID>(std::make_shared<Data>());
  return std::make_shared<KXSUUID>(std::make_shared<Data>(bytes->data(), bytes->size()));
}

std::string KXSUUID::generateUUIDAsString() { return uuid()->stringValue(); }

std::vector<std::string> KXSUUID::photoBase64UUIDsFromUUIDs(const std::vector<std::string>& uuids) {
  std::vector<std::string> texts;
  texts.reserve(uuids.size());
  for (const std::string& text : uuids) {
    const KXSUUIDPtr uuid = uuidWithString(text);
    if (!uuid) throw InternalInconsistency("not an identifier: " + text);
    texts.push_back(uuid->photoBase64String());
  }
  return texts;
}

std::string KXSUUID::stringValue() const {
  static constexpr char kDigits[] = "0123456789ABCDEF";
  if (length() < numberBytes()) throw InternalInconsistency("identifier is too short to format");
  std::string text;
  text.reserve(kTextLength);
  for (std::size_t i = 0; i < numberBytes(); ++i) {
    if (isHyphenPlace(text.size())) text += '-';
    text += kDigits[bytes()[i] >> 4];
    text += kDigits[bytes()[i] & 15];
  }
  return text;
}

std::string KXSUUID::photoBase64String() const {
  return KXSBase64Encoder::encoderForPhotoUUID().encodeData(*data_);
}

bool KXSUUID::isEqualToData(const Data& other) const { return data_->isEqualToData(other); }

bool KXSUUID::isEqual(const Data& other) const {
  return dynamic_cast<const KXSUUID*>(&other) != nullptr && isEqualToData(other);
}

void KXSUUID::encodeWithCoder(KeyedArchiver& coder) const {
  coder.encodeValue(kKXSUUIDDataKey, Value::data(data_->span()));
}

}  // namespace kx
