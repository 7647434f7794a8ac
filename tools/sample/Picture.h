#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace kx {

// One colour, 8 bits a channel.
struct Colour {
  std::uint8_t red = 0;
  std::uint8_t green = 0;
  std::uint8_t blue = 0;
};

// A picture in memory, drawn by the few shapes that a sample photo needs. Coordinates are shares of
// the width and height, from the top left. Not shared between threads.
class Picture {
 public:
  // width and height in pixels, both multiples of 8.
  Picture(int width, int height);

  int width() const { return width_; }
  int height() const { return height_; }
  Colour at(int x, int y) const { return pixels_[Index(x, y)]; }

  // Fills the whole picture, from top to bottom.
  void FillGradient(Colour top, Colour bottom);
  // Fills what lies below a wavy line at the given height.
  void FillHills(double level, double waves, Colour colour);
  // Draws a head with eyes and mouth that fits into the square around (x, y).
  void DrawFace(double x, double y, double width, Colour skin);

 private:
  std::size_t Index(int x, int y) const;
  void FillDisc(double x, double y, double radius, Colour colour);

  int width_;
  int height_;
  std::vector<Colour> pixels_;
};

// The picture as a baseline JPEG file (JFIF, three components, not subsampled).
// quality: 1 to 100.
std::string EncodeJpeg(const Picture& picture, int quality);

}  // namespace kx
