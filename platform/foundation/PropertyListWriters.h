#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/Value.h"

// The two writers and what they share. Internal to platform/foundation; throw PropertyListFailure.
namespace kx {

std::vector<std::uint8_t> writeBinaryPropertyList(const Value& root);
std::vector<std::uint8_t> writeXmlPropertyList(const Value& root);

struct TextClass {
  bool isAscii = false;
  std::size_t utf16Units = 0;
};

// Refuses text that a reader would refuse: no UTF-8, a NUL, too long.
TextClass classifyText(std::string_view text);
void requireKey(std::string_view key);
void requireDate(double secondsSinceReference);
void requireDataSize(std::size_t size);
void requireFileSize(std::uint64_t size);
[[noreturn]] void failNull();
[[noreturn]] void failDepth();

// "updates[3].uuid": the step from a container to one of its elements, appended to the path.
void appendArrayStep(std::string& path, std::size_t index);
void appendDictionaryStep(std::string& path, std::string_view key);

}  // namespace kx
