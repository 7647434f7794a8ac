#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/foundation/Error.h"

namespace kx {

// What quarryd does with media files, by absolute device path. Called on quarryd's thread alone,
// one call at a time. Errors have the device's domain (DeviceError) and name the path.
class MediaStore {
 public:
  struct Arrived {
    std::int64_t size = 0;
    std::string extension;  // from the content, without dot: "JPG", ..., "DAT" when unknown
  };

  virtual ~MediaStore() = default;
  // Looks at a file that arrived: a regular file of one link that is not empty. kBadFile otherwise.
  virtual std::optional<Arrived> inspect(const std::string& path, ErrorPtr* error) = 0;
  // Gives the file its final name, which nothing may have yet. The arrived file is gone afterwards.
  virtual bool place(const std::string& from, const std::string& to, ErrorPtr* error) = 0;
  // Makes the contents and the names of placed files durable.
  virtual bool makeDurable(const std::vector<std::string>& paths, ErrorPtr* error) = 0;
  // A missing file is no error.
  virtual bool remove(const std::string& path, ErrorPtr* error) = 0;
};

// Puts something around the device's own media store, for example to make its operations fail.
using MediaStoreDecorator = std::function<std::unique_ptr<MediaStore>(std::unique_ptr<MediaStore>)>;

}  // namespace kx
