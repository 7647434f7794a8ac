#include <algorithm>
#include <bit>
#include <cstring>
#include <limits>

#include "platform/foundation/Hash.h"
#include "platform/foundation/PropertyListDocument.h"
#include "platform/foundation/PropertyListFailure.h"
#include "platform/foundation/PropertyListWriters.h"
#include "platform/foundation/Utf8.h"
#include "platform/foundation/ValueStorage.h"

namespace kx {
namespace {

constexpr char kMagic[] = "bplist00";
constexpr std::size_t kHeaderBytes = 8;
constexpr std::size_t kTrailerBytes = 32;

// One object of the file to be. Text, data and storage are borrowed from the root value.
struct Object {
  const void* pointer;  // text, data; container: its storage
  std::uint64_t bits;   // scalars; container in a document: which it is
  std::uint32_t size;   // text: bytes, data: bytes, container: elements
  std::uint32_t extra;  // text: UTF-16 units; container: where its references start
  Kind kind;
  Number::Type type;
  std::uint8_t height;  // containers: nesting at and below it, 0 while it is being walked
  bool isAscii;
};

unsigned bytesFor(std::uint64_t value) {
  if (value <= 0xFF) return 1;
  if (value <= 0xFFFF) return 2;
  return value <= 0xFFFFFFFF ? 4 : 8;
}

// Hash to object number, open addressing; the caller compares.
class ObjectTable {
 public:
  ObjectTable() : slots_(1024) {}

  // The number of the equal object, or `fresh`, which is then stored.
  template <typename Equals>
  std::uint32_t findOrAdd(std::uint64_t hash, std::uint32_t fresh, Equals equals) {
    if ((used_ + 1) * 2 > slots_.size()) grow();
    const auto tag = static_cast<std::uint32_t>(hash >> 32);
    const std::size_t mask = slots_.size() - 1;
    std::size_t slot = tag & mask;
    for (; slots_[slot].object != 0; slot = (slot + 1) & mask) {
      if (slots_[slot].tag == tag && equals(slots_[slot].object - 1)) {
        return slots_[slot].object - 1;
      }
    }
    slots_[slot] = {tag, fresh + 1};
    ++used_;
    return fresh;
  }

 private:
  struct Slot {
    std::uint32_t tag = 0;
    std::uint32_t object = 0;  // plus 1; 0 is free
  };
  void grow() {
    std::vector<Slot> old(slots_.size() * 2);
    old.swap(slots_);
    const std::size_t mask = slots_.size() - 1;
    for (const Slot& entry : old) {
      if (entry.object == 0) continue;
      std::size_t slot = entry.tag & mask;
      while (slots_[slot].object != 0) slot = (slot + 1) & mask;
      slots_[slot] = entry;
    }
  }
  std::vector<Slot> slots_;
  std::size_t used_ = 0;
};

// Numbers the values from the root on, depth first, equal ones once; keeps a stack of its own.
class Flattener {
 public:
  void run(const Value& root) {
    try {
      stack_.reserve(limits::kNestingDepth);
      add(root);
      while (!stack_.empty()) step();
    } catch (PropertyListFailure& failure) {
      failure.setPath(path());
      throw;
    }
  }
  const std::vector<Object>& objects() const { return objects_; }
  const std::vector<std::uint32_t>& references() const { return references_; }

 private:
  struct Frame {
    std::uint32_t object;
    std::uint32_t next;
    std::uint8_t height;
    bool isDictionary;
    const PropertyListDocument* document;  // null: built in memory
    std::uint32_t documentPlace;           // of its references
    const void* content;                   // Array or DictionaryContent
  };

  // Gives the value a number; a container that is new goes on the stack.
  std::uint32_t add(const Value& value) {
    switch (value.kind()) {
      case Kind::kNull:
        failNull();
      case Kind::kString:
        return addText(value);
      case Kind::kData:
        return addData(value);
      case Kind::kArray:
      case Kind::kDictionary:
        return addContainer(value);
      case Kind::kDate:
        requireDate(value.dateValue().secondsSinceReference);
        return addScalar(value);
      default:
        return addScalar(value);
    }
  }
  std::uint32_t nextNumber() const { return static_cast<std::uint32_t>(objects_.size()); }
  std::uint32_t append(const Object& object) {
    if (objects_.size() >= limits::kObjects) {
      throw PropertyListFailure(PropertyListError::kLimit, "too many different values");
    }
    objects_.push_back(object);
    return nextNumber() - 1;
  }
  std::uint32_t addScalar(const Value& value) {
    const Object fresh{nullptr,      ValueAccess::bits(value),       0, 0,
                       value.kind(), ValueAccess::numberType(value), 0, false};
    const auto tag =
        static_cast<std::uint64_t>(fresh.kind) * 16 + static_cast<std::uint64_t>(fresh.type);
    const std::uint32_t number = table_.findOrAdd(
        hashNumber(fresh.bits, tag, seed_), nextNumber(), [&](std::uint32_t other) {
          const Object& o = objects_[other];
          return o.kind == fresh.kind && o.type == fresh.type && o.bits == fresh.bits;
        });
    return number == nextNumber() ? append(fresh) : number;
  }
  std::uint32_t findText(Kind kind, std::string_view text) {
    return table_.findOrAdd(
        hashBytes(text.data(), text.size(), seed_) ^ static_cast<std::uint64_t>(kind) << 40,
        nextNumber(), [&](std::uint32_t other) {
          const Object& o = objects_[other];
          return o.kind == kind && o.size == text.size() &&
                 (o.size == 0 || o.pointer == text.data() ||
                  std::memcmp(o.pointer, text.data(), o.size) == 0);
        });
  }
  std::uint32_t addText(const Value& value) {
    const std::string_view text = ValueAccess::text(value);
    const std::uint32_t number = findText(Kind::kString, text);
    if (number != nextNumber()) return number;
    const TextClass textClass = classifyText(text);
    return append(Object{text.data(), 0, static_cast<std::uint32_t>(text.size()),
                         static_cast<std::uint32_t>(textClass.utf16Units), Kind::kString,
                         Number::Type::kInteger, 0, textClass.isAscii});
  }
  std::uint32_t addData(const Value& value) {
    const std::string_view bytes = ValueAccess::text(value);
    requireDataSize(bytes.size());
    const std::uint32_t number = findText(Kind::kData, bytes);
    if (number != nextNumber()) return number;
    return append(Object{bytes.data(), 0, static_cast<std::uint32_t>(bytes.size()), 0, Kind::kData,
                         Number::Type::kInteger, 0, false});
  }
  std::uint32_t addContainer(const Value& value) {
    const ValueStorage* owner = ValueAccess::owner(value);
    const PropertyListDocument* document = ValueAccess::document(value);
    const std::uint64_t bits = document == nullptr ? 0 : ValueAccess::bits(value);
    const std::uint64_t hash =
        hashNumber(reinterpret_cast<std::uintptr_t>(owner), bits * 2 + 1, seed_);
    const bool isDictionary = value.isDictionary();
    const std::uint32_t number = table_.findOrAdd(hash, nextNumber(), [&](std::uint32_t other) {
      const Object& o = objects_[other];
      return o.kind == value.kind() && o.pointer == owner && o.bits == bits;
    });
    if (number != nextNumber()) {
      noteHeight(objects_[number].height);
      return number;
    }
    if (stack_.size() >= limits::kNestingDepth) failDepth();
    const std::uint32_t size = ValueAccess::size(value);
    const std::size_t start = references_.size();
    const std::size_t count = std::size_t{size} * (isDictionary ? 2 : 1);
    if (count > std::numeric_limits<std::uint32_t>::max() - start) {
      throw PropertyListFailure(PropertyListError::kLimit, "too many elements");
    }
    append(Object{owner, bits, size, static_cast<std::uint32_t>(start), value.kind(),
                  Number::Type::kInteger, 0, false});
    references_.resize(start + count);
    const void* content = nullptr;
    if (document == nullptr) {
      content = isDictionary ? static_cast<const void*>(&ValueAccess::content(value))
                             : static_cast<const void*>(&ValueAccess::elements(value));
    }
    stack_.push_back(Frame{number, 0, 0, isDictionary, document,
                           document == nullptr ? 0 : ValueAccess::place(value), content});
    if (isDictionary) addKeys(stack_.size() - 1);
    return number;
  }
  void addKeys(std::size_t depth) {
    const Frame frame = stack_[depth];
    const Object container = objects_[frame.object];
    for (std::uint32_t i = 0; i < container.size; ++i) {
      std::uint32_t key = 0;
      if (frame.document != nullptr) {
        key = addText(frame.document->valueAt(frame.document->reference(frame.documentPlace, i)));
      } else {
        const auto* content = static_cast<const DictionaryContent*>(frame.content);
        key = addText(content->entries()[i].key);
      }
      const Object& text = objects_[key];
      requireKey({static_cast<const char*>(text.pointer), text.size});
      references_[container.extra + i] = key;
    }
  }
  // The top container's elements up to the next one that goes on the stack, or to its end.
  void step() {
    const std::size_t depth = stack_.size();
    const std::uint32_t number = stack_.back().object;
    const std::uint32_t count = objects_[number].size;
    std::size_t place = objects_[number].extra;
    if (stack_.back().isDictionary) place += count;
    while (stack_.size() == depth) {
      Frame& frame = stack_.back();
      if (frame.next == count) {
        leave();
        return;
      }
      const std::uint32_t index = frame.next++;
      references_[place + index] = addElement(frame, index);
    }
  }
  std::uint32_t addElement(const Frame& frame, std::uint32_t index) {
    if (frame.document != nullptr) {
      const std::size_t keys = frame.isDictionary ? objects_[frame.object].size : 0;
      return add(
          frame.document->valueAt(frame.document->reference(frame.documentPlace, keys + index)));
    }
    if (frame.isDictionary) {
      return add(static_cast<const DictionaryContent*>(frame.content)->entries()[index].value);
    }
    return add((*static_cast<const Array*>(frame.content))[index]);
  }
  // A container of this height stands below the top of the stack.
  void noteHeight(std::uint8_t height) {
    if (stack_.size() + height > limits::kNestingDepth) failDepth();
    if (!stack_.empty()) stack_.back().height = std::max(stack_.back().height, height);
  }
  void leave() {
    const Frame frame = stack_.back();
    const auto height = static_cast<std::uint8_t>(frame.height + 1);
    objects_[frame.object].height = height;
    stack_.pop_back();
    noteHeight(height);
  }
  std::string path() const {
    std::string result;
    for (const Frame& frame : stack_) {
      if (frame.next == 0) continue;
      const std::uint32_t index = frame.next - 1;
      if (!frame.isDictionary) {
        appendArrayStep(result, index);
        continue;
      }
      const Object& key = objects_[references_[objects_[frame.object].extra + index]];
      appendDictionaryStep(result, {static_cast<const char*>(key.pointer), key.size});
    }
    return result;
  }

  const HashSeed seed_ = processHashSeed();
  std::vector<Object> objects_;
  std::vector<std::uint32_t> references_;
  std::vector<Frame> stack_;
  ObjectTable table_;
};

std::size_t lengthBytes(std::uint64_t count) { return count < 15 ? 1 : 2 + bytesFor(count); }

unsigned integerBytes(const Object& object) {
  if (object.type == Number::Type::kUnsigned) return 16;
  return static_cast<std::int64_t>(object.bits) < 0 ? 8 : bytesFor(object.bits);
}

std::size_t numberBytes(const Object& object) {
  switch (object.type) {
    case Number::Type::kBoolean:
      return 1;
    case Number::Type::kReal32:
      return 5;
    case Number::Type::kReal64:
      return 9;
    default:
      return 1 + integerBytes(object);
  }
}

// Lays the objects out: header, objects, offset table, trailer.
class Emitter {
 public:
  Emitter(const std::vector<Object>& objects, const std::vector<std::uint32_t>& references)
      : objects_(objects), references_(references), referenceBytes_(bytesFor(objects.size() - 1)) {}

  std::vector<std::uint8_t> run() {
    std::size_t end = kHeaderBytes;
    for (const Object& object : objects_) end += sizeOf(object);
    const unsigned offsetBytes = bytesFor(end);
    requireFileSize(end + objects_.size() * offsetBytes + kTrailerBytes);
    std::vector<std::uint8_t> bytes(end + objects_.size() * offsetBytes + kTrailerBytes);
    out_ = bytes.data();
    std::uint8_t* table = out_ + end;
    std::memcpy(out_, kMagic, kHeaderBytes);
    out_ += kHeaderBytes;
    for (const Object& object : objects_) {
      storeBig(table, static_cast<std::uint64_t>(out_ - bytes.data()), offsetBytes);
      table += offsetBytes;
      write(object);
    }
    table[6] = static_cast<std::uint8_t>(offsetBytes);
    table[7] = static_cast<std::uint8_t>(referenceBytes_);
    storeBig(table + 8, objects_.size(), 8);
    storeBig(table + 24, end, 8);
    return bytes;
  }

 private:
  static void storeBig(std::uint8_t* to, std::uint64_t value, unsigned size) {
    for (unsigned i = size; i-- > 0; value >>= 8) to[i] = static_cast<std::uint8_t>(value);
  }
  void put(unsigned byte) { *out_++ = static_cast<std::uint8_t>(byte); }
  void putBig(std::uint64_t value, unsigned size) {
    storeBig(out_, value, size);
    out_ += size;
  }
  void putLength(unsigned marker, std::uint64_t count) {
    if (count < 15) {
      put(marker | static_cast<unsigned>(count));
      return;
    }
    put(marker | 15);
    const unsigned size = bytesFor(count);
    put(0x10U | static_cast<unsigned>(std::countr_zero(size)));
    putBig(count, size);
  }

  std::size_t sizeOf(const Object& object) const {
    switch (object.kind) {
      case Kind::kNumber:
        return numberBytes(object);
      case Kind::kDate:
        return 9;
      case Kind::kUid:
        return 1 + bytesFor(object.bits);
      case Kind::kString:
        return lengthBytes(object.extra) +
               (object.isAscii ? std::size_t{1} : std::size_t{2}) * object.extra;
      case Kind::kData:
        return lengthBytes(object.size) + object.size;
      default:
        return lengthBytes(object.size) +
               std::size_t{object.size} * referenceBytes_ * (object.kind == Kind::kArray ? 1 : 2);
    }
  }
  void write(const Object& object) {
    switch (object.kind) {
      case Kind::kNumber:
        return writeNumber(object);
      case Kind::kDate:
        put(0x33);
        return putBig(object.bits, 8);
      case Kind::kUid: {
        const unsigned size = bytesFor(object.bits);
        put(0x80 | (size - 1));
        return putBig(object.bits, size);
      }
      case Kind::kString:
        return writeText(object);
      case Kind::kData:
        putLength(0x40, object.size);
        if (object.size != 0) std::memcpy(out_, object.pointer, object.size);
        out_ += object.size;
        return;
      default:
        return writeContainer(object);
    }
  }
  void writeNumber(const Object& object) {
    switch (object.type) {
      case Number::Type::kBoolean:
        return put(object.bits != 0 ? 0x09 : 0x08);
      case Number::Type::kReal32: {
        const auto value = static_cast<float>(std::bit_cast<double>(object.bits));
        put(0x22);
        return putBig(std::bit_cast<std::uint32_t>(value), 4);
      }
      case Number::Type::kReal64:
        put(0x23);
        return putBig(object.bits, 8);
      default:
        break;
    }
    const unsigned size = integerBytes(object);
    put(0x10U | static_cast<unsigned>(std::countr_zero(size)));
    if (size == 16) putBig(0, 8);
    putBig(object.bits, std::min(size, 8U));
  }
  void writeText(const Object& object) {
    const std::string_view text(static_cast<const char*>(object.pointer), object.size);
    if (object.isAscii) {
      putLength(0x50, object.size);
      if (object.size != 0) std::memcpy(out_, text.data(), text.size());
      out_ += text.size();
      return;
    }
    putLength(0x60, object.extra);
    for (std::size_t at = 0; at < text.size();) {
      const Utf8Unit unit = decodeUtf8(text, at);
      at += unit.length;
      if (unit.point < 0x10000) {
        putBig(unit.point, 2);
      } else {
        putBig(0xD800 + ((unit.point - 0x10000) >> 10), 2);
        putBig(0xDC00 + ((unit.point - 0x10000) & 0x3FF), 2);
      }
    }
  }
  void writeContainer(const Object& object) {
    const bool isArray = object.kind == Kind::kArray;
    putLength(isArray ? 0xA0 : 0xD0, object.size);
    const std::size_t count = std::size_t{object.size} * (isArray ? 1 : 2);
    for (std::size_t i = 0; i < count; ++i) {
      putBig(references_[object.extra + i], referenceBytes_);
    }
  }

  const std::vector<Object>& objects_;
  const std::vector<std::uint32_t>& references_;
  const unsigned referenceBytes_;
  std::uint8_t* out_ = nullptr;
};

}  // namespace

std::vector<std::uint8_t> writeBinaryPropertyList(const Value& root) {
  Flattener flattener;
  flattener.run(root);
  return Emitter(flattener.objects(), flattener.references()).run();
}

}  // namespace kx
