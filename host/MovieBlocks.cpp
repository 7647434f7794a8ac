// QuickTime, MP4, 3GP: reads the movie's own header and metadata keys, never its media data.
#include <algorithm>
#include <vector>

#include "host/BoxReader.h"
#include "host/MetadataBlocks.h"

namespace kx {

namespace {

constexpr std::int64_t kSecondsFrom1904To1970 = 2'082'844'800;

class MovieReader {
 public:
  explicit MovieReader(const ByteSource& file) : file_(file) {}

  MetadataBlocks read() {
    boxes_.forEach(file_, [this](const Box& box) {
      if (box.type == "moov") readMovie(box.body);
      if (box.type == "uuid" && isXmp(box.body)) takeXmp(box.body.range(16, box.body.size() - 16));
      return box.type != "moof";  // media data in pieces, thousands of them
    });
    return std::move(blocks_);
  }

 private:
  static bool isXmp(const ByteSource& body) {
    static constexpr std::string_view kXmpId =
        "\xBE\x7A\xCF\xCB\x97\xA9\x42\xE8\x9C\x71\x99\x94\x91\xE3\xAF\xAC";
    return body.size() > 16 && body.text(0, 16) == kXmpId;
  }

  void takeXmp(const ByteSource& packet) {
    if (packet.size() > hostlimits::kXmpBytes) throw MetadataError("its XMP is too large");
    if (blocks_.xmp.empty()) blocks_.xmp = packet.text(0, packet.size());
  }

  void readMovie(const ByteSource& movie) {
    boxes_.forEach(movie, [this](const Box& box) {
      if (box.type == "mvhd") readHeader(box.body);
      if (box.type == "trak") readTrack(box.body);
      if (box.type == "udta") readUserData(box.body);
      if (box.type == "meta") readMeta(box.body);
      return true;
    });
  }

  void readHeader(const ByteSource& body) {
    const std::uint64_t created = body.u8(0) == 1 ? body.u64(4) : body.u32(4);
    // Zero: never set. Some cameras count from 1970 all the same, which gives years before 1970.
    if (created == 0 || created > (1ULL << 40)) return;
    const auto seconds = static_cast<std::int64_t>(created);
    blocks_.movie.createdUtc =
        seconds >= kSecondsFrom1904To1970 ? seconds - kSecondsFrom1904To1970 : seconds;
  }

  // Width and height of the largest track are the picture's.
  void readTrack(const ByteSource& track) {
    boxes_.forEach(track, [this](const Box& box) {
      if (box.type != "tkhd") return true;
      const std::uint64_t at = box.body.u8(0) == 1 ? 88 : 76;
      const std::uint32_t width = box.body.u32(at) >> 16;
      if (width > blocks_.width) {
        blocks_.width = width;
        blocks_.height = box.body.u32(at + 4) >> 16;
      }
      return true;
    });
  }

  void readUserData(const ByteSource& data) {
    boxes_.forEach(data, [this](const Box& box) {
      if (box.type == "\xA9xyz" && box.body.size() > 4 && blocks_.movie.location.empty())
        blocks_.movie.location = text(box.body.range(4, box.body.size() - 4));
      if (box.type == "XMP_") takeXmp(box.body);
      if (box.type == "meta") readMeta(box.body);
      return true;
    });
  }

  static std::string text(const ByteSource& bytes) {
    return bytes.text(0, std::min<std::uint64_t>(bytes.size(), hostlimits::kTextBytes));
  }

  // QuickTime writes this box without version, MP4 with one.
  void readMeta(const ByteSource& body) {
    const bool hasVersion = body.holds(0, 8) && body.text(4, 4) != "hdlr";
    const std::uint64_t prefix = hasVersion ? 4 : 0;
    keys_.clear();
    boxes_.forEach(body.range(prefix, body.size() - prefix), [this](const Box& box) {
      if (box.type == "keys") readKeys(box.body);
      if (box.type == "ilst") readItems(box.body);
      return true;
    });
  }

  void readKeys(const ByteSource& body) {
    boxes_.forEach(body.range(8, body.size() - 8), [this](const Box& box) {
      keys_.push_back(text(box.body));
      return true;
    });
  }

  void readItems(const ByteSource& body) {
    boxes_.forEach(body, [this](const Box& item) {
      // The type is the number of the key, from 1.
      std::uint32_t number = 0;
      for (const char letter : item.type) number = number << 8 | static_cast<std::uint8_t>(letter);
      if (number >= 1 && number <= keys_.size()) readItem(keys_[number - 1], item.body);
      return true;
    });
  }

  void readItem(const std::string& key, const ByteSource& body) {
    // Keys are in reverse-domain form; the domain is whose form it is and does not matter.
    const std::string_view name = key;
    boxes_.forEach(body, [&](const Box& box) {
      if (box.type != "data" || box.body.size() <= 8) return true;
      const std::string value = text(box.body.range(8, box.body.size() - 8));
      if (name.ends_with(".creationdate")) blocks_.movie.creationDate = value;
      if (name.ends_with(".location.ISO6709")) blocks_.movie.location = value;
      if (name.ends_with(".description")) blocks_.movie.description = value;
      return false;
    });
  }

  const ByteSource& file_;
  BoxReader boxes_;
  MetadataBlocks blocks_;
  std::vector<std::string> keys_;
};

}  // namespace

MetadataBlocks readMovieBlocks(const ByteSource& source) { return MovieReader(source).read(); }

}  // namespace kx
