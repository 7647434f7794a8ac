#pragma once

#include <cstddef>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

// Tokens that differ by less are one and the same.
inline constexpr double kTokenEpsilon = 2.220446049250313e-16;

// The sort tokens of the host's assets, by UUID: seconds since the reference date, and a fraction
// that tells equal neighbours apart. One thread at a time. It keeps the map of the assets, which
// does not change meanwhile.
class SortTokens {
 public:
  explicit SortTokens(KXSAssetMapPtr assets)
      : assets_(std::move(assets)), tokens_(assets_ ? assets_->places() : 0) {}

  // By the place of an asset in the map.
  void set(std::size_t place, double token) { tokens_[place] = token; }
  // Null when the asset has none.
  const double* at(std::size_t place) const { return tokens_[place] ? &*tokens_[place] : nullptr; }
  const double* find(std::string_view uuid) const {
    KXSAssetMap::Cursor cursor;
    return assets_ && assets_->find(uuid, cursor) != nullptr ? at(cursor.place()) : nullptr;
  }

 private:
  KXSAssetMapPtr assets_;
  std::vector<std::optional<double>> tokens_;
};

}  // namespace kx
