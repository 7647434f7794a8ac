#pragma once

#include <string>

#include "platform/foundation/Value.h"

namespace kx {

// Reads the metadata of an image file. Any thread.
class ImageReader {
 public:
  virtual ~ImageReader() = default;

  struct Source {
    bool isImage = false;        // an image source could be made
    Value properties;            // dictionary of the first image's properties, null when none
    std::string typeIdentifier;  // MIME type that the content shows
  };
  virtual Source open(const std::string& path) = 0;
  // The file's file-system attributes, a dictionary; null when they cannot be read.
  virtual Value fileAttributes(const std::string& path) = 0;
};

}  // namespace kx
