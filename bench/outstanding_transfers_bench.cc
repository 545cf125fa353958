// outstandingAssetTransfers on the legacy road for a todo list of 1,000 installs, each with its
// app folder in the sync folder and a 180 x 180 icon: per call, every icon is rendered into the
// scratch directory and a placeholder is made and installed for every app. The home screen lists
// half of the apps, so the download order does both of its walks. Between calls the placeholders
// are taken away again (outside the timing), so that every call does the same work. The device
// lies in TMPDIR (default /tmp).
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "bench_support.h"
#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "platform/icon/png_codec.h"
#include "runtime/fs/files.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr int kInstalls = 1000;
constexpr int kIconSide = 180;

std::string appIdentifier(int i) {
  char text[64];
  std::snprintf(text, sizeof text, "com.example.voyage%04d", i);
  return text;
}

// An opaque icon with a gradient of its own per app, so that no two encode alike.
std::optional<std::vector<std::uint8_t>> iconPng(int i) {
  icon::Image image(kIconSide, kIconSide);
  for (int y = 0; y < kIconSide; ++y) {
    for (int x = 0; x < kIconSide; ++x) {
      std::uint8_t* p = image.pixel(x, y);
      p[0] = static_cast<std::uint8_t>(x + i);
      p[1] = static_cast<std::uint8_t>(y * 3 + i * 7);
      p[2] = static_cast<std::uint8_t>((x ^ y) + i * 13);
      p[3] = 255;
    }
  }
  return icon::encodePng(image);
}

class SyncFolderDevice {
 public:
  SyncFolderDevice() {
    const char* tmp = std::getenv("TMPDIR");
    std::string pattern = std::string(tmp && *tmp ? tmp : "/tmp") + "/transfers_bench.XXXXXX";
    if (!::mkdtemp(pattern.data())) return;
    root_ = pattern;
    device_ = std::make_unique<FakePlatform>(fs::path(root_));
    device_->tr().logger().setSink(sink_);
    plist::Array todoList;
    std::vector<std::string> iconOrder;
    for (int i = 0; i < kInstalls; ++i) {
      const std::string id = appIdentifier(i);
      const std::string folder = *device_->paths().packageDirectory(id);
      std::optional<std::vector<std::uint8_t>> png = iconPng(i);
      const plist::Dict info{{"BNBundleIdentifier", id},
                             {"BNBundleVersion", "1.0"},
                             {"BNBundleDisplayName", "Voyage " + std::to_string(i)},
                             {"BNBundleIconFile", "Icon.png"}};
      if (!png || !createDirectories(folder) ||
          !writePlistAtomically(folder + "/Info.plist", info, plist::Format::Binary) ||
          !writeFileAtomically(folder + "/Icon.png", *png)) {
        return;
      }
      todoList.emplace_back(plist::Dict{{"identifier", id},
                                        {"operation", "install"},
                                        {"version", "1.0"},
                                        {"name", "Voyage " + std::to_string(i)}});
      if (i % 2 == 0) iconOrder.push_back(id);
    }
    if (!writePlistAtomically(device_->paths().todoList(), todoList, plist::Format::Binary)) {
      return;
    }
    device_->pv().setIconOrder(iconOrder);
    client_ = std::make_unique<AppsClient>(device_->platform());
  }
  ~SyncFolderDevice() {
    client_.reset();
    device_.reset();
    std::error_code ec;
    if (!root_.empty()) fs::remove_all(root_, ec);
  }
  SyncFolderDevice(const SyncFolderDevice&) = delete;
  SyncFolderDevice& operator=(const SyncFolderDevice&) = delete;

  bool ok() const { return client_ != nullptr; }
  AppsClient& client() { return *client_; }

  // Takes away the placeholders a call made, so that the next call makes them again.
  void removePlaceholders() {
    device_->ar().drain();
    for (int i = 0; i < kInstalls; ++i) device_->ar().removeApplication(appIdentifier(i));
    removeAll((fs::path(root_) / "tmp/com.vantor.trc.Apps").string());
  }

 private:
  std::string root_;
  std::shared_ptr<bench::CountingLogSink> sink_ = std::make_shared<bench::CountingLogSink>();
  std::unique_ptr<FakePlatform> device_;
  std::unique_ptr<AppsClient> client_;
};

void BM_OutstandingTransfersLegacy(benchmark::State& state) {
  SyncFolderDevice device;
  if (!device.ok()) {
    state.SkipWithError("could not build the device");
    return;
  }
  std::size_t returned = 0;
  for (auto _ : state) {
    returned = device.client().outstandingAssetTransfers().size();
    state.PauseTiming();
    device.removePlaceholders();
    state.ResumeTiming();
  }
  if (returned != kInstalls) state.SkipWithError("not every install was returned");
  state.counters["assets"] = static_cast<double>(returned);
}
BENCHMARK(BM_OutstandingTransfersLegacy)
    ->Iterations(3)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
