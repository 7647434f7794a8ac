#pragma once

#include <cstdint>
#include <iosfwd>
#include <map>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "daemon/PluginHost.h"
#include "daemon/drive/DriveSession.h"

namespace kx {

// The drive console: one JSON object a line in, one out, in order. Every call into the plug-in is
// made on the plug-in queue (on the calling thread where a call that takes "onMainThread" says so).
// A line that cannot be understood is answered, too. Runs on the main thread.
class DriveConsole {
 public:
  // The session outlives the console.
  explicit DriveConsole(DriveSession& session);
  ~DriveConsole();
  DriveConsole(const DriveConsole&) = delete;
  DriveConsole& operator=(const DriveConsole&) = delete;

  // Answers every line until the input ends.
  void run(std::istream& in, std::ostream& out);
  // The answer to one line.
  nlohmann::ordered_json answer(const std::string& line);

 private:
  struct Started;
  struct Outcome {
    DriveAnswer answer;
    std::optional<RaisedException> exception;
  };

  // A line is shared, never copied: copying one that is nested very deep would end the process.
  using Line = std::shared_ptr<const nlohmann::ordered_json>;

  Outcome dispatch(const Line& line, const std::string& name, nlohmann::ordered_json* extra);
  Outcome wait(const DriveArguments& arguments, nlohmann::ordered_json* extra);
  void start(const std::string& name, const DriveCall& call, const Line& line,
             nlohmann::ordered_json* extra);
  Outcome performAndWait(const DriveCall& call, const nlohmann::ordered_json& line);
  bool isStartedOnPluginQueue() const;
  Outcome perform(const DriveCall& call, const nlohmann::ordered_json& line);

  DriveSession& session_;
  DriveCallTable table_;
  DispatchQueuePtr background_;  // for asynchronous calls that are none of the plug-in's
  std::map<std::int64_t, std::shared_ptr<Started>> started_;
  std::int64_t lastStarted_ = 0;
};

// `ferrule drive DEVICE`: a console over standard input and output. The process's exit code.
int runDrive(const std::vector<std::string>& arguments);

}  // namespace kx
