#include <gtest/gtest.h>

#include <thread>

#include "tests/foundation/PropertyListFiles.h"

namespace kx::test {
namespace {

// Threads share one document: the first look-up in a large dictionary makes its index.
TEST(DocumentConcurrency, ManyThreadsReadAndCopyOneDocument) {
  constexpr int kKeys = 500;
  constexpr int kThreads = 8;
  Dictionary entries;
  for (int i = 0; i < kKeys; ++i) entries.set("key" + std::to_string(i), Value::integer(i));
  const Value inner = Value::dictionary(entries);
  const Value value = readBytes(written(Value::array({inner, Value::string("é")}))).value;
  std::vector<int> wrong(kThreads, 0);
  std::vector<std::thread> threads;
  for (std::size_t t = 0; t < kThreads; ++t) {
    threads.emplace_back([&value, &wrong, t] {
      const ArrayView list = value.arrayValue();
      const Value dictionary = list[0];
      for (int i = 0; i < kKeys; ++i) {
        const Value found = dictionary["key" + std::to_string(i)];
        if (found != Value::integer(i) || list[1].stringValue() != "é") ++wrong[t];
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(wrong, std::vector<int>(kThreads, 0));
}

TEST(DocumentConcurrency, TheLastThreadReleasesTheDocument) {
  std::vector<std::thread> threads;
  {
    const Value value =
        readBytes(written(Value::array({Value::string("shared"), Value::array({})}))).value;
    for (int t = 0; t < 4; ++t) {
      threads.emplace_back([copy = value] {
        for (int i = 0; i < 1000; ++i) {
          const Value again = copy;
          const Value text = again.arrayValue()[0];
          if (text.stringValue() != "shared") std::abort();
        }
      });
    }
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace kx::test
