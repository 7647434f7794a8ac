#include "tools/sample/Picture.h"

#include <cmath>
#include <cstddef>

namespace kx {

namespace {

std::uint8_t Mix(std::uint8_t from, std::uint8_t to, double share) {
  return static_cast<std::uint8_t>(std::lround(from + (to - from) * share));
}

}  // namespace

Picture::Picture(int width, int height)
    : width_(width),
      height_(height),
      pixels_(static_cast<std::size_t>(width) * static_cast<std::size_t>(height)) {}

std::size_t Picture::Index(int x, int y) const {
  return static_cast<std::size_t>(y) * static_cast<std::size_t>(width_) +
         static_cast<std::size_t>(x);
}

void Picture::FillGradient(Colour top, Colour bottom) {
  for (int y = 0; y < height_; ++y) {
    const double share = static_cast<double>(y) / height_;
    const Colour row{Mix(top.red, bottom.red, share), Mix(top.green, bottom.green, share),
                     Mix(top.blue, bottom.blue, share)};
    for (int x = 0; x < width_; ++x) pixels_[Index(x, y)] = row;
  }
}

void Picture::FillHills(double level, double waves, Colour colour) {
  for (int x = 0; x < width_; ++x) {
    const double swing = std::sin(waves * 6.28 * x / width_) * 0.06;
    const int first = static_cast<int>((level + swing) * height_);
    for (int y = first; y < height_; ++y) pixels_[Index(x, y)] = colour;
  }
}

void Picture::FillDisc(double x, double y, double radius, Colour colour) {
  for (int row = 0; row < height_; ++row) {
    for (int column = 0; column < width_; ++column) {
      const double across = column - x * width_;
      const double down = row - y * height_;
      if (std::hypot(across, down) <= radius * width_) pixels_[Index(column, row)] = colour;
    }
  }
}

void Picture::DrawFace(double x, double y, double width, Colour skin) {
  const double shape = static_cast<double>(width_) / height_;
  const Colour dark{50, 40, 40};
  FillDisc(x, y, width / 2, skin);
  FillDisc(x - width / 6, y - width / 10 * shape, width / 18, dark);
  FillDisc(x + width / 6, y - width / 10 * shape, width / 18, dark);
  for (int step = -4; step <= 4; ++step) {
    const double across = step * width / 20;
    const double down = width / 5 - across * across / width;
    FillDisc(x + across, y + down * shape, width / 36, dark);
  }
}

}  // namespace kx
