#include "daemon/drive/DriveLogs.h"

#include <utility>

namespace kx {

bool DriveLogs::Content::takes(std::string_view message) {
  constexpr std::size_t kOfOneLine = sizeof(Line) + 64;
  if (bytes > kMostBytes) {
    ++linesLeft;
    return false;
  }
  bytes += message.size() + kOfOneLine;
  return true;
}

class DriveLogs::SyncSink final : public FRLog {
 public:
  explicit SyncSink(std::shared_ptr<Content> content) : content_(std::move(content)) {}
  bool takes(LogLevel) override { return true; }
  void write(const LogSite& site, LogLevel level, std::string_view message) override {
    const std::lock_guard<std::mutex> lock(content_->mutex);
    if (!content_->takes(message)) return;
    content_->lines.push_back(
        {static_cast<int>(level), site.sourceFile, site.function, std::string(message)});
  }

 private:
  std::shared_ptr<Content> content_;
};

class DriveLogs::StandardSink final : public StandardLog {
 public:
  explicit StandardSink(std::shared_ptr<Content> content) : content_(std::move(content)) {}
  void write(std::string_view message) override {
    const std::lock_guard<std::mutex> lock(content_->mutex);
    if (content_->takes(message)) content_->standard.emplace_back(message);
  }

 private:
  std::shared_ptr<Content> content_;
};

LogSinks DriveLogs::sinks() const {
  return {std::make_shared<SyncSink>(content_), nullptr, std::make_shared<StandardSink>(content_)};
}

nlohmann::ordered_json DriveLogs::takeLog() {
  std::vector<Line> lines;
  {
    const std::lock_guard<std::mutex> lock(content_->mutex);
    lines = std::exchange(content_->lines, {});
    if (content_->linesLeft > 0) {
      lines.push_back({static_cast<int>(LogLevel::kWarning), "DriveLogs", "takeLog",
                       std::to_string(content_->linesLeft) + " more messages found no room"});
    }
    content_->linesLeft = 0;
    content_->bytes = 0;
  }
  nlohmann::ordered_json log = nlohmann::ordered_json::array();
  for (const Line& line : lines) {
    log.push_back({line.level, line.source, line.function, line.text});
  }
  return log;
}

nlohmann::ordered_json DriveLogs::takeStandardLog() {
  const std::lock_guard<std::mutex> lock(content_->mutex);
  return std::exchange(content_->standard, {});
}

}  // namespace kx
