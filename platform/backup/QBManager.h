#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/foundation/Error.h"

namespace kx {

// One file that a restore is bringing back.
struct QBFile {
  std::string path;  // absolute device path
};

// The backup service's manager. Made for one use, on any thread.
class QBManager {
 public:
  virtual ~QBManager() = default;
  // The files of one backup domain that the restore under way is bringing back; nullopt (with or
  // without an error) when the list cannot be had. Outside a restore: an empty list, no error.
  virtual std::optional<std::vector<QBFile>> restoreFilesForDomain(const std::string& domain,
                                                                   ErrorPtr* error) = 0;
};

inline constexpr const char* kQBShoeboxDomain = "ShoeboxDomain";

}  // namespace kx
