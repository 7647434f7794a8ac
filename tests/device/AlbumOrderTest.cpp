#include <algorithm>
#include <map>
#include <random>
#include <tuple>

#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

using Texts = std::vector<std::string>;
using Order = std::map<std::string, std::int64_t>;

// What an album's order is to be: each member keeps the index of the order that it was last put in
// order by.
class ModelAlbum {
 public:
  std::map<std::string, std::optional<double>> tokens;  // of all assets

  void setOrder(Order order) { order_ = std::move(order); }
  void add(const std::string& uuid) {
    renumber();
    members_.emplace(uuid, wanted(uuid));
  }
  void remove(const std::string& uuid) { members_.erase(uuid); }
  void sort() {
    if (numberedBy_ == order_) return;
    const Texts present = inOrder();
    ModelAlbum sorted = *this;
    sorted.renumber();
    if (sorted.inOrder() != present) *this = sorted;
  }
  Texts inOrder() const {
    Texts all;
    for (const auto& [uuid, index] : members_) all.push_back(uuid);
    std::sort(all.begin(), all.end(),
              [&](const std::string& a, const std::string& b) { return key(a) < key(b); });
    return all;
  }
  bool has(const std::string& uuid) const { return members_.contains(uuid); }

 private:
  using Key = std::tuple<bool, std::int64_t, bool, double, std::string>;
  Key key(const std::string& uuid) const {
    const std::optional<std::int64_t> index = members_.at(uuid);
    if (index) return {false, *index, false, 0, uuid};
    const std::optional<double> token = tokens.at(uuid);
    return {true, 0, !token, token.value_or(0), uuid};
  }
  std::optional<std::int64_t> wanted(const std::string& uuid) const {
    const auto found = order_.find(uuid);
    return found == order_.end() ? std::nullopt : std::optional(found->second);
  }
  void renumber() {
    if (numberedBy_ == order_) return;
    for (auto& [uuid, index] : members_) index = wanted(uuid);
    numberedBy_ = order_;
  }

  std::map<std::string, std::optional<std::int64_t>> members_;
  Order order_;
  std::optional<Order> numberedBy_;
};

class AlbumOrderTest : public DeviceTest {
 protected:
  void addAsset(const std::string& uuid, std::optional<double> token = {}) {
    NewDeviceAsset asset;
    asset.uuid = uuid;
    asset.path = "/var/mobile/Media/x/" + uuid;
    asset.savedAssetType = kKXSavedAssetTypeSynced;
    asset.sortToken = token;
    ErrorPtr error;
    ASSERT_TRUE(device().admin().addAsset(asset, &error)) << error->description();
  }
  void writeOrder(const Order& order) {
    Dictionary indexes;
    for (const auto& [uuid, index] : order) indexes.set(uuid, Value::integer(index));
    Dictionary root;
    root.set("ALBUM", Value::dictionary(std::move(indexes)));
    const Value whole = Value::dictionary(std::move(root));
    const auto bytes = writePropertyList(whole, PropertyListFormat::kBinary, nullptr);
    ASSERT_TRUE(platform().files().writeFileAtomically(device_paths::kAssetOrder, bytes, nullptr));
    platform().photoLibrary().clearAssetOrderByAbumUUIDs();
  }
  static Order orderOf(const Texts& uuids) {
    Order order;
    for (const std::string& uuid : uuids) order.emplace(uuid, order.size());
    return order;
  }
  void add(const Texts& uuids) {
    transaction([&] {
      KXManagedAlbum* const album = library().albumWithUUID("ALBUM")->asManagedAlbum();
      for (const std::string& uuid : uuids) {
        album->addAssetUsingTesselAlbumOrder(library().assetWithUUID(uuid));
      }
    });
  }
  void remove(const std::string& uuid) {
    transaction([&] {
      KXManagedAlbum* const album = library().albumWithUUID("ALBUM")->asManagedAlbum();
      album->removeAsset(library().assetWithUUID(uuid));
    });
  }
  void sort() {
    transaction([&] {
      library().albumWithUUID("ALBUM")->asManagedAlbum()->sortAssetsUsingTesselAlbumOrder();
    });
  }
  Texts members() { return dump().albums.at(0).assets; }
  std::uint64_t rowsWritten() { return device().takeCounters().rowsWritten; }
};

std::string name(std::size_t number) {
  const std::string digits = std::to_string(number);
  return "A" + std::string(3 - digits.size(), '0') + digits;
}

TEST_F(AlbumOrderTest, OnlyTheOneThatJoinsIsWritten) {
  makeContainer("ALBUM");
  Texts all;
  for (std::size_t i = 0; i < 60; ++i) {
    all.push_back(name(i));
    addAsset(all.back());
  }
  const std::string late = all[30];
  Texts first = all;
  std::erase(first, late);
  writeOrder(orderOf(first));
  add(first);
  EXPECT_EQ(members(), first);
  // It goes between two, the others' indexes are others from then on.
  writeOrder(orderOf(all));
  rowsWritten();
  sort();
  EXPECT_EQ(rowsWritten(), 0U);
  add({late});
  EXPECT_EQ(rowsWritten(), 2U);  // the membership, and that the album is in that order
  EXPECT_EQ(members(), all);
  sort();
  EXPECT_EQ(rowsWritten(), 0U);
  // One that leaves takes its own row along.
  std::erase(all, "A010");
  writeOrder(orderOf(all));
  rowsWritten();
  remove("A010");
  sort();
  EXPECT_EQ(rowsWritten(), 1U);
  EXPECT_EQ(members(), all);
  // And one that moves.
  std::rotate(all.begin(), all.end() - 1, all.end());
  writeOrder(orderOf(all));
  rowsWritten();
  sort();
  EXPECT_EQ(rowsWritten(), 2U);
  EXPECT_EQ(members(), all);
}

TEST_F(AlbumOrderTest, PositionsWithoutRoomBetweenAreSpread) {
  for (std::size_t i = 0; i < 8; ++i) addAsset(name(i));
  NewDeviceAlbum album;  // positions 0, 1, 2, ...
  album.uuid = "ALBUM";
  album.kind = kKXAlbumKindSyncedAlbum;
  album.assets = {name(0), name(1), name(2), name(3)};
  ASSERT_TRUE(device().admin().addAlbum(album, nullptr));
  writeOrder(orderOf({name(0), name(4), name(1), name(5), name(6), name(2), name(7), name(3)}));
  rowsWritten();
  add({name(4)});
  // The tag, the new one and all of the others but that at position 0.
  EXPECT_EQ(rowsWritten(), 5U);
  add({name(7), name(5), name(6)});
  EXPECT_EQ(rowsWritten(), 3U);
  EXPECT_EQ(members(),
            (Texts{name(0), name(4), name(1), name(5), name(6), name(2), name(7), name(3)}));
}

TEST_F(AlbumOrderTest, ARolledBackOrderIsForgotten) {
  makeContainer("ALBUM");
  for (std::size_t i = 0; i < 4; ++i) addAsset(name(i));
  writeOrder(orderOf({name(0), name(1), name(2)}));
  add({name(0), name(1), name(2)});
  writeOrder(orderOf({name(2), name(3), name(1), name(0)}));
  transaction([&] {
    KXManagedAlbum* const managed = library().albumWithUUID("ALBUM")->asManagedAlbum();
    managed->sortAssetsUsingTesselAlbumOrder();
    managed->addAssetUsingTesselAlbumOrder(library().assetWithUUID(name(3)));
    throw std::runtime_error("not this time");
  });
  EXPECT_EQ(members(), (Texts{name(0), name(1), name(2)}));
  device().health().reset();
  add({name(3)});
  EXPECT_EQ(members(), (Texts{name(2), name(3), name(1), name(0)}));
}

TEST_F(AlbumOrderTest, AnAssetWithAnotherIdentifierIsPutWhereThatStands) {
  makeContainer("ALBUM");
  for (std::size_t i = 0; i < 3; ++i) addAsset(name(i));
  writeOrder(orderOf({"LAST FIRST", name(0), name(1), name(2)}));
  add({name(0), name(1), name(2)});
  transaction([&] {
    DeviceAssetFields fields;
    fields.uuid = "LAST FIRST";
    EXPECT_TRUE(device().admin().setAssetFields(library(), name(2), fields));
  });
  sort();
  EXPECT_EQ(members(), (Texts{"LAST FIRST", name(0), name(1)}));
}

// Whatever happens to an album, its order is the model's.
TEST_F(AlbumOrderTest, RandomHistoriesAreThoseOfTheModel) {
  const std::uint32_t seed = std::random_device{}();
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937 random(seed);
  const auto below = [&](std::size_t n) { return static_cast<std::size_t>(random() % n); };
  constexpr std::size_t kAssets = 24;
  makeContainer("ALBUM");
  ModelAlbum model;
  for (std::size_t i = 0; i < kAssets; ++i) {
    const std::optional<double> token =
        below(3) == 0 ? std::optional<double>() : static_cast<double>(below(4));
    addAsset(name(i), token);
    model.tokens[name(i)] = token;
  }
  Texts order;
  for (int step = 0; step < 400; ++step) {
    const std::string uuid = name(below(kAssets));
    switch (below(8)) {
      case 0:
      case 1: {
        for (std::size_t i = 1 + below(3); i > 0; --i) {
          const std::string other = name(below(kAssets));
          const bool stays = std::erase(order, other) == 0 || below(4) > 0;
          const auto place = static_cast<std::ptrdiff_t>(below(order.size() + 1));
          if (stays) order.insert(order.begin() + place, other);
        }
        Order indexes = orderOf(order);
        if (below(4) == 0 && indexes.contains(uuid)) indexes[uuid] = indexes.begin()->second;
        writeOrder(indexes);
        model.setOrder(indexes);
        break;
      }
      case 2:
      case 3:
      case 4:
        // Adding what is there already is nothing that the library hears of.
        if (!model.has(uuid)) model.add(uuid);
        add({uuid});
        break;
      case 5:
        remove(uuid);
        model.remove(uuid);
        break;
      case 6:
        sort();
        model.sort();
        break;
      default:
        if (below(4) == 0) reopen();
        break;
    }
    ASSERT_EQ(members(), model.inOrder()) << "at step " << step;
  }
}

}  // namespace
}  // namespace kx
