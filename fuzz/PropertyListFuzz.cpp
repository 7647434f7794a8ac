// The property-list reader over any bytes. What it accepts must survive writing and reading again:
// as binary without loss, as XML as far as XML can hold it.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <vector>

#include "platform/foundation/PropertyList.h"

namespace {

using Bytes = std::vector<std::uint8_t>;

kx::Value ReadAgain(const Bytes& bytes) {
  kx::ErrorPtr error;
  kx::Value value = kx::readPropertyList(std::make_shared<kx::Data>(bytes), &error);
  if (error) std::abort();
  return value;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  kx::ErrorPtr error;
  const kx::Value value = kx::readPropertyList(std::make_shared<kx::Data>(data, size), &error);
  if (error) {
    if (!value.isNull()) std::abort();
    return 0;
  }
  const Bytes first = kx::writePropertyList(value, kx::PropertyListFormat::kBinary, &error);
  if (error) std::abort();
  const Bytes second =
      kx::writePropertyList(ReadAgain(first), kx::PropertyListFormat::kBinary, &error);
  if (error || first != second) std::abort();

  const Bytes xml = kx::writePropertyList(value, kx::PropertyListFormat::kXml, &error);
  if (!error) ReadAgain(xml);
  return 0;
}
