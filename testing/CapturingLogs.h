#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/sync/FRLog.h"

namespace kx {

// One message as it was written.
struct CapturedMessage {
  std::string source;
  std::string function;
  std::string facility;
  LogLevel level = LogLevel::kInfo;
  std::string text;
};

// Log sinks that keep every message for a test to look at. Any thread.
class CapturingLogs {
 public:
  CapturingLogs();

  LogSinks sinks() const;
  // What the sync log, the library's log and the standard log got, oldest first.
  std::vector<CapturedMessage> messages() const;
  std::vector<CapturedMessage> libraryMessages() const;
  std::vector<std::string> standardMessages() const;
  // The texts of the sync log alone.
  std::vector<std::string> texts() const;
  std::size_t count(LogLevel level, std::string_view text) const;
  // Whether a message of that level and exactly that text was written.
  bool has(LogLevel level, std::string_view text) const { return count(level, text) > 0; }
  // The first message that begins so; a message without source when there is none.
  CapturedMessage firstWithPrefix(std::string_view prefix) const;
  void clear();

 private:
  struct Content;
  class SyncSink;
  class LibrarySink;
  class StandardSink;
  std::shared_ptr<Content> content_;
};

}  // namespace kx
