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
    layouts_.clear();
    last_ = nullptr;
    document_ = EntryPeek::document(dictionary);
  }
  const std::string_view keys = EntryPeek::keyBytes(dictionary);
  if (last_ != nullptr && keys == lastKeys_) return last_;
  auto found = layouts_.find(keys);
  if (found == layouts_.end()) {
    const DictionaryView view = dictionary.dictionaryValue();
    if (view.size() > kMostKeys) return nullptr;
    if (layouts_.size() == kMostLayouts) layouts_.clear();
    found = layouts_.emplace(keys, layoutOf(view)).first;
  }
  lastKeys_ = found->first;
  last_ = &found->second;
  return last_;
}

}  // namespace kx
