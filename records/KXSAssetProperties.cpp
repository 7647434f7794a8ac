#include "records/KXSAssetProperties.h"

#include "platform/foundation/Text.h"

namespace kx {
namespace {

// Null or a dictionary; TypeError otherwise.
const Value& checkedDictionary(const Value& value, std::string_view key) {
  value.asDictionary(key);
  return value;
}

}  // namespace

KXSAssetPropertiesPtr KXSAssetProperties::initFromPropertyList(const Value& dictionary) {
  auto properties = init();
  const auto view = dictionary.asDictionary(kKXSAssetPropertiesKey);
  if (!view) return properties;
  properties->imageProperties_ = view->find(kKXSAssetPropertiesImagePropertiesKey);
  properties->fileSystemProperties_ = view->find(kKXSAssetPropertiesFilePropertiesKey);
  properties->fileName_ = view->find(kKXSAssetPropertiesFileNameKey);
  return properties;
}

KXSAssetPropertiesPtr KXSAssetProperties::initWithCoder(KeyedUnarchiver& coder) {
  auto properties = init();
  properties->fileName_ = coder.decodeValue(kKXSAssetPropertiesFileNameKey);
  properties->imageProperties_ = coder.decodeValue(kKXSAssetPropertiesImagePropertiesKey);
  properties->fileSystemProperties_ = coder.decodeValue(kKXSAssetPropertiesFilePropertiesKey);
  return properties;
}

bool KXSAssetProperties::readPropertiesFromAssetURL(ImageReader& reader, const std::string& path,
                                                    ErrorPtr* /*error*/) {
  const ImageReader::Source source = reader.open(path);
  if (!source.isImage || !source.properties.isDictionary()) return false;
  Dictionary properties(source.properties.dictionaryValue());
  properties.set(kMQFileUTTypeKey, Value::string(source.typeIdentifier));
  imageProperties_ = Value::dictionary(std::move(properties));
  fileSystemProperties_ = reader.fileAttributes(path);
  fileName_ = Value::string(lastPathComponent(path));
  return true;
}

void KXSAssetProperties::encodeWithCoder(KeyedArchiver& coder) const {
  coder.encodeValue(kKXSAssetPropertiesFileNameKey, fileName_);
  coder.encodeValue(kKXSAssetPropertiesImagePropertiesKey, imageProperties_);
  coder.encodeValue(kKXSAssetPropertiesFilePropertiesKey, fileSystemProperties_);
}

Value KXSAssetProperties::propertyList() const {
  Dictionary dictionary;
  dictionary.setIfPresent(kKXSAssetPropertiesImagePropertiesKey, imageProperties_);
  dictionary.setIfPresent(kKXSAssetPropertiesFilePropertiesKey, fileSystemProperties_);
  dictionary.setIfPresent(kKXSAssetPropertiesFileNameKey, fileName_);
  return Value::dictionary(std::move(dictionary));
}

Value KXSAssetProperties::imageProperties() const {
  return checkedDictionary(imageProperties_, kKXSAssetPropertiesImagePropertiesKey);
}

Value KXSAssetProperties::fileSystemProperties() const {
  return checkedDictionary(fileSystemProperties_, kKXSAssetPropertiesFilePropertiesKey);
}

}  // namespace kx
