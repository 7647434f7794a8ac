#include "daemon/drive/DriveConsole.h"

#include <algorithm>
#include <cstdio>
#include <iostream>
#include <utility>

#include "daemon/SyncJson.h"
#include "daemon/SyncRunner.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

constexpr std::size_t kLongestLineBytes = 64U << 20;
// Answers of asynchronous calls are kept until they are collected: no more than these.
constexpr std::size_t kMostStarted = 256;
// Batches that wait for "saverHold" to end: no more than these.
constexpr std::size_t kMostHeld = 1024;

// Reads a line without its end; false at the end of the input. `tooLong` lines are read to their
// end and given up.
bool readLine(std::istream& in, std::string* line, bool* tooLong) {
  line->clear();
  *tooLong = false;
  std::streambuf* const buffer = in.rdbuf();
  bool any = false;
  for (int c = buffer->sbumpc(); c != std::char_traits<char>::eof(); c = buffer->sbumpc()) {
    any = true;
    if (c == '\n') return true;
    if (line->size() >= kLongestLineBytes) {
      *tooLong = true;
      *line = std::string();
    }
    if (!*tooLong) line->push_back(static_cast<char>(c));
  }
  return any;
}

Json exceptionJson(const std::optional<RaisedException>& exception) {
  if (!exception) return nullptr;
  return {{"name", exception->name}, {"reason", exception->reason}};
}

}  // namespace

// A call that runs, or has run, beside the console.
struct DriveConsole::Started {
  std::string name;
  DriveLane lane = DriveLane::kConsole;
  Outcome outcome;
  DispatchSemaphore done{0};
};

DriveConsole::DriveConsole(DriveSession& session)
    : session_(session), background_(DispatchQueue::serial("kx.drive.background")) {
  addClientCalls(session_, table_);
  addDeviceCalls(session_, table_);
  addFaultCalls(session_, table_);
  addRecordCalls(table_);
}

DriveConsole::~DriveConsole() {
  // Whatever a script left waiting is let go, so that calls under way end.
  session_.faults().clear();
  session_.platform().saver().release();
  session_.platform().saver().deliverKeptBack();
  background_->drain();
  session_.plugin().queue().drain();
}

DriveConsole::Outcome DriveConsole::perform(const DriveCall& call, const Json& line) {
  Outcome outcome;
  std::optional<RaisedException> own;
  outcome.exception = catchRaised([&] {
    try {
      outcome.answer = call.run(DriveArguments(line));
    } catch (const DriveException& exception) {
      own = RaisedException{exception.name(), exception.what()};
    }
  });
  if (own) outcome.exception = own;
  // Whoever waited for what was kept back has given up by now.
  if (call.lane == DriveLane::kPlugin) session_.platform().saver().deliverKeptBack();
  return outcome;
}

DriveConsole::Outcome DriveConsole::performAndWait(const DriveCall& call, const Json& line) {
  // A call that waits for a held batch would wait for ever: no later line could release it.
  const bool waits =
      call.waitsForSaver || (call.lane == DriveLane::kPlugin && isStartedOnPluginQueue());
  if (waits) session_.platform().saver().setMayHold(false);
  Outcome outcome;
  if (call.isForMainThread(DriveArguments(line))) {
    // A client is never called on two threads at once.
    session_.plugin().queue().drain();
    outcome = perform(call, line);
  } else if (call.lane == DriveLane::kConsole) {
    outcome = perform(call, line);
  } else {
    session_.plugin().queue().sync([&] { outcome = perform(call, line); });
  }
  if (waits) session_.platform().saver().setMayHold(true);
  return outcome;
}

void DriveConsole::start(const std::string& name, const DriveCall& call, const Line& line,
                         Json* extra) {
  if (started_.size() >= kMostStarted) {
    throw DriveException("TooManyStarted", "wait for a call that was started before");
  }
  const bool onMainThread = call.isForMainThread(DriveArguments(*line));
  const auto started = std::make_shared<Started>();
  started->name = name;
  started->lane = call.lane;
  started_[++lastStarted_] = started;
  (*extra)["started"] = lastStarted_;
  if (onMainThread) {
    started->outcome = performAndWait(call, *line);
    started->done.signal();
    return;
  }
  DispatchQueue& queue = call.lane == DriveLane::kPlugin ? session_.plugin().queue() : *background_;
  queue.async([this, started, call, line] {
    started->outcome = perform(call, *line);
    started->done.signal();
  });
}

DriveConsole::Outcome DriveConsole::wait(const DriveArguments& arguments, Json* extra) {
  const std::int64_t number = arguments.integer("of");
  const auto found = started_.find(number);
  if (found == started_.end()) {
    throw DriveException(kBadArgument, "nothing was started as " + std::to_string(number));
  }
  const std::shared_ptr<Started> started = found->second;
  started_.erase(found);
  session_.platform().saver().setMayHold(false);
  started->done.wait();
  session_.platform().saver().setMayHold(true);
  (*extra)["call"] = started->name;
  return std::move(started->outcome);
}

DriveConsole::Outcome DriveConsole::dispatch(const Line& line, const std::string& name,
                                             Json* extra) {
  const DriveArguments arguments(*line);
  if (name == "wait") return wait(arguments, extra);
  const auto found = table_.find(name);
  if (found == table_.end()) throw DriveException(kUnknownCall, "unknown call \"" + name + "\"");
  const DriveCall& call = found->second;
  if (call.lane == DriveLane::kPlugin && session_.platform().saver().heldBatches() >= kMostHeld) {
    throw DriveException("TooManyHeld", "device.releaseSaver lets go what the saver holds");
  }
  if (!arguments.boolean("async", false)) return performAndWait(call, *line);
  start(name, call, line, extra);
  return {};
}

bool DriveConsole::isStartedOnPluginQueue() const {
  return std::any_of(started_.begin(), started_.end(),
                     [](const auto& entry) { return entry.second->lane == DriveLane::kPlugin; });
}

Json DriveConsole::answer(const std::string& text) {
  Json answer{{"call", nullptr}};
  Outcome outcome;
  try {
    const auto line = std::make_shared<const Json>(Json::parse(text, nullptr, false));
    if (!line->is_object()) throw DriveException(kBadLine, "the line is no JSON object");
    const std::string name = DriveArguments(*line).string("call");
    answer["call"] = name;
    outcome = dispatch(line, name, &answer);
  } catch (const DriveException& exception) {
    outcome.exception = RaisedException{exception.name(), exception.what()};
  } catch (const std::exception& exception) {
    outcome.exception = RaisedException{kBadLine, exception.what()};
  }
  answer["result"] = outcome.exception ? Json() : std::move(outcome.answer.result);
  answer["error"] = errorJson(outcome.answer.error);
  answer["exception"] = exceptionJson(outcome.exception);
  answer["log"] = session_.logs().takeLog();
  answer["stdlog"] = session_.logs().takeStandardLog();
  return answer;
}

void DriveConsole::run(std::istream& in, std::ostream& out) {
  std::string line;
  bool tooLong = false;
  while (readLine(in, &line, &tooLong)) {
    // A line that was given up is answered as the empty one: it is no JSON object either.
    out << dumpJson(answer(tooLong ? std::string() : line)) << '\n' << std::flush;
    if (!out) return;
  }
}

int runDrive(const std::vector<std::string>& arguments) {
  if (arguments.size() != 2 || arguments[1].empty() || arguments[1][0] == '-') {
    std::fprintf(stderr, "ferrule: drive takes one argument, DEVICE (ferrule --help says more)\n");
    return kExitUsage;
  }
  ErrorPtr error;
  const std::unique_ptr<DriveSession> session = DriveSession::open(arguments[1], &error);
  if (!session) {
    const std::string why = error ? error->message() : "the device cannot be opened";
    std::fprintf(stderr, "ferrule: %s\n", escapeControlCharacters(why).c_str());
    return exitCodeForDeviceError(error);
  }
  std::ios::sync_with_stdio(false);
  DriveConsole console(*session);
  console.run(std::cin, std::cout);
  return kExitDone;
}

}  // namespace kx
