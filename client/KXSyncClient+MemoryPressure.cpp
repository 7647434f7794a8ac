#include "client/KXSyncClient.h"

namespace kx {
namespace {

constexpr const char* kMemoryPressureSource = "KXSyncClient+MemoryPressure";

// Turns every registered object into a fault, so that its memory can be had back; unsaved changes
// are kept.
void refaultRegisteredObjects(KXManagedObjectContext& context) {
  int count = 0;
  for (const std::shared_ptr<KXManagedObject>& object : context.registeredObjects()) {
    context.refreshObject(object, object->hasChanges());
    ++count;
  }
  KX_LOG(kMemoryPressureSource, "_startListeningToMemoryPressureEvents", LogLevel::kDebug,
         "Re-faulted %d objects.", count);
}

}  // namespace

void KXSyncClient::_startListeningToMemoryPressureEvents() {
  if (memoryPressureSource_) return;
  memoryPressureSource_ = platform_.newMemoryPressureSource();
  // The library of this moment, which may be none; the client itself is not needed.
  memoryPressureSource_->setEventHandler([library = library_] {
    if (!library) return;
    library->performBlock([library] { refaultRegisteredObjects(library->managedObjectContext()); });
  });
  memoryPressureSource_->resume();
}

void KXSyncClient::_stopListeningToMemoryPressureEvents() {
  if (!memoryPressureSource_) return;
  memoryPressureSource_->cancel();
  memoryPressureSource_ = nullptr;
}

}  // namespace kx
