#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "host/ByteSource.h"

namespace kx {

// One box of the ISO base media format: its four-letter type and what is inside.
struct Box {
  std::string type;
  ByteSource body;
};

// Walks the boxes of one file; counts them and their depth over the whole file. MetadataError for
// sizes that make no sense and beyond hostlimits::kBoxes and kBoxDepth. The depth is that of the
// caller's nested calls, so it is bounded too.
class BoxReader {
 public:
  // Calls `visit` for each box in the range, in order; it says whether to go on.
  void forEach(const ByteSource& range, const std::function<bool(const Box&)>& visit);

 private:
  std::size_t boxes_ = 0;
  std::size_t depth_ = 0;
};

}  // namespace kx
