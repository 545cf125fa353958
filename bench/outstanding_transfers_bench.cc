// outstandingAssetTransfers on the legacy road for a todo list of 1,000 installs, each with its
// app folder in the sync folder and a 180 x 180 icon: per call, every icon is rendered into the
// scratch directory and a placeholder is made and installed for every app. The home screen lists
// half of the apps, so the download order does both of its walks. Between calls the placeholders
// are taken away again (outside the timing), so that every call does the same work. The device
// lies in TMPDIR (default /tmp).
#include <benchmark/benchmark.h>

#include <cstdint>
#include <cstdio>
#include <optional>
#include <string>
#include <vector>

#include "bench_device.h"
#include "platform/icon/png_codec.h"
#include "runtime/fs/files.h"

namespace appsync {
namespace {

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
    if (!device_.made()) return;
    FakePlatform& device = device_.device();
    plist::Array todoList;
    std::vector<std::string> iconOrder;
    for (int i = 0; i < kInstalls; ++i) {
      const std::string id = appIdentifier(i);
      const std::string folder = *device.paths().packageDirectory(id);
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
    if (!writePlistAtomically(device.paths().todoList(), todoList, plist::Format::Binary)) {
      return;
    }
    device.pv().setIconOrder(iconOrder);
    device_.openClient();
  }

  bool ok() const { return device_.ok(); }
  AppsClient& client() { return device_.client(); }

  // Takes away the placeholders a call made, so that the next call makes them again.
  void removePlaceholders() { device_.removePlaceholders(kInstalls, appIdentifier); }

 private:
  bench::TempDevice device_{"transfers_bench"};
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
