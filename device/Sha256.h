#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>

namespace kx {

// SHA-256 of bytes given piece by piece. Used on one thread; good for one digest.
class Sha256 {
 public:
  void update(std::span<const std::uint8_t> bytes);
  // Sixty-four hexadecimal digits, small letters. Ends the computation.
  std::string hexDigest();

 private:
  void addBlock(const std::uint8_t* block);

  std::array<std::uint32_t, 8> state_ = {0x6a09e667, 0xbb67ae85, 0x3c6ef372, 0xa54ff53a,
                                         0x510e527f, 0x9b05688c, 0x1f83d9ab, 0x5be0cd19};
  std::array<std::uint8_t, 64> pending_{};
  std::size_t pendingBytes_ = 0;
  std::uint64_t totalBytes_ = 0;
};

}  // namespace kx
