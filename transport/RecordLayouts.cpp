#include "transport/RecordLayouts.h"

#include <array>

#include "platform/foundation/EntryPeek.h"
#include "records/KXSAlbum.h"
#include "records/KXSAsset.h"
#include "records/KXSEvent.h"

namespace kx {
namespace {

RecordLayouts::Layout layoutOf(const DictionaryView& view) {
  static constexpr std::array<FieldKey, 1> kItemType = {{{kKXSTransportItemTypeKey, 0}}};
  RecordLayouts::Layout layout;
  RecordFields::Positions itemType;
  RecordFields::findPositions(view, kItemType, itemType);
  layout.itemType = itemType[0];
  RecordFields::findPositions(view, KXSAsset::allKeys(), layout.asset);
  RecordFields::findPositions(view, KXSAlbum::allKeys(), layout.album);
  RecordFields::findPositions(view, KXSEvent::allKeys(), layout.event);
  return layout;
}

}  // namespace

const RecordLayouts::Layout* RecordLayouts::find(const Value& dictionary) {
  if (!dictionary.isDictionary() || !EntryPeek::can(dictionary)) return nullptr;
  if (EntryPeek::document(dictionary) != document_) {
    forget();
    document_ = EntryPeek::document(dictionary);
  }
  const std::size_t count = EntryPeek::count(dictionary);
  if (count > kMostKeys) return nullptr;
  const std::string_view keys = EntryPeek::keyBytes(dictionary);
  Last& last = last_[count];
  if (last.layout != nullptr && keys == last.keys) return last.layout;
  auto found = layouts_.find(keys);
  if (found == layouts_.end()) {
    if (layouts_.size() == kMostLayouts) forget();
    found = layouts_.emplace(keys, layoutOf(dictionary.dictionaryValue())).first;
  }
  last_[count] = {found->first, &found->second};
  return &found->second;
}

void RecordLayouts::forget() {
  layouts_.clear();
  last_.fill(Last());
}

}  // namespace kx
