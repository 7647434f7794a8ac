// HEIC, HEIF, AVIF: finds the items that hold Exif and XMP, and where their bytes lie.
#include <algorithm>
#include <map>
#include <optional>

#include "host/BoxReader.h"
#include "host/MetadataBlocks.h"

namespace kx {

namespace {

struct Item {
  std::string type;
  std::string contentType;
};

struct Place {
  unsigned method = 0;  // 0: offset in the file, 1: offset in the "idat" box
  std::uint64_t offset = 0;
  std::uint64_t length = 0;
};

// Reads big-endian numbers one after the other.
class Cursor {
 public:
  explicit Cursor(const ByteSource& source) : source_(source) {}

  std::uint64_t number(unsigned bytes) {
    std::uint64_t value = 0;
    for (unsigned i = 0; i < bytes; ++i) value = value << 8 | source_.u8(at_++);
    return value;
  }
  std::string textUpToNul() {
    std::string text;
    while (source_.holds(at_, 1)) {
      const auto letter = static_cast<char>(source_.u8(at_++));
      if (letter == '\0' || text.size() == 256) break;
      text.push_back(letter);
    }
    return text;
  }
  std::string letters(unsigned count) {
    const std::string text = source_.text(at_, count);
    at_ += count;
    return text;
  }

 private:
  const ByteSource& source_;
  std::uint64_t at_ = 0;
};

class HeifReader {
 public:
  explicit HeifReader(const ByteSource& file) : file_(file) {}

  MetadataBlocks read() {
    boxes_.forEach(file_, [this](const Box& box) {
      if (box.type != "meta") return true;
      readMeta(box.body.range(4, box.body.size() - 4));
      return false;
    });
    takeItems();
    return std::move(blocks_);
  }

 private:
  void readMeta(const ByteSource& meta) {
    boxes_.forEach(meta, [this](const Box& box) {
      if (box.type == "iinf") readItemInfos(box.body);
      if (box.type == "iloc") readLocations(box.body);
      if (box.type == "iprp") readProperties(box.body);
      if (box.type == "idat") itemData_ = box.body;
      return true;
    });
  }

  void readItemInfos(const ByteSource& body) {
    const std::uint64_t prefix = body.u8(0) == 0 ? 6 : 8;
    boxes_.forEach(body.range(prefix, body.size() - prefix), [this](const Box& box) {
      if (box.type != "infe") return true;
      Cursor cursor(box.body);
      const std::uint64_t version = cursor.number(1);
      if (version < 2) return true;  // such items have no type
      cursor.number(3);
      const std::uint64_t id = cursor.number(version == 2 ? 2 : 4);
      cursor.number(2);
      Item item;
      item.type = cursor.letters(4);
      cursor.textUpToNul();
      if (item.type == "mime") item.contentType = cursor.textUpToNul();
      items_[id] = std::move(item);
      return true;
    });
  }

  void readLocations(const ByteSource& body) {
    Cursor cursor(body);
    const std::uint64_t version = cursor.number(1);
    if (version > 2) throw MetadataError("its item locations are of an unknown version");
    cursor.number(3);
    const auto sizes = static_cast<unsigned>(cursor.number(1));
    const auto baseAndIndex = static_cast<unsigned>(cursor.number(1));
    const std::uint64_t count = cursor.number(version < 2 ? 2 : 4);
    std::uint64_t seen = 0;
    for (std::uint64_t i = 0; i < count; ++i) {
      const std::uint64_t id = cursor.number(version < 2 ? 2 : 4);
      Place place;
      if (version > 0) place.method = static_cast<unsigned>(cursor.number(2) & 0xF);
      cursor.number(2);
      const std::uint64_t base = cursor.number(baseAndIndex >> 4);
      const std::uint64_t extents = cursor.number(2);
      seen += 1 + extents;
      if (seen > hostlimits::kBoxes) throw MetadataError("it has too many items");
      for (std::uint64_t extent = 0; extent < extents; ++extent) {
        if (version > 0) cursor.number(baseAndIndex & 0xF);
        const std::uint64_t offset = cursor.number(sizes >> 4);
        const std::uint64_t length = cursor.number(sizes & 0xF);
        if (extent > 0) continue;
        if (__builtin_add_overflow(base, offset, &place.offset))
          throw MetadataError("an item lies outside the file");
        place.length = length;
      }
      if (extents == 1) places_[id] = place;
    }
  }

  // The largest picture is the stored one; the others are its tiles and previews.
  void readProperties(const ByteSource& body) {
    boxes_.forEach(body, [this](const Box& box) {
      if (box.type != "ipco") return true;
      boxes_.forEach(box.body, [this](const Box& property) {
        if (property.type == "ispe" && property.body.u32(4) > blocks_.width) {
          blocks_.width = property.body.u32(4);
          blocks_.height = property.body.u32(8);
        }
        return true;
      });
      return true;
    });
  }

  std::optional<ByteSource> bytesOf(std::uint64_t id) const {
    const auto place = places_.find(id);
    if (place == places_.end()) return std::nullopt;
    if (place->second.method == 0) return file_.range(place->second.offset, place->second.length);
    if (place->second.method == 1 && itemData_)
      return itemData_->range(place->second.offset, place->second.length);
    return std::nullopt;
  }

  void takeItems() {
    for (const auto& [id, item] : items_) {
      const bool isXmp = item.type == "mime" && item.contentType == "application/rdf+xml";
      if (!isXmp && item.type != "Exif") continue;
      const std::optional<ByteSource> bytes = bytesOf(id);
      if (!bytes) continue;
      if (isXmp) {
        if (bytes->size() > hostlimits::kXmpBytes) throw MetadataError("its XMP is too large");
        blocks_.xmp = bytes->text(0, bytes->size());
      } else if (blocks_.exif.empty()) {
        // Four bytes say how far behind them the TIFF structure starts.
        const std::uint64_t start = 4ULL + bytes->u32(0);
        if (start > bytes->size()) throw MetadataError("its Exif block lies outside the file");
        addTiffBlocks(bytes->range(start, bytes->size() - start), &blocks_);
      }
    }
  }

  const ByteSource& file_;
  BoxReader boxes_;
  MetadataBlocks blocks_;
  std::map<std::uint64_t, Item> items_;
  std::map<std::uint64_t, Place> places_;
  std::optional<ByteSource> itemData_;
};

}  // namespace

MetadataBlocks readHeifBlocks(const ByteSource& source) { return HeifReader(source).read(); }

}  // namespace kx
