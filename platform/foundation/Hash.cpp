#include "platform/foundation/Hash.h"

#include <random>

namespace kx {

const HashSeed& processHashSeed() {
  static const HashSeed seed = [] {
    std::random_device device;
    const auto next = [&device] {
      return static_cast<std::uint64_t>(device()) << 32 | static_cast<std::uint64_t>(device());
    };
    // Odd and dense enough for the multiplications whatever the source gives.
    return HashSeed{next() | 0x1000'0000'0000'0001, next() | 0x8000'0000'0000'0001};
  }();
  return seed;
}

}  // namespace kx
