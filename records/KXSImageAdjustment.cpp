#include "records/KXSImageAdjustment.h"

namespace kx {

KXSImageAdjustmentPtr KXSImageAdjustment::init() {
  auto adjustment = std::make_shared<KXSImageAdjustment>();
  adjustment->rotation_ = Value::real(0.0);
  return adjustment;
}

KXSImageAdjustmentPtr KXSImageAdjustment::initWithCoder(KeyedUnarchiver& coder) {
  auto adjustment = std::make_shared<KXSImageAdjustment>();
  adjustment->rotation_ = coder.decodeValue(kKXSImageAdjustmentsRotationKey);
  return adjustment;
}

std::string KXSImageAdjustment::description() const {
  return "rotation: " + rotation_.description();
}

void KXSImageAdjustment::encodeWithCoder(KeyedArchiver& coder) const {
  coder.encodeValue(kKXSImageAdjustmentsRotationKey, rotation_);
}

}  // namespace kx
