// Compares reader and writers with an independent implementation, that of Python's library.
#include <gtest/gtest.h>
#include <rapidcheck.h>

#include <bit>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "tests/foundation/PropertyListFiles.h"
#include "tests/foundation/RandomValues.h"

namespace kx::test {
namespace {

namespace fs = std::filesystem;

constexpr int kFiles = 400;

std::string hexOf(std::string_view bytes) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string result;
  for (const char c : bytes) {
    result += kDigits[static_cast<unsigned char>(c) >> 4];
    result += kDigits[static_cast<unsigned char>(c) & 15];
  }
  return result;
}

std::string numberLine(const Number& number) {
  if (number.type() == Number::Type::kBoolean) return "bool " + number.description();
  if (!number.isReal()) return "int " + number.description();
  if (std::isnan(number.doubleValue())) return "real nan";
  return "real " + hexOf(big(std::bit_cast<std::uint64_t>(number.doubleValue()), 8));
}

// The oracle's text form, see plist_oracle.py.
void show(const Value& value, const std::string& pad, std::string& out) {
  switch (value.kind()) {
    case Kind::kNumber:
      out += pad + numberLine(value.numberValue()) + "\n";
      break;
    case Kind::kDate:
      out += pad + "date " +
             std::to_string(
                 static_cast<std::int64_t>(std::floor(value.dateValue().secondsSinceReference))) +
             "\n";
      break;
    case Kind::kUid:
      out += pad + "uid " + std::to_string(value.uidValue()) + "\n";
      break;
    case Kind::kString:
      out += pad + "string " + hexOf(value.stringValue()) + "\n";
      break;
    case Kind::kData: {
      const auto bytes = value.dataValue();
      out +=
          pad + "data " + hexOf({reinterpret_cast<const char*>(bytes.data()), bytes.size()}) + "\n";
      break;
    }
    case Kind::kArray:
      out += pad + "array " + std::to_string(value.arrayValue().size()) + "\n";
      for (const Value& element : value.arrayValue()) show(element, pad + " ", out);
      break;
    default: {
      const DictionaryView view = value.dictionaryValue();
      out += pad + "dict " + std::to_string(view.size()) + "\n";
      for (std::size_t i = 0; i < view.size(); ++i) {
        out += pad + " key " + hexOf(view.keyAt(i)) + "\n";
        show(view.valueAt(i), pad + " ", out);
      }
    }
  }
}

std::string textOf(const Value& value) {
  std::string out;
  show(value, "", out);
  return out;
}

class PropertyListOracle : public testing::Test {
 protected:
  void SetUp() override {
    if (std::system("python3 -c 'import plistlib' > /dev/null 2>&1") != 0) {
      GTEST_SKIP() << "python3 with plistlib is not installed";
    }
    folder_ = fs::path(testing::TempDir()) /
              ("plist_oracle_" +
               std::string(testing::UnitTest::GetInstance()->current_test_info()->name()));
    fs::remove_all(folder_);
    fs::create_directories(folder_);
  }
  void TearDown() override { fs::remove_all(folder_); }

  void runOracle(const std::string& arguments) const {
    const std::string command =
        "python3 " KX_TEST_SOURCE_DIR "/tests/foundation/plist_oracle.py " + arguments;
    ASSERT_EQ(std::system(command.c_str()), 0) << command;
  }
  std::string content(int number, const char* extension) const {
    std::ifstream file(folder_ / (std::to_string(number) + extension), std::ios::binary);
    EXPECT_TRUE(file.good()) << number << extension;
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  }
  void store(int number, const std::string& bytes) const {
    std::ofstream file(folder_ / (std::to_string(number) + ".plist"), std::ios::binary);
    file << bytes;
  }

  fs::path folder_;
};

TEST_F(PropertyListOracle, ReadsWhatTheOracleWrites) {
  constexpr int kSeed = 20010101;
  runOracle("make " + folder_.string() + " " + std::to_string(kFiles) + " " +
            std::to_string(kSeed));
  for (int i = 0; i < kFiles; ++i) {
    const Reading reading = readBytes(content(i, ".plist"));
    ASSERT_EQ(reading.error, nullptr) << "seed " << kSeed << " file " << i << reading.text();
    EXPECT_EQ(textOf(reading.value), content(i, ".txt")) << "seed " << kSeed << " file " << i;
  }
}

TEST_F(PropertyListOracle, TheOracleReadsWhatIsWritten) {
  std::vector<std::string> expected;
  constexpr std::uint64_t kSeed = 19700101;
  rc::Random random(kSeed);
  for (int i = 0; i < kFiles; ++i) {
    const bool isXml = i % 3 == 0;
    ValueOptions options;
    options.notANumber = true;
    if (isXml) {
      options.uids = false;
      options.real32 = false;
      options.controlCharacters = false;
    }
    options.wholeSeconds = true;
    const auto generator = rc::gen::exec([options] { return randomValue(options, 4); });
    const Value value = generator(random.split(), 30).value();
    store(i, written(value, isXml ? PropertyListFormat::kXml : PropertyListFormat::kBinary));
    expected.push_back(textOf(value));
  }
  runOracle("show " + folder_.string());
  for (int i = 0; i < kFiles; ++i) {
    EXPECT_EQ(content(i, ".txt"), expected[static_cast<std::size_t>(i)])
        << "seed " << kSeed << " file " << i;
  }
}

// What this reader takes, the other one takes too, and reads the same.
TEST_F(PropertyListOracle, DamagedFilesThatAreReadAreReadTheSame) {
  constexpr int kSeed = 5;
  runOracle("make " + folder_.string() + " " + std::to_string(kFiles) + " " +
            std::to_string(kSeed));
  rc::Random random(kSeed);
  std::vector<std::string> damaged;
  for (int i = 0; i < kFiles; ++i) {
    std::string bytes = content(i, ".plist");
    if (bytes.rfind("bplist00", 0) == 0) {
      const std::uint64_t draw = random.next();
      bytes[static_cast<std::size_t>((draw >> 8) % bytes.size())] = static_cast<char>(draw & 0xFF);
    }
    store(i, bytes);
    damaged.push_back(bytes);
  }
  runOracle("try " + folder_.string());
  int accepted = 0;
  for (int i = 0; i < kFiles; ++i) {
    const Reading reading = readBytes(damaged[static_cast<std::size_t>(i)]);
    if (reading.error != nullptr) continue;
    ++accepted;
    EXPECT_EQ(textOf(reading.value), content(i, ".txt")) << "seed " << kSeed << " file " << i;
  }
  EXPECT_GT(accepted, kFiles / 4);
}

}  // namespace
}  // namespace kx::test
