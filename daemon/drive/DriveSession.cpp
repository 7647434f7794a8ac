#include "daemon/drive/DriveSession.h"

#include <exception>
#include <utility>

namespace kx {

std::unique_ptr<DriveSession> DriveSession::open(const std::string& deviceRoot, ErrorPtr* error) {
  std::unique_ptr<DriveSession> session(new DriveSession);
  const LogSinks sinks = session->logs_.sinks();
  setLogSinks(sinks);
  const std::shared_ptr<PluginModule> module = PluginModule::load({}, error);
  if (!module) return nullptr;
  DeviceOptions options;
  options.root = deviceRoot;
  options.create = true;
  options.logs = sinks;
  options.clock = &session->clock_;
  options.decorateMedia = faultyMediaStore(session->faults_);
  session->device_ = ReferenceDevice::open(options, error);
  if (!session->device_) return nullptr;
  session->platform_ =
      std::make_unique<DrivePlatform>(*session->device_, session->clock_, session->faults_, sinks);
  session->plugin_ = std::make_unique<PluginHost>(module, *session->platform_);
  if (const ErrorPtr failure = session->plugin_->createClient()) {
    setError(error, failure);
    return nullptr;
  }
  return session;
}

DriveSession::~DriveSession() {
  faults_.clear();
  if (platform_) {
    platform_->saver().release();
    platform_->saver().deliverKeptBack();
  }
  if (plugin_) plugin_->destroyClient();
  ownLibrary_ = nullptr;
  if (device_) device_->drain();
  plugin_ = nullptr;
  platform_ = nullptr;
  device_ = nullptr;
  setLogSinks({});
}

FRClient& DriveSession::client() {
  FRClient* const client = plugin_->client();
  if (client == nullptr)
    throw DriveException("NoClient", "there is no client: client.new makes one");
  return *client;
}

void DriveSession::renewClient() {
  if (const auto raised = plugin_->destroyClient()) {
    throw DriveException(raised->name, raised->reason);
  }
  if (const ErrorPtr error = plugin_->createClient()) {
    throw DriveException("NoClient", error->message());
  }
}

KXPhotoLibraryPtr DriveSession::library() {
  if (KXPhotoLibraryPtr open = platform_->library().lastOpenLibrary()) return open;
  if (!ownLibrary_) ownLibrary_ = device_->platform().photoLibrary().newPhotoLibrary();
  return ownLibrary_;
}

void DriveSession::inLibrary(bool transaction, const std::function<void(KXPhotoLibrary&)>& block) {
  const KXPhotoLibraryPtr library = this->library();
  const auto group = std::make_shared<DispatchGroup>();
  std::exception_ptr raised;
  const Block guarded = [&] {
    try {
      block(*library);
    } catch (...) {
      raised = std::current_exception();
      throw;
    }
  };
  if (transaction) {
    library->withDispatchGroupPerformTransaction(group, guarded);
  } else {
    library->withDispatchGroupPerformBlock(group, guarded);
  }
  group->wait();
  if (raised) std::rethrow_exception(raised);
}

}  // namespace kx
