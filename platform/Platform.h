#pragma once

#include <any>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "platform/backup/QBManager.h"
#include "platform/dispatch/Dispatch.h"
#include "platform/files/Clock.h"
#include "platform/files/FileSystem.h"
#include "platform/files/ImageReader.h"
#include "platform/library/KXAssetsSaver.h"
#include "platform/library/KXPhotoLibrary.h"
#include "platform/sync/FRLog.h"

namespace kx {

class KXSTransportDecoder;

// Values that are made once per process: here, once per platform instance. Any thread; the maker
// runs once, under a lock of its own key alone.
class OncePerPlatform {
 public:
  template <typename T>
  T& value(const std::string& key, const std::function<T()>& make) {
    std::shared_ptr<Slot> slot;
    {
      std::lock_guard<std::mutex> lock(mutex_);
      auto& entry = slots_[key];
      if (!entry) entry = std::make_shared<Slot>();
      slot = entry;
    }
    std::call_once(slot->once, [&] { slot->value = make(); });
    return *std::any_cast<T>(&slot->value);
  }

 private:
  struct Slot {
    std::once_flag once;
    std::any value;
  };
  std::mutex mutex_;
  std::map<std::string, std::shared_ptr<Slot>> slots_;
};

// Everything through which the plug-in reaches the sync daemon, the device's photo library, the
// backup framework, files and time. The daemon makes one and it outlives every client made with it.
// The accessors may be called from any thread and give the same objects every time.
class Platform {
 public:
  virtual ~Platform() = default;

  virtual Clock& clock() = 0;
  virtual FileSystem& files() = 0;
  virtual KXPhotoLibraryFramework& photoLibrary() = 0;
  virtual KXAssetsSaver& sharedAssetsSaver() = 0;
  virtual KXPorterClient& porterClient() = 0;
  virtual std::unique_ptr<QBManager> newBackupManager() = 0;
  virtual LogSinks logs() = 0;
  // A stopped source that delivers on the default-priority concurrent global queue.
  virtual std::unique_ptr<MemoryPressureSource> newMemoryPressureSource() = 0;
  virtual bool isMainThread() = 0;
  // The home directory of the user "mobile", an absolute device path.
  virtual std::string mobileHomeDirectory() = 0;
  // The decoder that the plug-in uses where it would use `own`, its own one. A platform may put
  // something around it; asked for at every reconcile.
  virtual std::shared_ptr<KXSTransportDecoder> snapshotDecoder(
      std::shared_ptr<KXSTransportDecoder> own) {
    return own;
  }

  OncePerPlatform& once() { return once_; }

 private:
  OncePerPlatform once_;
};

}  // namespace kx
