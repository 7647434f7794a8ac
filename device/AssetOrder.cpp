#include "device/AssetOrder.h"

#include <cerrno>

#include "device/DeviceLayout.h"
#include "platform/foundation/Hash.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

// Tags are kept in the database, so the seed stays. With another one, or another way to hash, an
// album is looked through in every sync until a member joins or moves.
constexpr HashSeed kTagSeed{0xcbf29ce484222325ULL, 0x100000001b3ULL};

}  // namespace

AssetOrder::Album::Album(DictionaryView indexes) : indexes_(std::move(indexes)) {
  std::uint64_t tag = indexes_->size();
  for (std::size_t i = 0; i < indexes_->size(); ++i) {
    const std::string_view uuid = indexes_->keyAt(i);
    const Value value = indexes_->valueAt(i);
    const std::uint64_t index = value.isNumber() ? value.numberValue().uint64Value() : 0;
    tag = hashNumber(hashBytes(uuid.data(), uuid.size(), kTagSeed) ^ tag, index, kTagSeed);
  }
  tag_ = static_cast<std::int64_t>(tag | 1U);
}

std::optional<std::int64_t> AssetOrder::Album::indexOf(std::string_view assetUUID) const {
  if (!indexes_) return std::nullopt;
  const Value value = indexes_->find(assetUUID);
  if (!value.isNumber()) return std::nullopt;
  return value.numberValue().int64Value();
}

std::shared_ptr<const AssetOrder::Album> AssetOrder::album(const std::optional<std::string>& uuid) {
  if (stale_.exchange(false, std::memory_order_acquire)) read();
  if (!uuid) return none_;
  if (const auto known = albums_.find(*uuid); known != albums_.end()) return known->second;
  const Value order = orders_[*uuid];
  if (!order.isDictionary()) return none_;
  return albums_.emplace(*uuid, std::make_shared<const Album>(order.dictionaryValue()))
      .first->second;
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
