#pragma once

#include <cstddef>
#include <cstdint>
#include <limits>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/foundation/OrderedMap.h"
#include "platform/library/KXManagedObjects.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

// The device's assets by UUID, in the order of the library's rows, each with the host's asset of
// the same UUID. Those that the host lists are told apart by its list, so that a library in the
// order of the host's takes no look-up of its own. One thread at a time; the host's map outlives
// this and does not change.
class DeviceAssets {
 public:
  struct Entry {
    KXManagedAssetPtr asset;                   // null once it is removed
    const KXSAssetMap::Entry* host = nullptr;  // null when the host does not list it
    std::size_t place = 0;                     // of the host's in its map
    Value other;                               // the UUID when the host does not list it

    std::string_view uuid() const { return (host != nullptr ? host->key : other).stringValue(); }
  };

  explicit DeviceAssets(const KXSAssetMap& host) : host_(host), numbers_(host.places(), kNone) {}
  void reserve(std::size_t count) { entries_.reserve(count); }

  // A later asset of the same UUID takes the place of an earlier one.
  void set(std::string_view uuid, KXManagedAssetPtr asset) {
    Entry entry;
    entry.asset = std::move(asset);
    entry.host = host_.find(uuid, cursor_);
    entry.place = entry.host != nullptr ? cursor_.place() : 0;
    std::uint32_t* number = nullptr;
    if (entry.host != nullptr) {
      number = &numbers_[entry.place];
    } else {
      entry.other = Value::string(uuid);
      number = others_.find(uuid);
      if (number == nullptr) number = &others_.set(entry.other, kNone);
    }
    if (*number != kNone) {
      entries_[*number] = std::move(entry);
      return;
    }
    *number = static_cast<std::uint32_t>(entries_.size());
    entries_.push_back(std::move(entry));
  }

  std::vector<Entry>& entries() { return entries_; }
  // Whether the device has the host's asset at this place of its map.
  bool hasHostAsset(std::size_t place) const {
    return numbers_[place] != kNone && entries_[numbers_[place]].asset != nullptr;
  }

 private:
  static constexpr std::uint32_t kNone = std::numeric_limits<std::uint32_t>::max();

  const KXSAssetMap& host_;
  KXSAssetMap::Cursor cursor_;
  std::vector<Entry> entries_;
  std::vector<std::uint32_t> numbers_;  // of the entries, by the host's places
  OrderedMap<std::uint32_t> others_;    // of the entries that the host does not list, by UUID
};

}  // namespace kx
