#pragma once

#include <cstddef>
#include <memory>
#include <mutex>
#include <nlohmann/json.hpp>
#include <string>
#include <string_view>
#include <vector>

#include "platform/sync/FRLog.h"

namespace kx {

// Collects what is logged, at every level, until an answer takes it. Any thread; messages keep the
// order in which they were logged. Beyond kMostBytes between two answers further ones are counted
// alone, and the answer's last line says how many.
class DriveLogs {
 public:
  static constexpr std::size_t kMostBytes = std::size_t{512} << 20;
  // The photo library's log is not collected: it holds nothing that the sync log lacks.
  LogSinks sinks() const;
  // [[level, source file, function, text], ...] since the last call.
  nlohmann::ordered_json takeLog();
  // What went to the standard log since the last call.
  nlohmann::ordered_json takeStandardLog();

 private:
  struct Line {
    int level;
    std::string source;
    std::string function;
    std::string text;
  };
  struct Content {
    std::mutex mutex;
    std::vector<Line> lines;
    std::vector<std::string> standard;
    std::size_t bytes = 0;      // of both
    std::size_t linesLeft = 0;  // that found no room

    // With the lock held: whether there is room for the message.
    bool takes(std::string_view message);
  };
  class SyncSink;
  class StandardSink;

  std::shared_ptr<Content> content_ = std::make_shared<Content>();
};

}  // namespace kx
