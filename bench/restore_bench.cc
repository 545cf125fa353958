// The restore after a backup restore on the legacy road: a restore list of N apps, each with its
// store metadata, a SINF and a small PNG icon, turned by reconcileRestoreOfType (type 2) into N
// placeholders written and installed through the registry, and the list moved to its log copy.
// Only the call is timed; between calls the placeholders are taken away and the list staged again.
// Afterwards the registry must hold N restore placeholders, else the run reports an error
// instead of a figure. The device lies in TMPDIR (default /tmp).
#include <benchmark/benchmark.h>

#include <cstdio>
#include <filesystem>
#include <optional>
#include <string>

#include "bench_device.h"
#include "platform/icon/png_codec.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr int kIconSide = 60;

std::string appIdentifier(int i) {
  char text[64];
  std::snprintf(text, sizeof text, "com.example.lantern%04d", i);
  return text;
}

// An opaque icon with colours of its own per app.
std::optional<plist::Bytes> iconPng(int i) {
  icon::Image image(kIconSide, kIconSide);
  for (int y = 0; y < kIconSide; ++y) {
    for (int x = 0; x < kIconSide; ++x) {
      std::uint8_t* p = image.pixel(x, y);
      p[0] = static_cast<std::uint8_t>(x * 4 + i);
      p[1] = static_cast<std::uint8_t>(y * 4 + i * 7);
      p[2] = static_cast<std::uint8_t>(i * 13);
      p[3] = 255;
    }
  }
  return icon::encodePng(image);
}

std::optional<plist::Dict> restoreList(int apps) {
  plist::Dict list;
  for (int i = 0; i < apps; ++i) {
    const std::string name = "Lantern " + std::to_string(i);
    const plist::Dict metadata{{"title", name},
                               {"itemName", name},
                               {"bundleVersion", "1." + std::to_string(i % 10)},
                               {"is-auto-download", false}};
    std::optional<plist::Bytes> metadataBytes = plist::writeBinary(metadata);
    std::optional<plist::Bytes> icon = iconPng(i);
    if (!metadataBytes || !icon) return std::nullopt;
    list.set(appIdentifier(i),
             plist::Dict{{"CaravelMetadata", std::move(*metadataBytes)},
                         {"ApplicationSINF", plist::Bytes(64, static_cast<std::uint8_t>(i))},
                         {"PlaceholderIcon", std::move(*icon)}});
  }
  return list;
}

class RestoredDevice {
 public:
  explicit RestoredDevice(int apps) : apps_(apps) {
    if (!device_.made()) return;
    std::optional<plist::Dict> list = restoreList(apps);
    if (!list) return;
    std::optional<plist::Bytes> bytes = plist::writeBinary(plist::Value(std::move(*list)));
    if (!bytes) return;
    listBytes_ = std::move(*bytes);
    device_.openClient();
  }

  bool ok() const { return device_.ok(); }
  AppsClient& client() { return device_.client(); }

  // The host's restore list in place, and no placeholder of an earlier call left.
  bool stage() {
    device_.removePlaceholders(apps_, appIdentifier);
    const std::string path = device_.device().paths().restoreList();
    return createDirectories(fs::path(path).parent_path().string()) &&
           writeFileAtomically(path, listBytes_);
  }

  // The registry's restore placeholders of the listed apps.
  int restorePlaceholders() {
    FakeARWorkspace& registry = device_.device().ar();
    registry.drain();
    int count = 0;
    for (int i = 0; i < apps_; ++i) {
      const auto record = registry.application(appIdentifier(i));
      if (record && record->isPlaceholder && record->installType == ARInstallTypeRestore) ++count;
    }
    return count;
  }

 private:
  int apps_;
  plist::Bytes listBytes_;
  bench::TempDevice device_{"restore_bench"};
};

void BM_RestoreLegacy(benchmark::State& state) {
  const int apps = static_cast<int>(state.range(0));
  RestoredDevice device(apps);
  if (!device.ok()) {
    state.SkipWithError("could not build the device");
    return;
  }
  for (auto _ : state) {
    state.PauseTiming();
    const bool staged = device.stage();
    state.ResumeTiming();
    if (!staged) {
      state.SkipWithError("could not stage the restore list");
      break;
    }
    device.client().reconcileRestoreOfType(2, nullptr);
    state.PauseTiming();
    const int placeholders = device.restorePlaceholders();
    state.ResumeTiming();
    if (placeholders != apps) {
      const std::string problem = std::to_string(placeholders) + " of " + std::to_string(apps) +
                                  " restore placeholders in the registry";
      state.SkipWithError(problem.c_str());
      break;
    }
  }
  state.counters["apps"] = apps;
  state.SetItemsProcessed(state.iterations() * apps);
}
BENCHMARK(BM_RestoreLegacy)
    ->Arg(100)
    ->Arg(1000)
    ->Iterations(3)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
