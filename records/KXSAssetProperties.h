#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/files/ImageReader.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/Value.h"
#include "records/KXSItem.h"

namespace kx {

class KXSAssetProperties;
using KXSAssetPropertiesPtr = std::shared_ptr<KXSAssetProperties>;

// Image and file properties read from an asset's file; the dictionaries are carried, never
// interpreted. Shared by reference; read from any thread, set on one thread at a time. Getters
// raise TypeError when the value has another type.
class KXSAssetProperties final : public Archivable, public KXSTransportCoding {
 public:
  // A new empty record.
  static KXSAssetPropertiesPtr assetProperties() { return init(); }
  static KXSAssetPropertiesPtr init() { return std::make_shared<KXSAssetProperties>(); }
  static KXSAssetPropertiesPtr initFromPropertyList(const Value& dictionary);
  static KXSAssetPropertiesPtr initWithCoder(KeyedUnarchiver& coder);

  // Reads the properties of the file's first image, its attributes and its name. False, with
  // nothing changed and no error written, when it is no image or has no properties.
  bool readPropertiesFromAssetURL(ImageReader& reader, const std::string& path, ErrorPtr* error);

  std::string_view archiveClassName() const override { return "KXSAssetProperties"; }
  void encodeWithCoder(KeyedArchiver& coder) const override;
  Value propertyList() const override;

  // Dictionaries or null.
  Value imageProperties() const;
  void setImageProperties(Value properties) { imageProperties_ = std::move(properties); }
  Value fileSystemProperties() const;
  void setFileSystemProperties(Value properties) { fileSystemProperties_ = std::move(properties); }
  // Last path component of the file.
  OptionalString fileName() const { return fileName_.asString(kKXSAssetPropertiesFileNameKey); }
  void setFileName(OptionalString name) { fileName_ = Value::optionalString(name); }

 private:
  Value imageProperties_;
  Value fileSystemProperties_;
  Value fileName_;
};

}  // namespace kx
