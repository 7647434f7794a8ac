#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/Value.h"
#include "records/TransportKeys.h"

namespace kx {

class KXSImageAdjustment;
using KXSImageAdjustmentPtr = std::shared_ptr<KXSImageAdjustment>;

// A rotation of an image. It has an archived form only: adjustments travel as the host wrote them.
// Shared by reference; read from any thread, set on one thread at a time.
class KXSImageAdjustment final : public Archivable {
 public:
  // Rotation 0.0.
  static KXSImageAdjustmentPtr imageAdjustment() { return init(); }
  static KXSImageAdjustmentPtr init();
  static KXSImageAdjustmentPtr initWithCoder(KeyedUnarchiver& coder);

  std::string description() const;
  std::string_view archiveClassName() const override { return "KXSImageAdjustment"; }
  void encodeWithCoder(KeyedArchiver& coder) const override;

  std::optional<Number> rotation() const {
    return rotation_.asNumber(kKXSImageAdjustmentsRotationKey);
  }
  void setRotation(Value rotation) { rotation_ = std::move(rotation); }

 private:
  Value rotation_;
};

}  // namespace kx
