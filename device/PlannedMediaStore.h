#pragma once

#include <string>
#include <vector>

#include "device/MediaStore.h"

namespace kx {

// The media store of a device that is only planned with: takes every file for whole and moves none.
class PlannedMediaStore : public MediaStore {
 public:
  std::optional<Arrived> inspect(const std::string&, ErrorPtr*) override {
    return Arrived{1, "DAT"};
  }
  bool place(const std::string&, const std::string&, ErrorPtr*) override { return true; }
  bool makeDurable(const std::vector<std::string>&, ErrorPtr*) override { return true; }
  bool remove(const std::string&, ErrorPtr*) override { return true; }
};

}  // namespace kx
