// A fake device for the benchmarks that drive the client.
#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>

#include "bench_support.h"
#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"

namespace appsync::bench {

// A fake platform in a fresh temporary directory, logging to a counting sink, and the client
// over it once openClient has been called. Gone in the reverse order (the members' order): the
// client, the service it was given, the platform, the directory.
class TempDevice {
 public:
  explicit TempDevice(std::string_view name) : root_(name) {
    if (root_.path().empty()) return;
    device_ = std::make_unique<FakePlatform>(root_.path());
    device_->tr().logger().setSink(sink_);
  }
  TempDevice(const TempDevice&) = delete;
  TempDevice& operator=(const TempDevice&) = delete;

  // Whether the directory and the platform were made.
  bool made() const { return device_ != nullptr; }
  const std::filesystem::path& root() const { return root_.path(); }
  FakePlatform& device() { return *device_; }
  std::uint64_t logLines() const { return sink_->count(); }

  void openClient() { client_ = std::make_unique<AppsClient>(device_->platform()); }
  // The client with `service` in place of the platform's own of its kind; the device keeps it
  // until the client is gone.
  template <typename Service>
  void openClient(std::unique_ptr<Service> service) {
    const Platform platform = device_->platform().with(*service);
    service_ = std::move(service);
    client_ = std::make_unique<AppsClient>(platform);
  }
  // Whether the client is open (it is opened once the device is set up).
  bool ok() const { return client_ != nullptr; }
  AppsClient& client() { return *client_; }

  // Takes away the placeholders a call made for the apps identifier(0) to identifier(apps - 1):
  // their registry records and the scratch directory they were written in.
  void removePlaceholders(int apps, std::string (*identifier)(int)) {
    device_->ar().drain();
    for (int i = 0; i < apps; ++i) device_->ar().removeApplication(identifier(i));
    removeAll((root_.path() / "tmp/com.vantor.trc.Apps").string());
  }

 private:
  TempDir root_;
  std::shared_ptr<CountingLogSink> sink_ = std::make_shared<CountingLogSink>();
  std::unique_ptr<FakePlatform> device_;
  std::shared_ptr<void> service_;
  std::unique_ptr<AppsClient> client_;
};

}  // namespace appsync::bench
