// The archive reader over any bytes and over tables of objects built from them. Only the allowed
// class is ever made, each object once; what was read can be archived and read again.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/PropertyList.h"

namespace {

constexpr std::size_t kMostBytes = std::size_t{64} << 10;

void require(bool holds) {
  if (!holds) std::abort();
}

int nodesMade = 0;

class Node : public kx::Archivable {
 public:
  std::string_view archiveClassName() const override { return "Node"; }
  void encodeWithCoder(kx::KeyedArchiver& coder) const override {
    coder.encodeValue("v", value_);
    coder.encodeObject("l", left_);
    coder.encodeObject("r", right_);
    coder.encodeObjectMap("m", map_.get());
  }
  static kx::ArchivablePtr make(kx::KeyedUnarchiver& coder) {
    ++nodesMade;
    auto node = std::make_shared<Node>();
    node->value_ = coder.decodeValue("v");
    node->left_ = coder.decodeObject("l", "Node");
    node->right_ = coder.decodeObject("r");
    node->map_ = coder.decodeObjectMap("m", "Node");
    return node;
  }

 private:
  kx::Value value_;
  kx::ArchivablePtr left_;
  kx::ArchivablePtr right_;
  std::shared_ptr<kx::ArchivableMap> map_;
};

using Bytes = std::vector<std::uint8_t>;

// Takes bytes one by one; zeros when there are no more.
class Source {
 public:
  Source(const std::uint8_t* data, std::size_t size) : data_(data), size_(size) {}
  bool isEmpty() const { return at_ >= size_; }
  unsigned next() { return isEmpty() ? 0 : data_[at_++]; }

 private:
  const std::uint8_t* data_;
  std::size_t size_;
  std::size_t at_ = 0;
};

kx::Value anything(Source& source) {
  switch (source.next() % 6) {
    case 0:
      return kx::Value::uid(source.next());
    case 1:
      return kx::Value::integer(static_cast<std::int64_t>(source.next()));
    case 2:
      return kx::Value::array({kx::Value::uid(source.next())});
    case 3:
      return kx::Value::dictionary({{"keys", kx::Value::array({})}});
    default:
      return kx::Value::string("text");
  }
}

kx::Value reference(Source& source) {
  const unsigned target = source.next();
  return target == 255 ? anything(source) : kx::Value::uid(target);
}

// An object with a few fields, mostly as they should be.
kx::Value object(Source& source) {
  const unsigned shape = source.next();
  kx::Dictionary fields{{"class", kx::Value::string(shape % 32 == 31 ? "Other" : "Node")}};
  if ((shape & 1) != 0) fields.set("values", kx::Value::dictionary({{"v", anything(source)}}));
  kx::Dictionary references;
  if ((shape & 2) != 0) references.set("l", reference(source));
  if ((shape & 4) != 0) references.set("r", reference(source));
  if (!references.empty()) fields.set("references", kx::Value::dictionary(references));
  if ((shape & 8) != 0) {
    kx::Array keys;
    kx::Array targets;
    for (unsigned count = source.next() % 4; count > 0; --count) {
      keys.push_back(kx::Value::string(std::to_string(source.next() % 64)));
      targets.push_back(reference(source));
    }
    const kx::Value map = kx::Value::dictionary(
        {{"keys", kx::Value::array(keys)}, {"objects", kx::Value::array(targets)}});
    fields.set("maps", kx::Value::dictionary({{"m", map}}));
  }
  if (shape >= 0xF8) fields.set("values", anything(source));
  return kx::Value::dictionary(std::move(fields));
}

Bytes builtArchive(Source& source) {
  kx::Array objects;
  while (!source.isEmpty()) objects.push_back(object(source));
  const kx::Value file = kx::Value::dictionary({{"archiver", kx::Value::string("KXKeyedArchiver")},
                                                {"version", kx::Value::integer(1)},
                                                {"root", kx::Value::uid(0)},
                                                {"objects", kx::Value::array(std::move(objects))}});
  kx::ErrorPtr error;
  Bytes bytes = kx::writePropertyList(file, kx::PropertyListFormat::kBinary, &error);
  require(error == nullptr);
  return bytes;
}

kx::ArchivablePtr unarchived(Bytes bytes, kx::ErrorPtr* error) {
  kx::ArchiveClasses classes;
  classes.add("Node", Node::make);
  return kx::KeyedUnarchiver::unarchivedObject(std::make_shared<kx::Data>(std::move(bytes)),
                                               classes, error);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size > kMostBytes) return 0;
  Source source(data, size);
  const bool isBuilt = source.next() == 'G';
  Bytes bytes = isBuilt ? builtArchive(source) : Bytes(data, data + size);
  const std::size_t length = bytes.size();
  kx::ErrorPtr error;
  nodesMade = 0;
  const kx::ArchivablePtr root = unarchived(std::move(bytes), &error);
  require((root == nullptr) == (error != nullptr));
  require(static_cast<std::size_t>(nodesMade) <= length);
  if (root == nullptr) return 0;
  require(root->archiveClassName() == "Node");
  const int made = nodesMade;
  // Values gain a level in the archive's own containers, so the deepest cannot be written again.
  const Bytes first = kx::KeyedArchiver::archivedData(root, &error);
  if (error != nullptr) {
    require(error->code() == static_cast<std::int64_t>(kx::PropertyListError::kDepth));
    return 0;
  }
  nodesMade = 0;
  const kx::ArchivablePtr again = unarchived(first, &error);
  require(again != nullptr && error == nullptr && nodesMade == made);
  require(kx::KeyedArchiver::archivedData(again, &error) == first);
  return 0;
}
