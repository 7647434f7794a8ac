#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/Platform.h"
#include "platform/dispatch/Dispatch.h"
#include "platform/sync/FRClient.h"

namespace kx {

// A loaded plug-in module. It stays loaded until the process ends, since objects made by its code
// may live that long. Any thread.
class PluginModule {
 public:
  // `path` empty: KXSYNC_PLUGIN, else beside the program, else where it is installed. Null and a
  // one-line error when there is none or it has no entry point.
  static std::shared_ptr<PluginModule> load(const std::string& path, ErrorPtr* error);

  // A plug-in that is part of this program.
  static std::shared_ptr<PluginModule> linkedIn(FRPluginEntry entry);

  const std::string& path() const { return path_; }
  FRPluginEntry entry() const { return entry_; }

 private:
  PluginModule() = default;
  std::string path_;
  FRPluginEntry entry_ = nullptr;
};

// What a call into the plug-in raised.
struct RaisedException {
  std::string name;  // "InternalInconsistency" for a programming error
  std::string reason;
};

// Runs the body; what it raises comes back as a value.
std::optional<RaisedException> catchRaised(const std::function<void()>& body);

// The plug-in's client and the one serial queue, never the main thread, on which it is made, called
// and destroyed. Made, used and destroyed on one thread; the platform outlives it.
class PluginHost {
 public:
  PluginHost(std::shared_ptr<PluginModule> module, Platform& platform);
  ~PluginHost();  // destroys the client
  PluginHost(const PluginHost&) = delete;
  PluginHost& operator=(const PluginHost&) = delete;

  // Makes a client, destroying the one before; null error when there is one now.
  ErrorPtr createClient();
  // What destroying it raised; nothing happens without a client.
  std::optional<RaisedException> destroyClient();

  // Calls the body with the client on the plug-in queue and waits.
  std::optional<RaisedException> call(const std::function<void(FRClient&)>& body);

  // For a console: the queue itself and the client, null without one.
  DispatchQueue& queue() { return *queue_; }
  FRClient* client() { return client_.get(); }

 private:
  std::shared_ptr<PluginModule> module_;
  Platform& platform_;
  DispatchQueuePtr queue_;
  std::unique_ptr<FRClient> client_;
};

}  // namespace kx
