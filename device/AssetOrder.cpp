#include "device/AssetOrder.h"

#include <cerrno>

#include "device/DeviceLayout.h"
#include "platform/foundation/EntryPeek.h"
#include "platform/foundation/Hash.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

// Tags are kept in the database, so the seed stays. With another one, or another way to hash, an
// album is looked through in every sync until a member joins or moves.
constexpr HashSeed kTagSeed{0xcbf29ce484222325ULL, 0x100000001b3ULL};

}  // namespace

AssetOrder::Album::Album(Value indexes) : indexes_(std::move(indexes)) {
  const DictionaryView view = indexes_.dictionaryValue();
  std::uint64_t tag = view.size();
  for (std::size_t i = 0; i < view.size(); ++i) {
    const std::string_view uuid = view.keyAt(i);
    const Value value = view.valueAt(i);
    const std::uint64_t index = value.isNumber() ? value.numberValue().uint64Value() : 0;
    tag = hashNumber(hashBytes(uuid.data(), uuid.size(), kTagSeed) ^ tag, index, kTagSeed);
  }
  tag_ = static_cast<std::int64_t>(tag | 1U);
}

std::optional<std::int64_t> AssetOrder::Album::indexOf(std::string_view assetUUID,
                                                       std::uint32_t expected) const {
  if (EntryPeek::can(indexes_)) {
    // As the file is written, an entry stands where its index says.
    const auto found = EntryPeek::find(indexes_, assetUUID, expected);
    if (!found || found->kind() != Kind::kNumber) return std::nullopt;
    return found->number().int64Value();
  }
  const Value value = indexes_[assetUUID];
  if (!value.isNumber()) return std::nullopt;
  return value.numberValue().int64Value();
}

std::shared_ptr<const AssetOrder::Album> AssetOrder::album(const std::optional<std::string>& uuid) {
  if (stale_.exchange(false, std::memory_order_acquire)) read();
  if (!uuid) return none_;
  if (const auto known = albums_.find(*uuid); known != albums_.end()) return known->second;
  const Value order = orders_[*uuid];
  if (!order.isDictionary()) return none_;
  return albums_.emplace(*uuid, std::make_shared<const Album>(order)).first->second;
}

void AssetOrder::read() {
  albums_.clear();
  orders_ = Value();
  ErrorPtr error;
  DataPtr bytes = files_.readFile(device_paths::kAssetOrder, &error);
  if (!bytes && error && error->code() == ENOENT) return;
  if (bytes) orders_ = readPropertyList(std::move(bytes), &error);
  if (error) log_.failure("the asset order file is passed over", error);
}

}  // namespace kx
