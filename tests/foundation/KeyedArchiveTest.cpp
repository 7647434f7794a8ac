#include "platform/foundation/KeyedArchive.h"

#include <gtest/gtest.h>

#include "platform/foundation/Exceptions.h"
#include "tests/foundation/PropertyListFiles.h"

namespace kx::test {
namespace {

// A node with a name, any value, two links and a map of links.
class Node : public Archivable {
 public:
  explicit Node(std::string name = {}) : name_(std::move(name)) {}
  std::string_view archiveClassName() const override { return "Node"; }
  void encodeWithCoder(KeyedArchiver& coder) const override {
    coder.encodeValue("name", Value::string(name_));
    coder.encodeValue("extra", extra);
    coder.encodeObject("left", left);
    coder.encodeObject("right", right);
    coder.encodeObjectMap("map", map.get());
  }
  static ArchivablePtr make(KeyedUnarchiver& coder) {
    auto node = std::make_shared<Node>();
    node->name_ = std::string(coder.decodeValue("name").asString("name").value_or("?"));
    node->extra = coder.decodeValue("extra");
    node->left = std::dynamic_pointer_cast<Node>(coder.decodeObject("left", "Node"));
    node->right = std::dynamic_pointer_cast<Node>(coder.decodeObject("right"));
    node->map = coder.decodeObjectMap("map");
    return node;
  }
  const std::string& name() const { return name_; }

  Value extra;
  std::shared_ptr<Node> left;
  std::shared_ptr<Node> right;
  std::shared_ptr<ArchivableMap> map;

 private:
  std::string name_;
};

using NodePtr = std::shared_ptr<Node>;

class Other : public Archivable {
 public:
  std::string_view archiveClassName() const override { return "Other"; }
  void encodeWithCoder(KeyedArchiver&) const override {}
};

ArchiveClasses nodeClasses() {
  ArchiveClasses classes;
  classes.add("Node", Node::make);
  return classes;
}

DataPtr archived(const ArchivablePtr& root) {
  ErrorPtr error;
  std::vector<std::uint8_t> bytes = KeyedArchiver::archivedData(root, &error);
  EXPECT_EQ(error, nullptr) << error->description();
  return std::make_shared<const Data>(std::move(bytes));
}

NodePtr copyOf(const NodePtr& root) {
  ErrorPtr error;
  const ArchivablePtr object =
      KeyedUnarchiver::unarchivedObject(archived(root), nodeClasses(), &error);
  EXPECT_EQ(error, nullptr) << error->description();
  return std::dynamic_pointer_cast<Node>(object);
}

TEST(KeyedArchive, FieldsComeBackAndAbsentOnesAreNull) {
  const auto root = std::make_shared<Node>("root");
  root->extra = Value::dictionary({{"deep", Value::array({Value::uid(0), Value::real(0.5)})}});
  root->right = std::make_shared<Node>("child");
  const NodePtr copy = copyOf(root);
  ASSERT_NE(copy, nullptr);
  EXPECT_EQ(copy->name(), "root");
  EXPECT_EQ(copy->extra, root->extra);
  EXPECT_EQ(copy->left, nullptr);
  EXPECT_EQ(copy->map, nullptr);
  EXPECT_EQ(copy->right->name(), "child");
  EXPECT_TRUE(copy->right->extra.isNull());
}

TEST(KeyedArchive, TheSameObjectTwiceComesBackAsOne) {
  const auto root = std::make_shared<Node>("root");
  root->left = std::make_shared<Node>("shared");
  root->right = root->left;
  root->map = std::make_shared<ArchivableMap>();
  root->map->set("again", root->left);
  root->map->set("equal but another", std::make_shared<Node>("shared"));
  const NodePtr copy = copyOf(root);
  EXPECT_EQ(copy->left, copy->right);
  EXPECT_EQ(*copy->map->find("again"), copy->left);
  EXPECT_NE(*copy->map->find("equal but another"), copy->left);
}

TEST(KeyedArchive, MapsKeepTheirOrderAndAnyKey) {
  const auto root = std::make_shared<Node>("root");
  root->map = std::make_shared<ArchivableMap>();
  const std::string keys[] = {"z", "a", "", std::string(5000, 'k'), "é"};
  for (const std::string& key : keys) root->map->set(key, std::make_shared<Node>(key));
  root->left = std::make_shared<Node>("empty map");
  root->left->map = std::make_shared<ArchivableMap>();
  const NodePtr copy = copyOf(root);
  std::size_t index = 0;
  for (const auto& entry : *copy->map) {
    ASSERT_LT(index, std::size(keys));
    EXPECT_EQ(entry.key.stringValue(), keys[index]);
    EXPECT_EQ(std::dynamic_pointer_cast<Node>(entry.value)->name(), keys[index++]);
  }
  EXPECT_EQ(index, std::size(keys));
  ASSERT_NE(copy->left->map, nullptr);
  EXPECT_TRUE(copy->left->map->empty());
}

// The bytes' content that docs/formats/keyed-archive.md shows.
TEST(KeyedArchive, LayoutIsTheDocumentedOne) {
  const auto root = std::make_shared<Node>("root");
  root->left = std::make_shared<Node>("leaf");
  root->map = std::make_shared<ArchivableMap>();
  root->map->set("k", root->left);
  const Reading file =
      readBytes({reinterpret_cast<const char*>(archived(root)->bytes()), archived(root)->length()});
  const auto object = [](Dictionary fields) { return Value::dictionary(std::move(fields)); };
  EXPECT_EQ(
      file.value,
      object({{"archiver", Value::string("KXKeyedArchiver")},
              {"version", Value::integer(1)},
              {"root", Value::uid(0)},
              {"objects",
               Value::array(
                   {object({{"class", Value::string("Node")},
                            {"values", object({{"name", Value::string("root")}})},
                            {"references", object({{"left", Value::uid(1)}})},
                            {"maps",
                             object({{"map",
                                      object({{"keys", Value::array({Value::string("k")})},
                                              {"objects", Value::array({Value::uid(1)})}})}})}}),
                    object({{"class", Value::string("Node")},
                            {"values", object({{"name", Value::string("leaf")}})}})})}}));
}

NodePtr chain(int length) {
  NodePtr node = std::make_shared<Node>("last");
  for (int i = 1; i < length; ++i) {
    const auto next = std::make_shared<Node>(std::to_string(i));
    next->left = node;
    node = next;
  }
  return node;
}

PropertyListError archiverError(const ArchivablePtr& root) {
  ErrorPtr error;
  EXPECT_TRUE(KeyedArchiver::archivedData(root, &error).empty());
  return error == nullptr ? PropertyListError{} : static_cast<PropertyListError>(error->code());
}

TEST(KeyedArchiver, NestingOfObjectsIsBounded) {
  EXPECT_EQ(copyOf(chain(63))->name(), "62");
  EXPECT_EQ(copyOf(chain(64))->name(), "63");
  EXPECT_EQ(archiverError(chain(65)), PropertyListError::kDepth);
}

TEST(KeyedArchiver, RefusesCyclesNullRootsAndBadValues) {
  const auto root = std::make_shared<Node>("root");
  root->left = std::make_shared<Node>("middle");
  root->left->right = root;
  EXPECT_EQ(archiverError(root), PropertyListError::kArchiveCycle);
  root->left->right = nullptr;
  EXPECT_EQ(archiverError(nullptr), PropertyListError::kArchiveShape);
  root->extra = Value::string("\xFF");
  EXPECT_EQ(archiverError(root), PropertyListError::kWrite);
}

TEST(KeyedArchiver, ManyObjectsAreArchivedAndReadInOrder) {
  const auto root = std::make_shared<Node>("root");
  root->map = std::make_shared<ArchivableMap>();
  for (int i = 0; i < 20'000; ++i) {
    root->map->set("key" + std::to_string(i), std::make_shared<Node>(std::to_string(i)));
  }
  const NodePtr copy = copyOf(root);
  ASSERT_EQ(copy->map->size(), 20'000U);
  int index = 0;
  for (const auto& entry : *copy->map) {
    ASSERT_EQ(std::dynamic_pointer_cast<Node>(entry.value)->name(), std::to_string(index++));
  }
}

// Archives built by hand, to be damaged.
struct ArchiveFile {
  Dictionary top{{"archiver", Value::string("KXKeyedArchiver")},
                 {"version", Value::integer(1)},
                 {"root", Value::uid(0)}};
  Array objects;

  static Value node(Dictionary more = {}) {
    Dictionary fields{{"class", Value::string("Node")}};
    for (std::size_t i = 0; i < more.size(); ++i) fields.set(more.keyAt(i), more.valueAt(i));
    return Value::dictionary(std::move(fields));
  }
  static Value referring(std::uint32_t target) {
    return node({{"references", Value::dictionary({{"left", Value::uid(target)}})}});
  }
  static Value mapping(const Value& keys, const Value& targets) {
    return node(
        {{"maps", Value::dictionary(
                      {{"map", Value::dictionary({{"keys", keys}, {"objects", targets}})}})}});
  }
  std::string bytes() {
    top.set("objects", Value::array(objects));
    return written(Value::dictionary(top));
  }
};

std::string readArchive(const std::string& bytes, const ArchiveClasses& classes = nodeClasses(),
                        std::string_view rootClass = {}) {
  ErrorPtr error;
  const ArchivablePtr object =
      KeyedUnarchiver::unarchivedObject(dataOf(bytes), classes, &error, rootClass);
  if (error == nullptr) return object == nullptr ? "nothing" : "object";
  EXPECT_EQ(object, nullptr);
  EXPECT_EQ(error->domain(), "com.veltro.plist");
  return std::string(propertyListErrorName(static_cast<PropertyListError>(error->code())));
}

TEST(MalformedArchive, HandMadeOneIsRead) {
  ArchiveFile file;
  file.objects = {ArchiveFile::referring(1), ArchiveFile::node()};
  EXPECT_EQ(readArchive(file.bytes()), "object");
  file.top.set("root", Value::uid(1));
  file.objects = {ArchiveFile::node(), ArchiveFile::referring(0)};
  EXPECT_EQ(readArchive(file.bytes()), "object");
}

TEST(MalformedArchive, WrongTop) {
  const auto with = [](const char* key, const Value& value) {
    ArchiveFile file;
    file.objects = {ArchiveFile::node()};
    file.top.set(key, value);
    return readArchive(file.bytes());
  };
  EXPECT_EQ(with("archiver", Value::string("Other")), "E_ARCHIVE_SHAPE");
  EXPECT_EQ(with("archiver", Value::integer(1)), "E_ARCHIVE_SHAPE");
  EXPECT_EQ(with("version", Value::integer(2)), "E_ARCHIVE_SHAPE");
  EXPECT_EQ(with("version", Value::string("1")), "E_ARCHIVE_SHAPE");
  EXPECT_EQ(with("root", Value::integer(0)), "E_ARCHIVE_SHAPE");
  EXPECT_EQ(with("root", Value::uid(1)), "E_ARCHIVE_SHAPE");
  EXPECT_EQ(with("extra", Value::uid(1)), "E_ARCHIVE_SHAPE");
  for (const char* key : {"archiver", "version", "root"}) {
    ArchiveFile file;
    file.objects = {ArchiveFile::node()};
    file.top.remove(key);
    EXPECT_EQ(readArchive(file.bytes()), "E_ARCHIVE_SHAPE") << key;
  }
  EXPECT_EQ(readArchive(written(Value::array({}))), "E_ARCHIVE_SHAPE");
  EXPECT_EQ(readArchive(written(Value::dictionary({}))), "E_ARCHIVE_SHAPE");
  EXPECT_EQ(readArchive("no archive at all"), "E_PLIST_MAGIC");
  ArchiveFile empty;
  EXPECT_EQ(readArchive(empty.bytes()), "E_ARCHIVE_SHAPE");
}

TEST(MalformedArchive, WrongObjects) {
  const Value text = Value::string("text");
  const Value rows[] = {
      text,
      Value::dictionary({}),
      ArchiveFile::node({{"class", Value::integer(1)}}),
      ArchiveFile::node({{"values", text}}),
      ArchiveFile::node({{"references", text}}),
      ArchiveFile::node({{"maps", text}}),
      ArchiveFile::node({{"unknown", text}}),
      ArchiveFile::node({{"references", Value::dictionary({{"left", text}})}}),
      ArchiveFile::node({{"references", Value::dictionary({{"left", Value::integer(0)}})}}),
      ArchiveFile::referring(9),
      ArchiveFile::node({{"maps", Value::dictionary({{"map", text}})}}),
      ArchiveFile::mapping(text, Value::array({})),
      ArchiveFile::mapping(Value::array({}), text),
      ArchiveFile::mapping(Value::array({text}), Value::array({})),
      ArchiveFile::mapping(Value::array({Value::integer(1)}), Value::array({Value::uid(0)})),
      ArchiveFile::mapping(Value::array({text}), Value::array({text})),
      ArchiveFile::mapping(Value::array({text}), Value::array({Value::uid(5)}))};
  for (const Value& object : rows) {
    ArchiveFile file;
    file.objects = {object};
    EXPECT_EQ(readArchive(file.bytes()), "E_ARCHIVE_SHAPE") << object.description();
  }
  ArchiveFile twice;
  twice.objects = {ArchiveFile::mapping(Value::array({text, text}),
                                        Value::array({Value::uid(1), Value::uid(1)})),
                   ArchiveFile::node()};
  EXPECT_EQ(readArchive(twice.bytes()), "E_ARCHIVE_SHAPE");
}

TEST(MalformedArchive, Classes) {
  ArchiveFile file;
  file.objects = {ArchiveFile::referring(1),
                  Value::dictionary({{"class", Value::string("Other")}})};
  EXPECT_EQ(readArchive(file.bytes()), "E_ARCHIVE_CLASS");
  ArchiveClasses both = nodeClasses();
  both.add("Other", [](KeyedUnarchiver&) { return std::make_shared<Other>(); });
  // Allowed, but not as what the node's left link takes.
  EXPECT_EQ(readArchive(file.bytes(), both), "E_ARCHIVE_CLASS");
  file.objects[0] =
      ArchiveFile::node({{"references", Value::dictionary({{"right", Value::uid(1)}})}});
  EXPECT_EQ(readArchive(file.bytes(), both), "object");
  EXPECT_EQ(readArchive(file.bytes(), both, "Node"), "object");
  EXPECT_EQ(readArchive(file.bytes(), both, "Other"), "E_ARCHIVE_CLASS");
  EXPECT_EQ(readArchive(file.bytes(), ArchiveClasses()), "E_ARCHIVE_CLASS");
  file.objects = {Value::dictionary({{"class", Value::string("node")}})};
  EXPECT_EQ(readArchive(file.bytes(), both), "E_ARCHIVE_CLASS");
  file.objects = {Value::dictionary({{"class", Value::string("")}})};
  EXPECT_EQ(readArchive(file.bytes(), both), "E_ARCHIVE_CLASS");
}

TEST(MalformedArchive, NoMakerRunsBeforeTheTableIsChecked) {
  int made = 0;
  ArchiveClasses classes;
  classes.add("Node", [&made](KeyedUnarchiver& coder) {
    ++made;
    return Node::make(coder);
  });
  ArchiveFile file;
  file.objects = {ArchiveFile::referring(1), ArchiveFile::referring(2),
                  Value::dictionary({{"class", Value::string("Unknown")}})};
  EXPECT_EQ(readArchive(file.bytes(), classes), "E_ARCHIVE_CLASS");
  EXPECT_EQ(made, 0);
}

TEST(MalformedArchive, Cycles) {
  for (const std::uint32_t steps : {1U, 2U, 3U, 10U, 64U}) {
    ArchiveFile file;
    for (std::uint32_t i = 0; i < steps; ++i) {
      file.objects.push_back(ArchiveFile::referring((i + 1) % steps));
    }
    EXPECT_EQ(readArchive(file.bytes()), "E_ARCHIVE_CYCLE") << steps;
  }
  ArchiveFile map;
  map.objects = {
      ArchiveFile::mapping(Value::array({Value::string("k")}), Value::array({Value::uid(0)}))};
  EXPECT_EQ(readArchive(map.bytes()), "E_ARCHIVE_CYCLE");
}

TEST(MalformedArchive, NestedTooDeep) {
  for (const std::uint32_t count : {63U, 64U, 65U, 5000U}) {
    ArchiveFile file;
    for (std::uint32_t i = 0; i + 1 < count; ++i) {
      file.objects.push_back(ArchiveFile::referring(i + 1));
    }
    file.objects.push_back(ArchiveFile::node());
    EXPECT_EQ(readArchive(file.bytes()), count > 64 ? "E_PLIST_DEPTH" : "object") << count;
  }
}

TEST(MalformedArchive, ObjectsThatNothingRefersTo) {
  for (const std::size_t extra : {1U, 2U, 1'000'000U}) {
    ArchiveFile file;
    file.objects.assign(extra + 1, ArchiveFile::node());
    EXPECT_EQ(readArchive(file.bytes()), "E_ARCHIVE_SHAPE") << extra;
  }
  // Two that refer to each other, apart from the root.
  ArchiveFile island;
  island.objects = {ArchiveFile::node(), ArchiveFile::referring(2), ArchiveFile::referring(1)};
  EXPECT_EQ(readArchive(island.bytes()), "E_ARCHIVE_SHAPE");
}

TEST(MalformedArchive, FieldsOfAnotherSortOrTypeOrMissing) {
  const auto reads = [](const Value& object) {
    ArchiveFile file;
    file.objects = {object, ArchiveFile::node()};
    return readArchive(file.bytes());
  };
  const auto reference = Value::dictionary({{"left", Value::uid(1)}});
  EXPECT_EQ(reads(ArchiveFile::node({{"references", reference}})), "object");
  // "name" must be a string; "left" a reference; "map" a map.
  EXPECT_EQ(
      reads(ArchiveFile::node({{"references", reference},
                               {"values", Value::dictionary({{"name", Value::integer(1)}})}})),
      "E_ARCHIVE_SHAPE");
  EXPECT_EQ(
      reads(ArchiveFile::node({{"references", Value::dictionary({{"name", Value::uid(1)}})}})),
      "E_ARCHIVE_SHAPE");
  EXPECT_EQ(reads(ArchiveFile::node({{"references", Value::dictionary({{"map", Value::uid(1)}})}})),
            "E_ARCHIVE_SHAPE");
  EXPECT_EQ(
      reads(ArchiveFile::node({{"references", Value::dictionary({{"right", Value::uid(1)}})},
                               {"values", Value::dictionary({{"left", Value::string("x")}})}})),
      "E_ARCHIVE_SHAPE");
}

TEST(MalformedArchive, WhatMakersRaiseBecomesAnError) {
  const auto raising = [](auto raise) {
    ArchiveClasses classes;
    classes.add("Node", [raise](KeyedUnarchiver&) -> ArchivablePtr { return raise(); });
    return classes;
  };
  ArchiveFile file;
  file.objects = {ArchiveFile::node()};
  EXPECT_EQ(readArchive(file.bytes(), raising([]() -> ArchivablePtr {
                          throw TypeError("uuid", "string", "number");
                        })),
            "E_ARCHIVE_SHAPE");
  EXPECT_EQ(readArchive(file.bytes(),
                        raising([]() -> ArchivablePtr { throw InternalInconsistency("no uuid"); })),
            "E_ARCHIVE_SHAPE");
  EXPECT_EQ(readArchive(file.bytes(), raising([]() -> ArchivablePtr { return nullptr; })),
            "E_ARCHIVE_SHAPE");
}

TEST(MalformedArchive, ErrorNamesTheObject) {
  ArchiveFile file;
  file.objects = {ArchiveFile::referring(1),
                  ArchiveFile::node({{"values", Value::dictionary({{"name", Value::uid(3)}})}})};
  ErrorPtr error;
  KeyedUnarchiver::unarchivedObject(dataOf(file.bytes()), nodeClasses(), &error);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->message(),
            "E_ARCHIVE_SHAPE: wrong type under \"name\": expected string, found uid, under "
            "objects[1]");
  EXPECT_EQ(error->userInfo()["path"], Value::string("objects[1]"));
}

}  // namespace
}  // namespace kx::test
