#include "client/HostWork.h"

#include <cmath>

#include "platform/foundation/PropertyList.h"
#include "records/TesselDates.h"

namespace kx {
namespace {

constexpr double kTieStepDivisor = 100000.0;
constexpr double kNoPreviousTime = -1.0;

std::vector<std::uint8_t> assetOrderOf(const KXSItemMap& containers) {
  Dictionary orders;
  for (const auto& entry : containers) {
    const auto* album = dynamic_cast<const KXSAlbum*>(entry.value.get());
    if (album == nullptr) continue;
    const Value uuid = album->uuidValue();
    if (uuid.isNull()) continue;
    Dictionary order;
    std::uint64_t index = 0;
    if (const std::optional<ArrayView> assets = album->assetUUIDs()) {
      order.reserve(assets->size());
      for (const Value& asset : *assets) order.set(asset, Value::unsignedInteger(index++));
    }
    orders.set(uuid, Value::dictionary(std::move(order)));
  }
  return writePropertyList(Value::dictionary(std::move(orders)), PropertyListFormat::kBinary,
                           nullptr);
}

SortTokens sortTokensOf(const KXSAlbumPtr& master, const KXSAssetMapPtr& assets) {
  SortTokens tokens(assets);
  if (!master || !assets) return tokens;
  const std::optional<ArrayView> uuids = master->assetUUIDs();
  if (!uuids) return tokens;
  KXSAssetMap::Cursor cursor;
  double previous = kNoPreviousTime;
  unsigned ties = 0;
  for (std::size_t i = 0; i < uuids->size(); ++i) {
    const KXSAssetMap::Entry* found =
        assets->find(*uuids->stringAt(i, kKXSAlbumAssetUUIDsKey), cursor);
    if (found == nullptr) continue;
    const double time =
        dateWithTesselTimeInterval(found->value->exposureDate()).secondsSinceReference;
    ties = std::fabs(previous - time) < kTokenEpsilon ? ties + 1 : 0;
    tokens.set(cursor.place(), time + ties / kTieStepDivisor);
    previous = time;
  }
  return tokens;
}

}  // namespace

HostWork HostWork::start(const KXSItemMapPtr& containers, const KXSAlbumPtr& master,
                         const KXSAssetMapPtr& assets) {
  const auto ownContainers = containers ? containers : std::make_shared<KXSItemMap>();
  const auto ownAssets = assets ? assets : std::make_shared<KXSAssetMap>();
  HostWork work;
  work.assetOrder =
      std::async(std::launch::async, [ownContainers] { return assetOrderOf(*ownContainers); });
  work.sortTokens =
      std::async(std::launch::async, [master, assets] { return sortTokensOf(master, assets); });
  work.memberships = std::async(std::launch::async, [ownContainers, ownAssets] {
    return Memberships(*ownAssets, *ownContainers);
  });
  return work;
}

}  // namespace kx
