#include "tests/daemon/Support.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include "platform/foundation/Exceptions.h"
#include "platform/foundation/PropertyList.h"

namespace kx::test {

namespace fs = std::filesystem;

TempDirectory::TempDirectory() {
  std::string pattern = (fs::temp_directory_path() / "kxdaemonXXXXXX").string();
  if (::mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no temporary directory");
  path_ = pattern;
}

TempDirectory::~TempDirectory() {
  std::error_code ignored;
  fs::remove_all(path_, ignored);
}

void TempDirectory::write(const std::string& name, const std::string& text) const {
  fs::create_directories(fs::path(at(name)).parent_path());
  std::ofstream(at(name), std::ios::binary) << text;
}

std::string TempDirectory::read(const std::string& name) const {
  std::ifstream file(at(name), std::ios::binary);
  std::ostringstream text;
  text << file.rdbuf();
  return text.str();
}

bool TempDirectory::exists(const std::string& name) const {
  return fs::exists(fs::symlink_status(at(name)));
}

std::string TempDirectory::fingerprint(const std::string& name) const {
  std::vector<std::string> lines;
  std::error_code missing;
  for (const auto& entry : fs::recursive_directory_iterator(at(name), missing)) {
    std::string line = fs::relative(entry.path(), at(name)).string();
    if (entry.is_symlink()) {
      line += " -> " + fs::read_symlink(entry.path()).string();
    } else if (entry.is_regular_file()) {
      std::ifstream file(entry.path(), std::ios::binary);
      std::ostringstream text;
      text << file.rdbuf();
      line += " " + std::to_string(text.str().size()) + " " +
              std::to_string(std::hash<std::string>{}(text.str()));
    }
    lines.push_back(std::move(line));
  }
  std::sort(lines.begin(), lines.end());
  std::string all;
  for (const std::string& line : lines) all += line + "\n";
  return all;
}

DataPtr plistBytes(const Value& root) {
  ErrorPtr error;
  auto bytes = writePropertyList(root, PropertyListFormat::kBinary, &error);
  if (error) throw std::runtime_error(error->description());
  return std::make_shared<const Data>(std::move(bytes));
}

Value assetItem(const std::string& uuid, const std::map<std::string, Value>& more) {
  Dictionary item{{"uuid", Value::string(uuid)},
                  {"itemType", Value::string("Asset")},
                  {"isVideo", Value::boolean(false)},
                  {"exposureDate", Value::real(3061152000.5)},
                  {"modificationDate", Value::real(3061152001.25)}};
  for (const auto& [key, value] : more) item.set(key, value);
  return Value::dictionary(std::move(item));
}

Value albumItem(const std::string& uuid, const std::vector<std::string>& assets) {
  Array members;
  for (const std::string& asset : assets) members.push_back(Value::string(asset));
  return Value::dictionary(Dictionary{{"uuid", Value::string(uuid)},
                                      {"itemType", Value::string("Album")},
                                      {"albumName", Value::string("Album " + uuid.substr(0, 4))},
                                      {"assetUUIDs", Value::array(std::move(members))}});
}

Value snapshotRoot(const std::vector<Value>& updates, const std::map<std::string, Value>& more) {
  Dictionary root{{"libraryUUID", Value::string("11111111-1111-1111-1111-111111111111")},
                  {"libraryKind", Value::string("Cassock")},
                  {"updates", Value::array(Array(updates.begin(), updates.end()))},
                  {"deletes", Value::array({})}};
  for (const auto& [key, value] : more) root.set(key, value);
  return Value::dictionary(std::move(root));
}

DataPtr DirectoryLink::snapshot(ErrorPtr* error) {
  if (!snapshotBytes) setError(error, Error::make("test", 1, "the host is away"));
  return snapshotBytes;
}

std::optional<std::int64_t> DirectoryLink::mediaSize(std::string_view identifier) {
  if (const auto said = sizes.find(identifier); said != sizes.end()) return said->second;
  struct stat status {};
  const std::string path = directory_ + "/" + std::string(identifier);
  if (::lstat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) return std::nullopt;
  return status.st_size;
}

FileDescriptor DirectoryLink::openMedia(std::string_view identifier, ErrorPtr* error) {
  opened.emplace_back(identifier);
  if (onOpen) onOpen(std::string(identifier));
  int code = 0;
  if (const auto failure = failures.find(identifier); failure != failures.end()) {
    const auto times = failTimes.find(identifier);
    if (times == failTimes.end() || times->second-- > 0) code = failure->second;
  }
  const std::string path = directory_ + "/" + std::string(identifier);
  FileDescriptor file;
  if (code == 0) {
    file = FileDescriptor(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (!file.valid()) code = errno;
  }
  if (code != 0) setError(error, Error::make(kPosixErrorDomain, code, std::strerror(code)));
  return file;
}

namespace {

PluginScript* currentScript = nullptr;

class ScriptedClient : public FRClient {
 public:
  explicit ScriptedClient(PluginScript& script) : script_(script) {}
  ~ScriptedClient() override { script_.calls.emplace_back("destroy"); }

  bool respondsTo(FROperation) const override { return !script_.lacksOperations; }
  bool prepareForSyncWithHostAnchor(const std::string&, const ProgressCallback&,
                                    ErrorPtr*) override {
    note("prepareForSync");
    if (script_.duringPrepare) script_.duringPrepare();
    return script_.prepareResult;
  }
  bool reconcileSync(std::uint32_t, const std::string&, const ProgressCallback&,
                     ErrorPtr* error) override {
    note("reconcileSync");
    if (script_.duringReconcile) script_.duringReconcile();
    if (script_.reconcileError) setError(error, script_.reconcileError);
    return script_.reconcileResult;
  }
  std::vector<FRAssetPtr> outstandingAssetTransfers() override {
    note("outstandingAssetTransfers");
    return script_.outstanding;
  }
  void assetTransfer(const FRAssetPtr& asset, bool succeeded, const ErrorPtr& error) override {
    std::string text = "assetTransfer " + asset->identifier();
    text +=
        succeeded ? " arrived" : " failed " + error->domain() + " " + std::to_string(error->code());
    if (script_.duringTransfer) script_.duringTransfer(asset);
    note("assetTransfer", text);
  }
  void assetTransferEndedWithSuccess(bool success) override {
    note("assetTransferEnded", std::string("assetTransferEnded ") + (success ? "true" : "false"));
  }
  void syncEndedWithSuccess(bool success) override {
    note("syncEnded", std::string("syncEnded ") + (success ? "true" : "false"));
  }

 private:
  void note(const std::string& name, std::string text = {}) {
    script_.calls.push_back(text.empty() ? name : std::move(text));
    script_.onMainThread.push_back(::gettid() == ::getpid());
    if (script_.raiseAt == name) throw InternalInconsistency("raised in " + name);
  }

  PluginScript& script_;
};

FRClient* makeScriptedClient(Platform*, std::uint32_t version) {
  if (currentScript->refusesVersion || version != kFRInterfaceVersion) return nullptr;
  if (currentScript->raiseAt == "create") throw InternalInconsistency("raised in create");
  return new ScriptedClient(*currentScript);
}

}  // namespace

void useScript(PluginScript* script) { currentScript = script; }

std::shared_ptr<PluginModule> scriptedPlugin() {
  return PluginModule::linkedIn(&makeScriptedClient);
}

FRAssetPtr downloadRequest(const std::string& uuid) {
  return FRAsset::downloadAssetWithIdentifier(uuid, "Photo", std::nullopt);
}

FRAssetPtr restoreRequest(const std::string& uuid) {
  FRAssetPtr request = downloadRequest(uuid);
  request->setIsRestore(true);
  return request;
}

}  // namespace kx::test
