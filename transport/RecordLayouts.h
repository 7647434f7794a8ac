#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>

#include "platform/foundation/Value.h"
#include "records/RecordFields.h"

namespace kx {

// Where the fields of item dictionaries stand. Most items of a snapshot hold the same key objects
// in the same order, so that the keys are looked at once and then recognised by their object
// indexes. For one decoding, on one thread.
class RecordLayouts {
 public:
  struct Layout {
    std::uint8_t itemType = RecordFields::kAbsent;
    RecordFields::Positions asset = RecordFields::kNowhere;
    RecordFields::Positions album = RecordFields::kNowhere;
    RecordFields::Positions event = RecordFields::kNowhere;
  };

  // Null for a dictionary that was not read from a file or is too large for a layout. The result
  // lives until the next call.
  const Layout* find(const Value& dictionary);

 private:
  // Bounds the memory that a file of ever new layouts can take.
  static constexpr std::size_t kMostLayouts = 1024;
  static constexpr std::size_t kMostKeys = 64;

  struct Hash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const {
      return std::hash<std::string_view>{}(text);
    }
  };

  void forget();

  const void* document_ = nullptr;
  std::unordered_map<std::string, Layout, Hash, std::equal_to<>> layouts_;
  // The layout met last among those with so many keys.
  struct Last {
    std::string_view keys;  // views a key of layouts_
    const Layout* layout = nullptr;
  };
  std::array<Last, kMostKeys + 1> last_;
};

}  // namespace kx
