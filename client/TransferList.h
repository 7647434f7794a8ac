#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/sync/FRAsset.h"
#include "platform/sync/FRLog.h"

namespace kx {

// An ordered list of transfer requests by identity: each object at most once. Appending, asking and
// removing cost O(1) on average. Not for use from two threads at once.
class TransferList {
 public:
  TransferList() = default;
  explicit TransferList(const std::vector<FRAssetPtr>& requests) {
    for (const FRAssetPtr& request : requests) append(request);
  }

  std::size_t size() const { return places_.size(); }
  bool empty() const { return places_.empty(); }
  bool contains(const FRAssetPtr& request) const { return places_.contains(request.get()); }

  void append(const FRAssetPtr& request) {
    if (places_.emplace(request.get(), entries_.size()).second) entries_.push_back(request);
  }

  void remove(const FRAssetPtr& request) {
    const auto place = places_.find(request.get());
    if (place == places_.end()) return;
    entries_[place->second] = nullptr;
    places_.erase(place);
    if (places_.size() * 2 < entries_.size()) compact();
  }

  // In order of insertion.
  std::vector<FRAssetPtr> copy() const {
    std::vector<FRAssetPtr> requests;
    requests.reserve(size());
    for (const FRAssetPtr& entry : entries_) {
      if (entry) requests.push_back(entry);
    }
    return requests;
  }

  // The requests in order of insertion. Good until the list changes.
  class Iterator {
   public:
    Iterator(const std::vector<FRAssetPtr>* entries, std::size_t index)
        : entries_(entries), index_(index) {
      skip();
    }
    const FRAssetPtr& operator*() const { return (*entries_)[index_]; }
    Iterator& operator++() {
      ++index_;
      skip();
      return *this;
    }
    bool operator==(const Iterator& other) const { return index_ == other.index_; }

   private:
    void skip() {
      while (index_ < entries_->size() && !(*entries_)[index_]) ++index_;
    }
    const std::vector<FRAssetPtr>* entries_;
    std::size_t index_;
  };
  Iterator begin() const { return {&entries_, 0}; }
  Iterator end() const { return {&entries_, entries_.size()}; }

 private:
  void compact() {
    std::vector<FRAssetPtr> kept = copy();
    entries_ = std::move(kept);
    for (std::size_t i = 0; i < entries_.size(); ++i) places_[entries_[i].get()] = i;
  }

  std::vector<FRAssetPtr> entries_;  // null where one was removed
  std::unordered_map<const FRAsset*, std::size_t> places_;
};

// For a log message: the requests as a list, "(null)" without one. The list must outlive the call
// that logs it.
inline LogArgument::Renderer describeTransfers(const std::shared_ptr<TransferList>& list) {
  return [&list](std::string& out, std::size_t limit) {
    if (!list) {
      out += "(null)";
      return;
    }
    describeList (*list)(out, limit);
  };
}

}  // namespace kx
