#include "host/BoxReader.h"

#include "host/HostLimits.h"

namespace kx {

void BoxReader::forEach(const ByteSource& range, const std::function<bool(const Box&)>& visit) {
  if (depth_ == hostlimits::kBoxDepth) throw MetadataError("its boxes are nested too deeply");
  ++depth_;
  std::uint64_t at = 0;
  // Less than a box header at the end is padding.
  while (range.holds(at, 8)) {
    if (++boxes_ > hostlimits::kBoxes) throw MetadataError("it has too many boxes");
    std::uint64_t size = range.u32(at);
    std::uint64_t header = 8;
    if (size == 1) {
      size = range.u64(at + 8);
      header = 16;
    } else if (size == 0) {
      size = range.size() - at;  // up to the end
    }
    if (size < header || !range.holds(at, size))
      throw MetadataError("it has a box of an impossible size");
    const Box box{range.text(at + 4, 4), range.range(at + header, size - header)};
    if (!visit(box)) break;
    at += size;
  }
  --depth_;
}

}  // namespace kx
