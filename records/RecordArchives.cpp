#include "records/RecordArchives.h"

#include "records/KXSAlbum.h"
#include "records/KXSAsset.h"
#include "records/KXSEvent.h"
#include "records/KXSFolder.h"
#include "records/KXSImageAdjustment.h"
#include "records/KXSUUID.h"

namespace kx {

ArchiveClasses recordArchiveClasses() {
  ArchiveClasses classes;
  classes.add("KXSUUID", KXSUUID::initWithCoder)
      .add("KXSItem", KXSItem::initWithCoder)
      .add("KXSFolder", KXSFolder::initWithCoder)
      .add("KXSEvent", KXSEvent::initWithCoder)
      .add("KXSAlbum", KXSAlbum::initWithCoder)
      .add("KXSAsset", KXSAsset::initWithCoder)
      .add("KXSAssetProperties", KXSAssetProperties::initWithCoder)
      .add("KXSImageAdjustment", KXSImageAdjustment::initWithCoder);
  return classes;
}

}  // namespace kx
