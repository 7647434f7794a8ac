#include "testing/CapturingLogs.h"

#include <algorithm>

namespace kx {

struct CapturingLogs::Content {
  mutable std::mutex mutex;
  std::vector<CapturedMessage> sync;
  std::vector<CapturedMessage> library;
  std::vector<std::string> standard;
};

class CapturingLogs::SyncSink final : public FRLog {
 public:
  explicit SyncSink(std::shared_ptr<Content> content) : content_(std::move(content)) {}
  bool takes(LogLevel) override { return true; }
  void write(const LogSite& site, LogLevel level, std::string_view message) override {
    std::lock_guard<std::mutex> lock(content_->mutex);
    content_->sync.push_back(
        {site.sourceFile, site.function, site.facility, level, std::string(message)});
  }

 private:
  std::shared_ptr<Content> content_;
};

class CapturingLogs::LibrarySink final : public KXLibraryLog {
 public:
  explicit LibrarySink(std::shared_ptr<Content> content) : content_(std::move(content)) {}
  bool isEnabled(LogLevel) override { return true; }
  void write(LogLevel level, std::string_view message) override {
    std::lock_guard<std::mutex> lock(content_->mutex);
    content_->library.push_back({"", "", "", level, std::string(message)});
  }

 private:
  std::shared_ptr<Content> content_;
};

class CapturingLogs::StandardSink final : public StandardLog {
 public:
  explicit StandardSink(std::shared_ptr<Content> content) : content_(std::move(content)) {}
  void write(std::string_view message) override {
    std::lock_guard<std::mutex> lock(content_->mutex);
    content_->standard.emplace_back(message);
  }

 private:
  std::shared_ptr<Content> content_;
};

CapturingLogs::CapturingLogs() : content_(std::make_shared<Content>()) {}

LogSinks CapturingLogs::sinks() const {
  return {std::make_shared<SyncSink>(content_), std::make_shared<LibrarySink>(content_),
          std::make_shared<StandardSink>(content_)};
}

std::vector<CapturedMessage> CapturingLogs::messages() const {
  std::lock_guard<std::mutex> lock(content_->mutex);
  return content_->sync;
}

std::vector<CapturedMessage> CapturingLogs::libraryMessages() const {
  std::lock_guard<std::mutex> lock(content_->mutex);
  return content_->library;
}

std::vector<std::string> CapturingLogs::standardMessages() const {
  std::lock_guard<std::mutex> lock(content_->mutex);
  return content_->standard;
}

std::vector<std::string> CapturingLogs::texts() const {
  std::vector<std::string> texts;
  for (const CapturedMessage& message : messages()) texts.push_back(message.text);
  return texts;
}

std::size_t CapturingLogs::count(LogLevel level, std::string_view text) const {
  const std::vector<CapturedMessage> all = messages();
  return static_cast<std::size_t>(
      std::count_if(all.begin(), all.end(), [&](const CapturedMessage& message) {
        return message.level == level && message.text == text;
      }));
}

CapturedMessage CapturingLogs::firstWithPrefix(std::string_view prefix) const {
  for (const CapturedMessage& message : messages()) {
    if (message.text.starts_with(prefix)) return message;
  }
  return {};
}

void CapturingLogs::clear() {
  std::lock_guard<std::mutex> lock(content_->mutex);
  content_->sync.clear();
  content_->library.clear();
  content_->standard.clear();
}

}  // namespace kx
