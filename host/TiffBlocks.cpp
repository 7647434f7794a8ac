// Copies the wanted tags of a TIFF structure into a new, small one. The metadata library then sees
// nothing of a hostile file's own structure: no loops, no maker notes, no offsets of its making.
#include <exiv2/jpgimage.hpp>

#include <algorithm>
#include <array>
#include <set>
#include <span>

#include "host/MetadataBlocks.h"

namespace kx {

namespace {

constexpr std::uint16_t kExifPointer = 0x8769;
constexpr std::uint16_t kGpsPointer = 0x8825;
constexpr std::uint16_t kXmpTag = 0x02BC;
constexpr std::uint16_t kIptcTag = 0x83BB;
constexpr std::uint16_t kPhotoshopTag = 0x8649;
constexpr std::uint16_t kWidthTag = 0x0100;
constexpr std::uint16_t kHeightTag = 0x0101;
constexpr std::uint16_t kTypeLong = 4;

// In ascending order.
constexpr std::array<std::uint16_t, 12> kImageTags{0x0100, 0x0101, 0x010E, 0x010F, 0x0110, 0x0112,
                                                   0x0131, 0x0132, 0x013B, 0x4746, 0x4749, 0x8298};
constexpr std::array<std::uint16_t, 21> kExifTags{
    0x829A, 0x829D, 0x8822, 0x8827, 0x9003, 0x9004, 0x9010, 0x9011, 0x9012, 0x9204, 0x9207,
    0x9209, 0x920A, 0x9290, 0x9291, 0x9292, 0xA002, 0xA003, 0xA402, 0xA405, 0xA434};
constexpr std::array<std::uint16_t, 9> kGpsTags{0x0001, 0x0002, 0x0003, 0x0004, 0x0005,
                                                0x0006, 0x0010, 0x0011, 0x001D};

bool contains(std::span<const std::uint16_t> tags, std::uint16_t tag) {
  return std::binary_search(tags.begin(), tags.end(), tag);
}

struct Entry {
  std::uint16_t tag = 0;
  std::uint16_t type = 0;
  std::uint32_t count = 0;
  std::vector<std::uint8_t> value;  // as it stands in the file, in the file's byte order
};

// The size of one element of a TIFF type, 0 for unknown ones.
std::uint64_t typeSize(std::uint16_t type) {
  constexpr std::array<std::uint8_t, 14> kSizes{0, 1, 1, 2, 4, 8, 1, 1, 2, 4, 8, 4, 8, 4};
  return type < kSizes.size() ? kSizes[type] : 0;
}

class TiffReader {
 public:
  TiffReader(const ByteSource& source, MetadataBlocks* blocks) : source_(source), blocks_(blocks) {}

  void read() {
    readHeader();
    const std::uint32_t first = u32(4);
    readDirectory(first, kImageTags, &image_);
    if (exifOffset_ != 0) readDirectory(exifOffset_, kExifTags, &exif_);
    if (gpsOffset_ != 0) readDirectory(gpsOffset_, kGpsTags, &gps_);
    readDimensions();
    if (!image_.empty() || !exif_.empty() || !gps_.empty()) write();
  }

 private:
  void readHeader() {
    const std::string order = source_.text(0, 2);
    if (order != "II" && order != "MM") throw MetadataError("its Exif block has no byte order");
    little_ = order == "II";
    // 42, or the marks of two raw formats that are TIFF otherwise ("RO", "RS", 'U').
    const std::uint16_t mark = u16(2);
    if (mark != 42 && mark != 0x4F52 && mark != 0x5352 && mark != 0x55)
      throw MetadataError("its Exif block is no TIFF");
  }

  std::uint16_t u16(std::uint64_t offset) const {
    const std::uint16_t big = source_.u16(offset);
    return little_ ? static_cast<std::uint16_t>(big >> 8 | big << 8) : big;
  }
  std::uint32_t u32(std::uint64_t offset) const {
    return little_ ? __builtin_bswap32(source_.u32(offset)) : source_.u32(offset);
  }

  void readDirectory(std::uint32_t offset, std::span<const std::uint16_t> wanted,
                     std::vector<Entry>* entries) {
    if (!visited_.insert(offset).second) throw MetadataError("its Exif directories form a loop");
    if (visited_.size() > hostlimits::kTiffDirectories)
      throw MetadataError("it has too many Exif directories");
    const std::uint16_t count = u16(offset);
    tags_ += count;
    if (tags_ > hostlimits::kTiffTags) throw MetadataError("it has too many Exif tags");
    if (!source_.holds(offset + 2ULL, count * 12ULL))
      throw MetadataError("an Exif directory reaches past its end");
    for (std::uint32_t index = 0; index < count; ++index) {
      readEntry(offset + 2ULL + index * 12ULL, wanted, entries);
    }
    std::stable_sort(entries->begin(), entries->end(),
                     [](const Entry& a, const Entry& b) { return a.tag < b.tag; });
  }

  void readEntry(std::uint64_t offset, std::span<const std::uint16_t> wanted,
                 std::vector<Entry>* entries) {
    Entry entry;
    entry.tag = u16(offset);
    const bool isImage = entries == &image_;
    if (isImage && entry.tag == kExifPointer) exifOffset_ = u32(offset + 8);
    if (isImage && entry.tag == kGpsPointer) gpsOffset_ = u32(offset + 8);
    const bool isBlock =
        isImage && (entry.tag == kXmpTag || entry.tag == kIptcTag || entry.tag == kPhotoshopTag);
    if (!isBlock && !contains(wanted, entry.tag)) return;
    entry.type = u16(offset + 2);
    entry.count = u32(offset + 4);
    const std::uint64_t size = typeSize(entry.type) * entry.count;
    if (size == 0) return;
    const std::uint64_t at = size <= 4 ? offset + 8 : u32(offset + 8);
    if (!source_.holds(at, size)) {
      blocks_->damage = "an Exif value lies outside the file";
      return;
    }
    if (isBlock) return takeBlock(entry.tag, at, size);
    if (size > hostlimits::kTiffValueBytes) return;
    // Doubled tags: the first counts.
    for (const Entry& known : *entries) {
      if (known.tag == entry.tag) return;
    }
    entry.value = source_.bytes(at, size);
    entries->push_back(std::move(entry));
  }

  void takeBlock(std::uint16_t tag, std::uint64_t at, std::uint64_t size) {
    if (tag == kXmpTag) {
      if (size > hostlimits::kXmpBytes) throw MetadataError("its XMP is too large");
      if (blocks_->xmp.empty()) blocks_->xmp = source_.text(at, size);
      return;
    }
    if (size > hostlimits::kIptcBytes || !blocks_->iptc.empty()) return;
    std::vector<std::uint8_t> raw = source_.bytes(at, size);
    if (tag == kIptcTag) {
      blocks_->iptc = std::move(raw);
      return;
    }
    const Exiv2::byte* record = nullptr;
    std::uint32_t headerSize = 0;
    std::uint32_t iptcSize = 0;
    if (Exiv2::Photoshop::locateIptcIrb(raw.data(), static_cast<long>(raw.size()), &record,
                                        &headerSize, &iptcSize) == 0)
      blocks_->iptc.assign(record + headerSize, record + headerSize + iptcSize);
  }

  std::uint32_t firstNumber(const Entry& entry) const {
    const std::vector<std::uint8_t>& v = entry.value;
    std::uint32_t number = 0;
    const std::size_t size = std::min<std::size_t>(typeSize(entry.type), 4);
    if (entry.type != 3 && entry.type != kTypeLong) return 0;
    for (std::size_t i = 0; i < size; ++i) number = number << 8 | v[little_ ? size - 1 - i : i];
    return number;
  }

  void readDimensions() {
    if (blocks_->width != 0) return;
    for (const Entry& entry : image_) {
      if (entry.tag == kWidthTag) blocks_->width = firstNumber(entry);
      if (entry.tag == kHeightTag) blocks_->height = firstNumber(entry);
    }
  }

  void put16(std::uint16_t value) {
    std::vector<std::uint8_t>& out = blocks_->exif;
    const auto high = static_cast<std::uint8_t>(value >> 8);
    const auto low = static_cast<std::uint8_t>(value & 0xFF);
    out.push_back(little_ ? low : high);
    out.push_back(little_ ? high : low);
  }
  void put32(std::uint32_t value) {
    const auto high = static_cast<std::uint16_t>(value >> 16);
    const auto low = static_cast<std::uint16_t>(value & 0xFFFF);
    put16(little_ ? low : high);
    put16(little_ ? high : low);
  }

  static std::uint32_t directorySize(std::size_t entries) {
    return static_cast<std::uint32_t>(2 + entries * 12 + 4);
  }

  void writeDirectory(const std::vector<Entry>& entries, std::vector<std::uint8_t>* data,
                      std::uint32_t dataOffset) {
    put16(static_cast<std::uint16_t>(entries.size()));
    for (const Entry& entry : entries) {
      put16(entry.tag);
      put16(entry.type);
      put32(entry.count);
      if (entry.value.size() <= 4) {
        std::vector<std::uint8_t> padded = entry.value;
        padded.resize(4);
        blocks_->exif.insert(blocks_->exif.end(), padded.begin(), padded.end());
        continue;
      }
      put32(dataOffset + static_cast<std::uint32_t>(data->size()));
      data->insert(data->end(), entry.value.begin(), entry.value.end());
      if (data->size() % 2 != 0) data->push_back(0);
    }
    put32(0);
  }

  // A pointer tag whose value is written in the file's byte order.
  Entry pointer(std::uint16_t tag, std::uint32_t offset) const {
    Entry entry{tag, kTypeLong, 1, {}};
    for (int i = 0; i < 4; ++i) {
      const int shift = little_ ? 8 * i : 24 - 8 * i;
      entry.value.push_back(static_cast<std::uint8_t>(offset >> shift & 0xFF));
    }
    return entry;
  }

  void write() {
    const std::size_t pointers = (exif_.empty() ? 0U : 1U) + (gps_.empty() ? 0U : 1U);
    std::uint32_t next = 8 + directorySize(image_.size() + pointers);
    if (!exif_.empty()) {
      image_.push_back(pointer(kExifPointer, next));
      next += directorySize(exif_.size());
    }
    if (!gps_.empty()) {
      image_.push_back(pointer(kGpsPointer, next));
      next += directorySize(gps_.size());
    }
    blocks_->exif.clear();
    blocks_->exif.push_back(little_ ? 'I' : 'M');
    blocks_->exif.push_back(little_ ? 'I' : 'M');
    put16(42);
    put32(8);
    std::vector<std::uint8_t> data;
    writeDirectory(image_, &data, next);
    if (!exif_.empty()) writeDirectory(exif_, &data, next);
    if (!gps_.empty()) writeDirectory(gps_, &data, next);
    blocks_->exif.insert(blocks_->exif.end(), data.begin(), data.end());
  }

  const ByteSource& source_;
  MetadataBlocks* blocks_;
  bool little_ = true;
  std::set<std::uint32_t> visited_;
  std::size_t tags_ = 0;
  std::uint32_t exifOffset_ = 0;
  std::uint32_t gpsOffset_ = 0;
  std::vector<Entry> image_;
  std::vector<Entry> exif_;
  std::vector<Entry> gps_;
};

}  // namespace

void addTiffBlocks(const ByteSource& source, MetadataBlocks* blocks) {
  TiffReader(source, blocks).read();
}

}  // namespace kx
