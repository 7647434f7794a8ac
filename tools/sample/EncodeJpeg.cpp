// Baseline JPEG as ITU-T T.81 describes it, with the tables of its annex K. Written for clearness:
// sample pictures are small.
#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <utility>

#include "tools/sample/Picture.h"

namespace kx {

namespace {

constexpr int kBlock = 8;
constexpr int kCoefficients = kBlock * kBlock;

// Order in which the coefficients of a block are written.
constexpr std::array<std::uint8_t, kCoefficients> kZigZag = {
    0,  1,  8,  16, 9,  2,  3,  10, 17, 24, 32, 25, 18, 11, 4,  5,  12, 19, 26, 33, 40, 48,
    41, 34, 27, 20, 13, 6,  7,  14, 21, 28, 35, 42, 49, 56, 57, 50, 43, 36, 29, 22, 15, 23,
    30, 37, 44, 51, 58, 59, 52, 45, 38, 31, 39, 46, 53, 60, 61, 54, 47, 55, 62, 63};

constexpr std::array<std::uint8_t, kCoefficients> kLuminance = {
    16, 11, 10, 16, 24,  40,  51,  61,  12, 12, 14, 19, 26,  58,  60,  55,
    14, 13, 16, 24, 40,  57,  69,  56,  14, 17, 22, 29, 51,  87,  80,  62,
    18, 22, 37, 56, 68,  109, 103, 77,  24, 35, 55, 64, 81,  104, 113, 92,
    49, 64, 78, 87, 103, 121, 120, 101, 72, 92, 95, 98, 112, 100, 103, 99};

// Huffman tables: codes per length 1 to 16, then the values.
constexpr std::array<std::uint8_t, 16> kDcCounts = {0, 1, 5, 1, 1, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0, 0};
constexpr std::array<std::uint8_t, 16> kAcCounts = {0, 2, 1, 3, 3, 2, 4, 3,
                                                    5, 5, 4, 4, 0, 0, 1, 0x7d};
constexpr std::array<std::uint8_t, 12> kDcValues = {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11};
constexpr std::array<std::uint8_t, 162> kAcValues = {
    0x01, 0x02, 0x03, 0x00, 0x04, 0x11, 0x05, 0x12, 0x21, 0x31, 0x41, 0x06, 0x13, 0x51, 0x61,
    0x07, 0x22, 0x71, 0x14, 0x32, 0x81, 0x91, 0xa1, 0x08, 0x23, 0x42, 0xb1, 0xc1, 0x15, 0x52,
    0xd1, 0xf0, 0x24, 0x33, 0x62, 0x72, 0x82, 0x09, 0x0a, 0x16, 0x17, 0x18, 0x19, 0x1a, 0x25,
    0x26, 0x27, 0x28, 0x29, 0x2a, 0x34, 0x35, 0x36, 0x37, 0x38, 0x39, 0x3a, 0x43, 0x44, 0x45,
    0x46, 0x47, 0x48, 0x49, 0x4a, 0x53, 0x54, 0x55, 0x56, 0x57, 0x58, 0x59, 0x5a, 0x63, 0x64,
    0x65, 0x66, 0x67, 0x68, 0x69, 0x6a, 0x73, 0x74, 0x75, 0x76, 0x77, 0x78, 0x79, 0x7a, 0x83,
    0x84, 0x85, 0x86, 0x87, 0x88, 0x89, 0x8a, 0x92, 0x93, 0x94, 0x95, 0x96, 0x97, 0x98, 0x99,
    0x9a, 0xa2, 0xa3, 0xa4, 0xa5, 0xa6, 0xa7, 0xa8, 0xa9, 0xaa, 0xb2, 0xb3, 0xb4, 0xb5, 0xb6,
    0xb7, 0xb8, 0xb9, 0xba, 0xc2, 0xc3, 0xc4, 0xc5, 0xc6, 0xc7, 0xc8, 0xc9, 0xca, 0xd2, 0xd3,
    0xd4, 0xd5, 0xd6, 0xd7, 0xd8, 0xd9, 0xda, 0xe1, 0xe2, 0xe3, 0xe4, 0xe5, 0xe6, 0xe7, 0xe8,
    0xe9, 0xea, 0xf1, 0xf2, 0xf3, 0xf4, 0xf5, 0xf6, 0xf7, 0xf8, 0xf9, 0xfa};

struct Code {
  unsigned bits = 0;
  int length = 0;
};

using CodeTable = std::array<Code, 256>;
using Block = std::array<double, kCoefficients>;
using QuantizedBlock = std::array<int, kCoefficients>;

template <std::size_t N>
CodeTable MakeCodes(const std::array<std::uint8_t, 16>& counts,
                    const std::array<std::uint8_t, N>& values) {
  CodeTable table;
  unsigned code = 0;
  std::size_t next = 0;
  for (int length = 1; length <= 16; ++length) {
    for (int count = counts[static_cast<std::size_t>(length - 1)]; count > 0; --count) {
      table[values[next++]] = {code++, length};
    }
    code <<= 1U;
  }
  return table;
}

// The entropy-coded bits, with a zero byte after every 0xff.
class BitWriter {
 public:
  explicit BitWriter(std::string& out) : out_(out) {}

  void Write(Code code) {
    for (int bit = code.length - 1; bit >= 0; --bit) {
      byte_ = byte_ << 1U | (code.bits >> static_cast<unsigned>(bit) & 1U);
      if (++filled_ == 8) Flush();
    }
  }
  void Finish() {
    while (filled_ != 0) Write({1, 1});
  }

 private:
  void Flush() {
    out_.push_back(static_cast<char>(byte_ & 0xffU));
    if ((byte_ & 0xffU) == 0xffU) out_.push_back('\0');
    byte_ = 0;
    filled_ = 0;
  }

  std::string& out_;
  unsigned byte_ = 0;
  int filled_ = 0;
};

// A number in JPEG's form: the count of its bits, and those bits (a negative one less one).
Code NumberBits(int value) {
  int length = 0;
  for (int rest = std::abs(value); rest != 0; rest /= 2) ++length;
  const int bits = value < 0 ? value + (1 << length) - 1 : value;
  return {static_cast<unsigned>(bits), length};
}

// Cosines of the transform: row u, column x.
Block MakeCosines() {
  constexpr double kPi = 3.14159265358979323846;
  Block out{};
  for (int u = 0; u < kBlock; ++u) {
    for (int x = 0; x < kBlock; ++x) {
      const double scale = u == 0 ? std::sqrt(0.125) : 0.5;
      out[static_cast<std::size_t>(u * kBlock + x)] = scale * std::cos((2 * x + 1) * u * kPi / 16);
    }
  }
  return out;
}

// Transforms the rows and transposes; done twice, it transforms a block.
Block TransformRows(const Block& in, const Block& cosines) {
  Block out{};
  for (std::size_t row = 0; row < kBlock; ++row) {
    for (std::size_t u = 0; u < kBlock; ++u) {
      double sum = 0;
      for (std::size_t x = 0; x < kBlock; ++x) {
        sum += in[row * kBlock + x] * cosines[u * kBlock + x];
      }
      out[u * kBlock + row] = sum;
    }
  }
  return out;
}

// Samples of one component (0: luminance, 1 and 2: colour differences), centred on zero.
double Sample(Colour colour, int component) {
  const double red = colour.red;
  const double green = colour.green;
  const double blue = colour.blue;
  if (component == 0) return 0.299 * red + 0.587 * green + 0.114 * blue - 128;
  if (component == 1) return -0.168736 * red - 0.331264 * green + 0.5 * blue;
  return 0.5 * red - 0.418688 * green - 0.081312 * blue;
}

class Encoder {
 public:
  Encoder(const Picture& picture, int quality)
      : picture_(picture),
        dc_(MakeCodes(kDcCounts, kDcValues)),
        ac_(MakeCodes(kAcCounts, kAcValues)),
        cosines_(MakeCosines()) {
    const int scale = quality < 50 ? 5000 / quality : 200 - 2 * quality;
    for (std::size_t index = 0; index < kCoefficients; ++index) {
      steps_[index] = std::clamp((kLuminance[index] * scale + 50) / 100, 1, 255);
    }
  }

  std::string Encode() {
    WriteHeaders();
    BitWriter bits(out_);
    std::array<int, 3> previous{};
    for (int y = 0; y < picture_.height(); y += kBlock) {
      for (int x = 0; x < picture_.width(); x += kBlock) {
        for (int component = 0; component < 3; ++component) {
          const QuantizedBlock block = Quantized(x, y, component);
          WriteBlock(bits, block,
                     std::exchange(previous[static_cast<std::size_t>(component)], block[0]));
        }
      }
    }
    bits.Finish();
    out_ += "\xff\xd9";
    return std::move(out_);
  }

 private:
  void Byte(int value) { out_.push_back(static_cast<char>(value)); }
  void Word(int value) {
    Byte(value >> 8);
    Byte(value & 0xff);
  }
  void Marker(int code, int length) {
    Byte(0xff);
    Byte(code);
    Word(length);
  }

  template <std::size_t N>
  void HuffmanTable(int id, const std::array<std::uint8_t, 16>& counts,
                    const std::array<std::uint8_t, N>& values) {
    Marker(0xc4, 3 + 16 + static_cast<int>(N));
    Byte(id);
    for (const auto count : counts) Byte(count);
    for (const auto value : values) Byte(value);
  }

  void WriteHeaders() {
    out_ += "\xff\xd8";
    Marker(0xe0, 16);
    out_.append("JFIF\0\x01\x01\x00\x00\x01\x00\x01\x00\x00", 14);
    Marker(0xdb, 2 + 1 + kCoefficients);
    Byte(0);
    for (const auto index : kZigZag) Byte(steps_[index]);
    Marker(0xc0, 17);
    Byte(8);
    Word(picture_.height());
    Word(picture_.width());
    Byte(3);
    for (int component = 1; component <= 3; ++component) {
      Byte(component);
      Byte(0x11);
      Byte(0);
    }
    HuffmanTable(0x00, kDcCounts, kDcValues);
    HuffmanTable(0x10, kAcCounts, kAcValues);
    Marker(0xda, 12);
    Byte(3);
    for (int component = 1; component <= 3; ++component) {
      Byte(component);
      Byte(0);
    }
    Byte(0);
    Byte(63);
    Byte(0);
  }

  QuantizedBlock Quantized(int left, int top, int component) const {
    Block samples{};
    for (int y = 0; y < kBlock; ++y) {
      for (int x = 0; x < kBlock; ++x) {
        samples[static_cast<std::size_t>(y * kBlock + x)] =
            Sample(picture_.at(left + x, top + y), component);
      }
    }
    const Block frequencies = TransformRows(TransformRows(samples, cosines_), cosines_);
    QuantizedBlock out{};
    for (std::size_t index = 0; index < kCoefficients; ++index) {
      const std::size_t from = kZigZag[index];
      out[index] = static_cast<int>(std::lround(frequencies[from] / steps_[from]));
    }
    return out;
  }

  void WriteBlock(BitWriter& bits, const QuantizedBlock& block, int previous) const {
    const Code first = NumberBits(block[0] - previous);
    bits.Write(dc_[static_cast<std::size_t>(first.length)]);
    bits.Write(first);
    int zeros = 0;
    for (std::size_t index = 1; index < kCoefficients; ++index) {
      if (block[index] == 0) {
        ++zeros;
        continue;
      }
      for (; zeros >= 16; zeros -= 16) bits.Write(ac_[0xf0]);
      const Code number = NumberBits(block[index]);
      bits.Write(ac_[static_cast<std::size_t>(zeros * 16 + number.length)]);
      bits.Write(number);
      zeros = 0;
    }
    if (zeros > 0) bits.Write(ac_[0]);
  }

  const Picture& picture_;
  CodeTable dc_;
  CodeTable ac_;
  Block cosines_;
  std::array<int, kCoefficients> steps_{};
  std::string out_;
};

}  // namespace

std::string EncodeJpeg(const Picture& picture, int quality) {
  return Encoder(picture, quality).Encode();
}

}  // namespace kx
