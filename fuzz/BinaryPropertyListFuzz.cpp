// The binary reader over any bytes. What it accepts must survive writing and reading again without
// loss, and an error must say where it was met. Half of the mutations keep the offset table and the
// trailer in step with the objects, so that damage lands in the objects themselves.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <vector>

#include "platform/foundation/PropertyList.h"

namespace {

using Bytes = std::vector<std::uint8_t>;

constexpr std::size_t kHeaderBytes = 8;
constexpr std::size_t kTrailerBytes = 32;
constexpr std::size_t kMostBytes = std::size_t{64} << 10;

void require(bool holds) {
  if (!holds) std::abort();
}

kx::Value readAgain(const Bytes& bytes) {
  kx::ErrorPtr error;
  kx::Value value = kx::readPropertyList(std::make_shared<kx::Data>(bytes), &error);
  require(error == nullptr);
  return value;
}

// Length of the object that begins at a place, as far as its marker tells.
std::size_t objectBytes(const Bytes& bytes, std::size_t at, unsigned referenceSize) {
  const unsigned marker = bytes[at];
  const std::size_t low = marker & 0xF;
  std::size_t count = low;
  std::size_t head = 1;
  if (low == 0xF && at + 2 < bytes.size()) {
    count = bytes[at + 2];
    head = 3;
  }
  switch (marker >> 4) {
    case 0x1:
    case 0x2:
    case 0x3:
      return 1 + (std::size_t{1} << (low & 7));
    case 0x4:
    case 0x5:
      return head + count;
    case 0x6:
      return head + 2 * count;
    case 0x8:
      return 2 + low;
    case 0xA:
      return head + count * referenceSize;
    case 0xD:
      return head + 2 * count * referenceSize;
    default:
      return 1;
  }
}

// Table and trailer for the objects that stand one after the other behind the header.
void appendTable(Bytes& bytes) {
  constexpr unsigned kReferenceSize = 1;
  std::vector<std::size_t> offsets;
  for (std::size_t at = kHeaderBytes; at < bytes.size() && offsets.size() < 256;) {
    offsets.push_back(at);
    at += objectBytes(bytes, at, kReferenceSize);
  }
  const std::size_t table = bytes.size();
  for (const std::size_t offset : offsets) {
    bytes.push_back(static_cast<std::uint8_t>(offset >> 8));
    bytes.push_back(static_cast<std::uint8_t>(offset));
  }
  Bytes trailer(kTrailerBytes, 0);
  trailer[6] = 2;
  trailer[7] = kReferenceSize;
  trailer[14] = static_cast<std::uint8_t>(offsets.size() >> 8);
  trailer[15] = static_cast<std::uint8_t>(offsets.size());
  trailer[30] = static_cast<std::uint8_t>(table >> 8);
  trailer[31] = static_cast<std::uint8_t>(table);
  bytes.insert(bytes.end(), trailer.begin(), trailer.end());
}

}  // namespace

extern "C" std::size_t LLVMFuzzerMutate(std::uint8_t* data, std::size_t size, std::size_t most)
    __attribute__((weak));  // only programs of libFuzzer have it
extern "C" std::size_t LLVMFuzzerCustomMutator(std::uint8_t* data, std::size_t size,
                                               std::size_t most, unsigned seed);
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

extern "C" std::size_t LLVMFuzzerCustomMutator(std::uint8_t* data, std::size_t size,
                                               std::size_t most, unsigned seed) {
  const std::size_t fixed = kHeaderBytes + kTrailerBytes;
  if (seed % 2 == 0 || size <= fixed || size > 0x4000) return LLVMFuzzerMutate(data, size, most);
  std::uint64_t table = 0;
  for (std::size_t i = size - 8; i < size; ++i) table = table << 8 | data[i];
  if (table <= kHeaderBytes || table > size - kTrailerBytes) {
    return LLVMFuzzerMutate(data, size, most);
  }
  const auto objects = static_cast<std::size_t>(table) - kHeaderBytes;
  const std::size_t changed = LLVMFuzzerMutate(data + kHeaderBytes, objects, most - kHeaderBytes);
  Bytes bytes(data, data + kHeaderBytes + changed);
  appendTable(bytes);
  if (bytes.size() > most) return kHeaderBytes + changed;
  std::memcpy(data, bytes.data(), bytes.size());
  return bytes.size();
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size > kMostBytes) return 0;
  kx::ErrorPtr error;
  const kx::Value value = kx::readPropertyList(std::make_shared<kx::Data>(data, size), &error);
  if (error != nullptr) {
    require(value.isNull());
    const auto offset = error->userInfo()["offset"].asNumber("offset");
    require(offset.has_value() && offset->uint64Value() <= size);
    return 0;
  }
  const Bytes first = kx::writePropertyList(value, kx::PropertyListFormat::kBinary, &error);
  require(error == nullptr);
  const kx::Value again = readAgain(first);
  require(again == value);
  require(again.description() == value.description());
  const Bytes second = kx::writePropertyList(again, kx::PropertyListFormat::kBinary, &error);
  require(error == nullptr && first == second);
  return 0;
}
