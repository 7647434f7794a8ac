#include "platform/foundation/RecordBlocks.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <thread>
#include <vector>

namespace kx {
namespace {

// Counts how many there are.
struct Counted {
  Counted(std::atomic<int>& all, int content) : count(all), number(content) {
    if (content < 0) throw std::runtime_error("refused");
    ++count;
  }
  ~Counted() { --count; }
  std::atomic<int>& count;
  int number;
  char room[100] = {};
};

TEST(RecordBlocks, RecordsOutliveTheBlocksAndKeepWhatTheyHold) {
  std::atomic<int> count = 0;
  std::vector<std::shared_ptr<Counted>> records;
  {
    RecordBlocks blocks;
    for (int i = 0; i < 3000; ++i) records.push_back(blocks.make<Counted>(count, i));
    EXPECT_EQ(count, 3000);
    for (std::size_t i = 0; i < records.size(); i += 2) records[i] = nullptr;
    EXPECT_EQ(count, 1500);
    records.push_back(blocks.make<Counted>(count, 3000));
  }
  for (std::size_t i = 1; i < records.size(); i += 2) {
    ASSERT_EQ(records[i]->number, static_cast<int>(i));
    EXPECT_EQ(reinterpret_cast<std::uintptr_t>(records[i].get()) % alignof(Counted), 0U);
  }
  const std::weak_ptr<Counted> observed = records[1];
  records.clear();
  EXPECT_EQ(count, 0);
  EXPECT_TRUE(observed.expired());
}

TEST(RecordBlocks, ARecordWhoseMakingFailsLeavesNothing) {
  std::atomic<int> count = 0;
  RecordBlocks blocks;
  const auto before = blocks.make<Counted>(count, 1);
  EXPECT_THROW(blocks.make<Counted>(count, -1), std::runtime_error);
  const auto after = blocks.make<Counted>(count, 2);
  EXPECT_EQ(before->number, 1);
  EXPECT_EQ(after->number, 2);
  EXPECT_EQ(count, 2);
}

TEST(RecordBlocksConcurrency, RecordsEndOnAnyThreadWhileOthersAreMade) {
  std::atomic<int> count = 0;
  constexpr std::size_t kThreads = 3;
  std::vector<std::vector<std::shared_ptr<Counted>>> parts(kThreads);
  RecordBlocks blocks;
  for (int i = 0; i < 6000; ++i) {
    parts[static_cast<std::size_t>(i) % kThreads].push_back(blocks.make<Counted>(count, i));
  }
  std::vector<std::thread> threads;
  for (auto& part : parts) threads.emplace_back([&part] { part.clear(); });
  std::vector<std::shared_ptr<Counted>> later;
  for (int i = 0; i < 3000; ++i) later.push_back(blocks.make<Counted>(count, i));
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(count, 3000);
  for (std::size_t i = 0; i < later.size(); ++i) EXPECT_EQ(later[i]->number, static_cast<int>(i));
}

}  // namespace
}  // namespace kx
