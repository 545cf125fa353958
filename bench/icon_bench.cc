// Home-screen icon rendering end to end: Info.plist lookup, PNG decoding, scaling to 120 x 120,
// the corner mask and PNG encoding, from a large (1024 px) and a small (180 px) source icon.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <string>

#include "bench_support.h"
#include "platform/icon/home_screen_icon_service.h"
#include "platform/icon/png_codec.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

// A scratch directory holding one bundle per source size, removed at exit.
class BenchBundles {
 public:
  // The bundle whose icon is a side x side picture with detail (gradients and a pattern), so
  // that decoding and averaging do real work.
  std::string bundle(int side) {
    const fs::path dir = root_.path() / ("App" + std::to_string(side) + ".app");
    if (fs::exists(dir)) return dir.string();
    fs::create_directories(dir);
    icon::Image image(side, side);
    for (int y = 0; y < side; ++y) {
      for (int x = 0; x < side; ++x) {
        std::uint8_t* p = image.pixel(x, y);
        p[0] = static_cast<std::uint8_t>(x * 255 / side);
        p[1] = static_cast<std::uint8_t>(y * 255 / side);
        p[2] = static_cast<std::uint8_t>(((x / 8 + y / 8) % 2) * 200 + (x * y) % 56);
        p[3] = 255;
      }
    }
    const std::vector<std::uint8_t> png = *icon::encodePng(image);
    std::ofstream(dir / "AppIcon@2x.png", std::ios::binary)
        .write(reinterpret_cast<const char*>(png.data()), static_cast<std::streamsize>(png.size()));
    std::ofstream(dir / "Info.plist")
        << "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\"><dict>"
           "<key>BNBundleIcons</key><dict><key>BNBundlePrimaryIcon</key><dict>"
           "<key>BNBundleIconFiles</key><array><string>AppIcon</string></array>"
           "</dict></dict></dict></plist>\n";
    return dir.string();
  }

 private:
  bench::TempDir root_{"icon_bench"};
};

BenchBundles& bundles() {
  static BenchBundles instance;
  return instance;
}

// One icon per iteration, 1,000 iterations: the time per iteration is the time per icon, and
// "per_1000" the time for all of them.
void BM_RenderHomeScreenIconPng(benchmark::State& state) {
  const std::string path = bundles().bundle(static_cast<int>(state.range(0)));
  HomeScreenIconService service(120);
  std::size_t bytes = 0;
  for (auto _ : state) {
    auto bundle = service.openBundle(path);
    auto image = service.QICreateDeviceAppropriateHomeScreenIconImageFromBundle(*bundle);
    auto png = service.createImageDestination(kPNGTypeIdentifier, 1);
    if (!image || !png) {
      state.SkipWithError("rendering failed");
      break;
    }
    png->addImage(*image);
    if (!png->finalize()) {
      state.SkipWithError("encoding failed");
      break;
    }
    bytes = png->data().size();
    benchmark::DoNotOptimize(png->data().data());
  }
  state.counters["png_bytes"] = static_cast<double>(bytes);
  state.counters["per_1000"] = benchmark::Counter(
      0.001, benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}
BENCHMARK(BM_RenderHomeScreenIconPng)
    ->Arg(1024)
    ->Arg(180)
    ->Iterations(1000)
    ->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
