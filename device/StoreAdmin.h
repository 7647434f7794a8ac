#pragma once

#include <memory>

#include "device/DeviceAdmin.h"
#include "device/LibraryStore.h"

namespace kx {

// The device's own camera and albums, on the store.
class StoreAdmin : public DeviceAdmin {
 public:
  StoreAdmin(std::shared_ptr<DeviceRoot> root, std::shared_ptr<LibraryStore> store)
      : root_(std::move(root)), store_(std::move(store)) {}
  bool addAsset(const NewDeviceAsset& asset, ErrorPtr* error) override;
  bool addAlbum(const NewDeviceAlbum& album, ErrorPtr* error) override;
  bool removeAsset(const std::string& uuid, ErrorPtr* error) override;
  bool setAssetFields(KXPhotoLibrary& library, const std::string& uuid,
                      const DeviceAssetFields& fields) override;

 private:
  bool write(const LibraryStore::Work& work, ErrorPtr* error);

  const std::shared_ptr<DeviceRoot> root_;
  const std::shared_ptr<LibraryStore> store_;
};

}  // namespace kx
