#include "device/ReadAhead.h"

#include <utility>

namespace kx {

void ReadAhead::start(const std::shared_ptr<LibraryStore>& store) {
  isOn_ = true;
  store->queue().async([self = shared_from_this(), store] {
    if (!self->isOn_) return;
    std::shared_ptr<LibraryContext> context = self->take();
    if (!context) context = std::make_shared<LibraryContext>(store);
    context->readAhead(self->isOn_);
    self->giveBack(std::move(context));
  });
}

void ReadAhead::stop(LibraryStore& store) {
  isOn_ = false;
  store.queue().async([self = shared_from_this()] { self->context_.reset(); });
}

void ReadAhead::giveBack(std::shared_ptr<LibraryContext> context) {
  if (isOn_ && !context_ && !context->hasChanges()) context_ = std::move(context);
}

}  // namespace kx
