// One command's hold on a device kept in a directory: the lock that keeps other commands out,
// the fakes loaded from ROOT/.platform, the client the host daemon loads, and, at the end, a
// device brought to rest and saved.
#pragma once

#include <filesystem>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "client/apps_client.h"
#include "device_lock.h"
#include "platform/fake/fake_platform.h"
#include "runtime/log/log.h"

namespace appsync::host {

class DeviceSession {
 public:
  // The device's directory of saved fake state, and its log files.
  static std::filesystem::path stateDirectory(const std::filesystem::path& root);
  static std::filesystem::path logFile(const std::filesystem::path& root);  // appsync.log
  static std::filesystem::path transactionFile(
      const std::filesystem::path& root);  // transactions.log

  // Opens the device at `root` and loads it. InputError when root holds no device or its state
  // is malformed (naming the file and field); DeviceBusy when another command holds it.
  static std::unique_ptr<DeviceSession> open(const std::filesystem::path& root);
  // Makes a new device at `root` (created if missing; it must not hold a device yet).
  static std::unique_ptr<DeviceSession> create(const std::filesystem::path& root,
                                               const FakePlatform::Options& options);
  // Saves and releases the device if close() was not called (errors are then only printed).
  ~DeviceSession();
  DeviceSession(const DeviceSession&) = delete;
  DeviceSession& operator=(const DeviceSession&) = delete;

  const std::filesystem::path& root() const { return root_; }
  FakePlatform& device() { return *device_; }
  const Paths& paths() const { return device_->paths(); }
  // Always a manual clock: the simulator's time moves only when a command moves it.
  ManualClock& clock() { return *device_->manualClock(); }

  // The client, created on first use as the host daemon creates it when it loads the plugin.
  // Safe from any thread (a step in the background may be the first to ask).
  AppsClient& client();
  bool hasClient() const;

  // Waits until no fake has anything left to deliver, except the services whose deliveries a
  // script holds back (those keep their events until they are released), and the client has no
  // install to run now (retries waiting for the clock stay).
  void settle();
  // The services whose deliveries a script holds back now ("registry", "coordination",
  // "notifications", "host", "store").
  std::vector<std::string> heldServices();
  // Holds back, or lets go, the deliveries of the service a script names ("registry",
  // "coordination", "notifications", "host", "store"); false for any other name.
  bool holdService(std::string_view name, bool hold);
  // Lets every held service go and settles.
  void releaseHeld() { settle(true); }
  // Releases every held service and settles, releases the client (which waits for its own
  // work), settles again and saves the device: no event is dropped. Throws std::runtime_error
  // when the state cannot be written.
  void close();

  // Log lines and transaction-log entries since the last call: what one step produced.
  struct Produced {
    std::vector<MemoryLogSink::Line> log;
    std::vector<TransactionLogEntry> transactions;
  };
  Produced takeProduced();

 private:
  DeviceSession(std::filesystem::path root, DeviceLock lock, FakePlatform::Options options);
  void attachLogs();
  void settle(bool releaseHeld);

  std::filesystem::path root_;
  DeviceLock lock_;
  std::unique_ptr<FakePlatform> device_;
  mutable std::mutex clientMutex_;
  std::unique_ptr<AppsClient> client_;  // guarded by clientMutex_
  bool closed_ = false;
  // What the device logged and recorded since the last takeProduced, gathered as it happens, so
  // that taking it costs what it holds rather than everything since the session began.
  struct Unclaimed {
    std::mutex mutex;
    Produced produced;
  };
  std::shared_ptr<Unclaimed> unclaimed_ = std::make_shared<Unclaimed>();
};

}  // namespace appsync::host
