#include "daemon/PluginHost.h"

#include <dlfcn.h>
#include <limits.h>
#include <unistd.h>

#include <cstdlib>
#include <vector>

#include "daemon/SyncRunner.h"
#include "platform/foundation/Exceptions.h"
#include "platform/foundation/Text.h"

#ifndef KX_PLUGIN_INSTALL_PATH
#error "KX_PLUGIN_INSTALL_PATH must name the installed module"
#endif

namespace kx {
namespace {

constexpr const char* kModuleName = "kxsyncbundle.so";

std::string programDirectory() {
  char buffer[PATH_MAX];
  const ssize_t length = ::readlink("/proc/self/exe", buffer, sizeof buffer);
  if (length <= 0 || static_cast<std::size_t>(length) >= sizeof buffer) return {};
  const std::string path(buffer, static_cast<std::size_t>(length));
  return path.substr(0, path.rfind('/'));
}

std::vector<std::string> candidates(const std::string& path) {
  if (!path.empty()) return {path};
  if (const char* chosen = std::getenv("KXSYNC_PLUGIN"); chosen != nullptr && *chosen != '\0') {
    return {chosen};
  }
  const std::string programs = programDirectory();
  std::vector<std::string> found;
  if (!programs.empty()) {
    found.push_back(programs + "/" + kModuleName);
    found.push_back(programs + "/" + KX_PLUGIN_RELATIVE_PATH);
  }
  found.push_back(KX_PLUGIN_INSTALL_PATH);
  return found;
}

ErrorPtr pluginError(const std::string& message) {
  return Error::make(kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kPlugin),
                     escapeControlCharacters(message));
}

}  // namespace

std::shared_ptr<PluginModule> PluginModule::load(const std::string& path, ErrorPtr* error) {
  const std::vector<std::string> places = candidates(path);
  for (const std::string& place : places) {
    if (::access(place.c_str(), F_OK) != 0) continue;
    // A text without a slash would be looked for along the library search path.
    const std::string file = place.find('/') == std::string::npos ? "./" + place : place;
    void* handle = ::dlopen(file.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
    if (handle == nullptr) {
      setError(error, pluginError("cannot load the plug-in: " + std::string(::dlerror())));
      return nullptr;
    }
    void* symbol = ::dlsym(handle, kFRPluginEntryName);
    if (symbol == nullptr) {
      setError(error, pluginError("the plug-in " + place + " has no entry point \"" +
                                  kFRPluginEntryName + "\""));
      return nullptr;
    }
    std::shared_ptr<PluginModule> module(new PluginModule());
    module->path_ = place;
    module->entry_ = reinterpret_cast<FRPluginEntry>(symbol);
    return module;
  }
  std::string tried;
  for (const std::string& place : places) tried += (tried.empty() ? "" : ", ") + place;
  setError(error, pluginError("cannot find the plug-in: looked at " + tried));
  return nullptr;
}

std::shared_ptr<PluginModule> PluginModule::linkedIn(FRPluginEntry entry) {
  std::shared_ptr<PluginModule> module(new PluginModule());
  module->path_ = "linked in";
  module->entry_ = entry;
  return module;
}

std::optional<RaisedException> catchRaised(const std::function<void()>& body) {
  try {
    body();
  } catch (const InternalInconsistency& raised) {
    return RaisedException{"InternalInconsistency", raised.what()};
  } catch (const TypeError& raised) {
    return RaisedException{"TypeError", raised.what()};
  } catch (const std::exception& raised) {
    return RaisedException{"Exception", raised.what()};
  } catch (...) {
    return RaisedException{"Exception", "an exception of unknown type"};
  }
  return std::nullopt;
}

PluginHost::PluginHost(std::shared_ptr<PluginModule> module, Platform& platform)
    : module_(std::move(module)),
      platform_(platform),
      queue_(DispatchQueue::serial("com.veltro.ferrule.plugin")) {}

PluginHost::~PluginHost() { destroyClient(); }

ErrorPtr PluginHost::createClient() {
  if (const auto raised = destroyClient()) {
    return pluginError("the plug-in raised " + raised->name + " at its end: " + raised->reason);
  }
  std::optional<RaisedException> raised;
  queue_->sync([&] {
    raised = catchRaised([&] { client_.reset(module_->entry()(&platform_, kFRInterfaceVersion)); });
  });
  if (raised) return pluginError("the plug-in raised " + raised->name + ": " + raised->reason);
  if (!client_) {
    return pluginError("the plug-in " + module_->path() + " does not know interface version " +
                       std::to_string(kFRInterfaceVersion));
  }
  return nullptr;
}

std::optional<RaisedException> PluginHost::destroyClient() {
  if (!client_) return std::nullopt;
  std::optional<RaisedException> raised;
  queue_->sync([&] { raised = catchRaised([&] { client_.reset(); }); });
  return raised;
}

std::optional<RaisedException> PluginHost::call(const std::function<void(FRClient&)>& body) {
  if (!client_) return RaisedException{"InternalInconsistency", "the plug-in has no client"};
  std::optional<RaisedException> raised;
  queue_->sync([&] { raised = catchRaised([&] { body(*client_); }); });
  return raised;
}

}  // namespace kx
