// A device held by one command: locked, loaded, settled and saved.
#include "device_session.h"

#include <cstdio>
#include <exception>
#include <functional>
#include <string_view>
#include <utility>
#include <vector>

#include "input_error.h"
#include "platform/fake/state_fields.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync::host {

namespace {

// Writes every message to the device's own log in memory, to the lines not yet taken for a
// transcript, and to the device's log file.
class DeviceLogSink : public LogSink {
 public:
  using Collect = std::function<void(MemoryLogSink::Line)>;
  DeviceLogSink(std::shared_ptr<MemoryLogSink> memory, Collect collect, const std::string& path)
      : memory_(std::move(memory)), collect_(std::move(collect)), file_(path) {}
  void write(int category, LogLevel level, std::string_view message) override {
    memory_->write(category, level, message);
    collect_({category, level, std::string(message)});
    file_.write(category, level, message);
  }

 private:
  std::shared_ptr<MemoryLogSink> memory_;
  Collect collect_;
  FileLogSink file_;
};

// The fakes that deliver on a callback thread of their own, by the names scripts use for them.
// Install coordination delivers too, through its own service calls.
std::vector<std::pair<std::string_view, CallbackThread*>> callbackThreads(FakePlatform& device) {
  return {{"registry", &device.ar().callbackThread()},
          {"notifications", &device.system().callbackThread()},
          {"host", &device.tr().deviceService().callbackThread()},
          {"store", &device.bz().callbackThread()}};
}

// Drains every fake that delivers on a thread of its own, except those whose deliveries a script
// holds back (unless `releaseHeld`: then they are let go first). True when one of the drained
// ones still had something queued.
bool settleOnce(FakePlatform& device, bool releaseHeld) {
  bool busy = false;
  for (const auto& [name, thread] : callbackThreads(device)) {
    if (releaseHeld) thread->release();
    if (thread->isHeld()) continue;
    busy = busy || thread->pendingCount() > 0;
    thread->drain();
  }
  if (releaseHeld) device.kc().release();
  device.kc().drain();  // returns at once while held
  return busy;
}

}  // namespace

std::filesystem::path DeviceSession::stateDirectory(const std::filesystem::path& root) {
  return root / ".platform";
}
std::filesystem::path DeviceSession::logFile(const std::filesystem::path& root) {
  return root / "appsync.log";
}
std::filesystem::path DeviceSession::transactionFile(const std::filesystem::path& root) {
  return root / "transactions.log";
}

namespace {

// Where a device was made. Its services and the client's files name paths under that root, so
// a device opened anywhere else would have them read and written outside its own root.
std::filesystem::path locationFile(const std::filesystem::path& root) {
  return DeviceSession::stateDirectory(root) / "location.plist";
}

std::string canonicalRoot(const std::filesystem::path& root) {
  std::error_code ec;
  const auto canonical = std::filesystem::weakly_canonical(std::filesystem::absolute(root), ec);
  return (ec ? root : canonical).string();
}

void recordLocation(const std::filesystem::path& root) {
  const plist::Value location(plist::Dict{{"root", canonicalRoot(root)}});
  ErrorRef error;
  if (!writePlistAtomically(locationFile(root).string(), location, plist::Format::Xml, &error)) {
    throw std::runtime_error(error->describe());
  }
}

void checkLocation(const std::filesystem::path& root) {
  const std::string file = locationFile(root).string();
  auto bytes = readFile(file);
  auto value = bytes ? plist::parse(*bytes) : std::nullopt;
  const plist::Dict* dict = value ? value->dict() : nullptr;
  const plist::Value* made = dict ? dict->find("root") : nullptr;
  if (made == nullptr || made->string() == nullptr) {
    throw InputError(file, 0, "root", "missing or not a text: the device's location is unknown");
  }
  if (*made->string() != canonicalRoot(root)) {
    throw InputError(root.string(), 0, "",
                     "this device was made at " + *made->string() +
                         " and cannot be moved: its services and files name paths under that "
                         "root (make a new device here with device init, or replay --fresh)");
  }
}

}  // namespace

std::unique_ptr<DeviceSession> DeviceSession::open(const std::filesystem::path& root) {
  const auto state = stateDirectory(root);
  std::error_code ec;
  // A .platform that is a link could have the device's state written anywhere.
  if (!std::filesystem::is_directory(std::filesystem::symlink_status(state, ec))) {
    throw InputError(root.string(), 0, "",
                     "holds no device (no .platform directory); create one with "
                     "`appsync-host device init --root " +
                         root.string() + "`");
  }
  DeviceLock lock = DeviceLock::acquire(state);
  checkLocation(root);
  FakePlatform::Options options;
  try {
    options = FakePlatform::loadOptions(state);
  } catch (const StateFormatError& e) {
    throw InputError((state / "device.plist").string(), 0, "", e.what());
  }
  std::unique_ptr<DeviceSession> session(new DeviceSession(root, std::move(lock), options));
  try {
    session->device_->loadState(state);
  } catch (const std::exception& e) {
    session->closed_ = true;  // nothing of a half-loaded device is written back
    throw InputError(state.string(), 0, "", e.what());
  }
  session->attachLogs();
  return session;
}

std::unique_ptr<DeviceSession> DeviceSession::create(const std::filesystem::path& root,
                                                     const FakePlatform::Options& options) {
  const auto state = stateDirectory(root);
  std::error_code ec;
  if (std::filesystem::exists(state, ec)) {
    throw InputError(root.string(), 0, "", "already holds a device");
  }
  std::filesystem::create_directories(state, ec);
  if (ec) {
    throw InputError(root.string(), 0, "", "cannot create the device: " + ec.message());
  }
  DeviceLock lock = DeviceLock::acquire(state);
  recordLocation(root);
  std::unique_ptr<DeviceSession> session(new DeviceSession(root, std::move(lock), options));
  session->attachLogs();
  return session;
}

DeviceSession::DeviceSession(std::filesystem::path root, DeviceLock lock,
                             FakePlatform::Options options)
    : root_(std::move(root)), lock_(std::move(lock)) {
  options.manualClock = true;
  device_ = std::make_unique<FakePlatform>(root_, options);
}

void DeviceSession::attachLogs() {
  {
    // What the device holds already is the first take's, as if it had been gathered too.
    std::lock_guard lock(unclaimed_->mutex);
    unclaimed_->produced.log = device_->log().lines();
    unclaimed_->produced.transactions = device_->transactionLog().entries();
  }
  auto collectLine = [unclaimed = unclaimed_](MemoryLogSink::Line line) {
    std::lock_guard lock(unclaimed->mutex);
    unclaimed->produced.log.push_back(std::move(line));
  };
  device_->tr().logger().setSink(std::make_shared<DeviceLogSink>(
      device_->tr().logSink(), std::move(collectLine), logFile(root_).string()));
  std::shared_ptr<std::FILE> transactions(openFileForAppending(transactionFile(root_).string()),
                                          [](std::FILE* file) {
                                            if (file) std::fclose(file);
                                          });
  device_->transactionLog().setEntryListener(
      [transactions, unclaimed = unclaimed_](const TransactionLogEntry& entry) {
        {
          std::lock_guard lock(unclaimed->mutex);
          unclaimed->produced.transactions.push_back(entry);
        }
        if (!transactions) return;
        std::fprintf(transactions.get(), "%s\n", entry.describe().c_str());
        std::fflush(transactions.get());
      });
}

DeviceSession::~DeviceSession() {
  if (closed_) return;
  try {
    close();
  } catch (const std::exception& e) {
    std::fprintf(stderr, "appsync-host: %s\n", e.what());
  }
}

AppsClient& DeviceSession::client() {
  std::lock_guard lock(clientMutex_);
  if (!client_) client_ = std::make_unique<AppsClient>(device_->platform());
  return *client_;
}

bool DeviceSession::hasClient() const {
  std::lock_guard lock(clientMutex_);
  return client_ != nullptr;
}

void DeviceSession::settle() { settle(false); }

std::vector<std::string> DeviceSession::heldServices() {
  std::vector<std::string> held;
  for (const auto& [name, thread] : callbackThreads(*device_)) {
    if (thread->isHeld()) held.emplace_back(name);
  }
  if (device_->kc().isHeld()) held.emplace_back("coordination");
  return held;
}

bool DeviceSession::holdService(std::string_view name, bool hold) {
  if (name == "coordination") {
    hold ? device_->kc().hold() : device_->kc().release();
    return true;
  }
  for (const auto& [service, thread] : callbackThreads(*device_)) {
    if (service != name) continue;
    hold ? thread->hold() : thread->release();
    return true;
  }
  return false;
}

void DeviceSession::settle(bool releaseHeld) {
  // Each delivery may make more (an observer that calls back into a service): go round until a
  // whole round finds nothing queued.
  // The client's own install queues count too: an install calls the registry, whose events
  // must then be delivered.
  for (int round = 0; round < 1000; ++round) {
    bool busy = settleOnce(*device_, releaseHeld);
    AppsClient* client = nullptr;
    {
      std::lock_guard lock(clientMutex_);
      client = client_.get();
    }
    if (client) busy = client->waitForRunnableInstalls() || busy;
    if (!busy && round > 0) return;
  }
  throw std::runtime_error("the device does not come to rest: its services keep making events");
}

void DeviceSession::close() {
  if (closed_) return;
  closed_ = true;
  settle(true);
  std::unique_ptr<AppsClient> client;
  {
    std::lock_guard lock(clientMutex_);
    client = std::move(client_);
  }
  client.reset();
  settle(true);
  device_->saveState(stateDirectory(root_));
}

DeviceSession::Produced DeviceSession::takeProduced() {
  std::lock_guard lock(unclaimed_->mutex);
  return std::exchange(unclaimed_->produced, Produced{});
}

}  // namespace appsync::host
