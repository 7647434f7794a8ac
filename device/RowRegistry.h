#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <utility>
#include <vector>

#include "device/LibraryRows.h"

namespace kx {

// Objects by the number of their row: a plain table while the numbers are dense, as those of a
// library mostly are, a tree for the others. One thread at a time.
template <typename T>
class RowRegistry {
 public:
  // The place of a row's object, for the caller to fill when it is null. Valid until the next call.
  std::shared_ptr<T>& at(RowId pk) {
    const auto row = static_cast<std::size_t>(pk);
    if (row >= dense_.size() && row < kFirstRows + 2 * made_) grow(row);
    std::shared_ptr<T>& place = row < dense_.size() ? dense_[row] : sparse_[pk];
    if (!place) ++made_;
    return place;
  }
  // Null when there is none.
  std::shared_ptr<T> find(RowId pk) const {
    const auto row = static_cast<std::size_t>(pk);
    if (row < dense_.size()) return dense_[row];
    const auto known = sparse_.find(pk);
    return known == sparse_.end() ? nullptr : known->second;
  }
  // The same without a share in it.
  T* peek(RowId pk) const {
    const auto row = static_cast<std::size_t>(pk);
    if (row < dense_.size()) return dense_[row].get();
    const auto known = sparse_.find(pk);
    return known == sparse_.end() ? nullptr : known->second.get();
  }
  void erase(RowId pk) {
    const auto row = static_cast<std::size_t>(pk);
    if (row < dense_.size()) {
      dense_[row] = nullptr;
    } else {
      sparse_.erase(pk);
    }
  }
  // Each object, in the order of the rows. It may be let go of in its place.
  template <typename Visit>
  void forEach(const Visit& visit) {
    const auto first = sparse_.lower_bound(0);
    for (auto entry = sparse_.begin(); entry != first; ++entry) visitOne(entry->second, visit);
    for (std::shared_ptr<T>& place : dense_) visitOne(place, visit);
    for (auto entry = first; entry != sparse_.end(); ++entry) visitOne(entry->second, visit);
  }

 private:
  static constexpr std::size_t kFirstRows = 1024;

  template <typename Visit>
  static void visitOne(std::shared_ptr<T>& place, const Visit& visit) {
    if (place) visit(place);
  }
  void grow(std::size_t row) {
    dense_.resize(std::max({row + 1, 2 * dense_.size(), kFirstRows}));
    auto entry = sparse_.lower_bound(0);
    while (entry != sparse_.end() && static_cast<std::size_t>(entry->first) < dense_.size()) {
      dense_[static_cast<std::size_t>(entry->first)] = std::move(entry->second);
      entry = sparse_.erase(entry);
    }
  }

  std::vector<std::shared_ptr<T>> dense_;       // by row
  std::map<RowId, std::shared_ptr<T>> sparse_;  // none that the table has room for
  std::size_t made_ = 0;                        // objects so far
};

}  // namespace kx
