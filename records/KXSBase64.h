#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "platform/foundation/Data.h"

namespace kx {

// Turns bytes into text over the photo alphabet, which is that of ordinary base64 with "%" in place
// of "/". Plain values, safe to copy between threads. Standard mode pads with "="; photo-UUID mode
// does not.
class KXSBase64Encoder {
 public:
  static KXSBase64Encoder encoder() { return init(); }
  static KXSBase64Encoder init() { return KXSBase64Encoder(false); }
  static KXSBase64Encoder encoderForPhotoUUID() { return initForPhotoUUID(); }
  static KXSBase64Encoder initForPhotoUUID() { return KXSBase64Encoder(true); }

  bool photoUUID() const { return photoUUID_; }
  // ASCII text of the emitted characters only; "" for no bytes.
  std::string encodeData(const Data& data) const;

 private:
  explicit KXSBase64Encoder(bool photoUUID) : photoUUID_(photoUUID) {}
  bool photoUUID_;
};

// Turns such text back into bytes. A character outside the alphabet reads as "A"; only a last group
// of one character and a pad of the wrong size at the very end fail.
class KXSBase64Decoder {
 public:
  static KXSBase64Decoder decoder() { return init(); }
  static KXSBase64Decoder init() { return KXSBase64Decoder(false); }
  static KXSBase64Decoder decoderForPhotoUUID() { return initForPhotoUUID(); }
  static KXSBase64Decoder initForPhotoUUID() { return KXSBase64Decoder(true); }

  bool photoUUID() const { return photoUUID_; }
  // Null on failure; empty data for text that is not ASCII.
  DataPtr decodeString(std::string_view text) const;

 private:
  explicit KXSBase64Decoder(bool photoUUID);

  std::array<std::int8_t, 128> decoder_{};
  bool photoUUID_;
};

}  // namespace kx
