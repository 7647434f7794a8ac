#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Date.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/Value.h"
#include "platform/library/KXManagedObjects.h"

namespace kx {

// A job for the asset daemon: import one file, clean up after a sync, or seal a sync. Filled by the
// plug-in, handed over in serialized form. Fields that were never set are null and are not written.
// Not for use from two threads at once.
class KXSyncSaveJob {
 public:
  using FinishedBlock = std::function<void(const ErrorPtr&)>;

  virtual ~KXSyncSaveJob() = default;

  struct Fields {
    std::optional<std::string> originalAssetPath;  // absolute device path of the file URL
    bool isVideo = false;
    std::optional<std::string> uuid;
    std::optional<Coordinate> location;
    Value facesInfo;  // array of face dictionaries in the host's form, or null
    std::optional<Date> creationDate;
    std::optional<Date> modificationDate;
    std::optional<double> sortToken;
    std::optional<std::string> originalFileName;
    std::optional<std::vector<std::string>> albumURIs;  // a set, in order of insertion
    bool isSyncComplete = false;
    bool cleanupSyncState = false;
    std::optional<Date> cleanupBeforeDate;
  };

  const Fields& fields() const { return fields_; }

  void setOriginalAssetURL(std::string devicePath) {
    fields_.originalAssetPath = std::move(devicePath);
  }
  void setIsVideo(bool isVideo) { fields_.isVideo = isVideo; }
  void setUuid(std::string uuid) { fields_.uuid = std::move(uuid); }
  void setLocation(Coordinate location) { fields_.location = location; }
  void setFacesInfo(Value facesInfo) { fields_.facesInfo = std::move(facesInfo); }
  void setCreationDate(Date date) { fields_.creationDate = date; }
  void setModificationDate(Date date) { fields_.modificationDate = date; }
  void setSortToken(std::optional<double> token) { fields_.sortToken = token; }
  void setOriginalFileName(std::string name) { fields_.originalFileName = std::move(name); }
  void setAlbumURIs(std::vector<std::string> uris) { fields_.albumURIs = std::move(uris); }
  void setIsSyncComplete(bool complete) { fields_.isSyncComplete = complete; }
  void setCleanupSyncState(bool cleanup) { fields_.cleanupSyncState = cleanup; }
  void setCleanupBeforeDate(std::optional<Date> date) { fields_.cleanupBeforeDate = date; }
  void setFinishedBlock(FinishedBlock block) { finishedBlock_ = std::move(block); }
  const FinishedBlock& finishedBlock() const { return finishedBlock_; }

  // The job as a binary property list (docs/formats/save-job.md), without the finished block; null
  // when it has no serialized form.
  virtual DataPtr serializedData() const;
  // Null and an error when the bytes are no job: every field's type is checked.
  static std::optional<Fields> fieldsFromSerializedData(const DataPtr& data, ErrorPtr* error);

  std::string description() const;

 private:
  Fields fields_;
  FinishedBlock finishedBlock_;
};
using KXSyncSaveJobPtr = std::shared_ptr<KXSyncSaveJob>;

}  // namespace kx
