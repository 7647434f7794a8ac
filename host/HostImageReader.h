#pragma once

#include <string>

#include "platform/files/ImageReader.h"

namespace kx {

// Reads image properties from files of the host's file system, by absolute path; the same
// properties that the snapshot of a folder carries. Links are not followed in the last component.
// Any thread.
class HostImageReader final : public ImageReader {
 public:
  Source open(const std::string& path) override;
  Value fileAttributes(const std::string& path) override;
};

}  // namespace kx
