// The legacy install queue's throughput: 100 delivered packages enqueued at once, each install
// holding the registry for 50 ms of real time. With ten installs at a time the whole batch should
// take about ten install times (0.5 s); timed from the first enqueue until waitForInstalls
// returns. The packages are staged again between runs, outside the timing. The device lies in
// TMPDIR (default /tmp).
#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdio>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "bench_device.h"
#include "platform/ar_wrapper.h"
#include "runtime/fs/files.h"
#include "state/todo_list.h"

namespace appsync {
namespace {

constexpr int kInstalls = 100;
constexpr std::chrono::milliseconds kInstallTime{50};

std::string appIdentifier(int i) {
  char text[64];
  std::snprintf(text, sizeof text, "com.example.cargo%03d", i);
  return text;
}

// Every package install takes kInstallTime before the registry does it.
class SlowRegistry final : public ARApplicationWorkspaceWrapper {
 public:
  using ARApplicationWorkspaceWrapper::ARApplicationWorkspaceWrapper;
  using ARApplicationWorkspaceWrapper::installApplication;

  bool installApplication(const std::string& path, const plist::Dict& options,
                          ErrorRef* error) override {
    std::this_thread::sleep_for(kInstallTime);
    return target().installApplication(path, options, error);
  }
};

class InstallQueueDevice {
 public:
  InstallQueueDevice() {
    if (!device_.made()) return;
    FakePlatform& device = device_.device();
    plist::Array todoList;
    for (int i = 0; i < kInstalls; ++i) {
      todoList.emplace_back(plist::Dict{{std::string(kTodoIdentifierKey), appIdentifier(i)},
                                        {std::string(kTodoOperationKey), "install"}});
    }
    if (!createDirectories(device.paths().syncFolder()) ||
        !writePlistAtomically(device.paths().todoList(), todoList, plist::Format::Binary)) {
      return;
    }
    device_.openClient(std::make_unique<SlowRegistry>(device.ar()));
  }

  bool ok() const { return device_.ok(); }
  AppsClient& client() { return device_.client(); }

  // A delivered bundle folder and its asset for every app (each install removes its package).
  bool stagePackages() {
    assets_.clear();
    for (int i = 0; i < kInstalls; ++i) {
      const std::string id = appIdentifier(i);
      const std::string bundle = (device_.root() / "staging" / (id + ".app")).string();
      if (!createDirectories(bundle) ||
          !writePlistAtomically(bundle + "/Info.plist", plist::Dict{{"BNBundleIdentifier", id}},
                                plist::Format::Binary)) {
        return false;
      }
      auto asset = TRAsset::downloadAssetWithIdentifier(id, "Application", std::nullopt);
      asset->setPath(bundle);
      assets_.push_back(std::move(asset));
    }
    return true;
  }
  void installAll() {
    for (const auto& asset : assets_) client()._enqueueAssetInstall(asset);
    client().waitForInstalls();
  }

 private:
  bench::TempDevice device_{"install_queue_bench"};
  std::vector<std::shared_ptr<TRAsset>> assets_;
};

void BM_LegacyInstallQueue(benchmark::State& state) {
  InstallQueueDevice device;
  if (!device.ok()) {
    state.SkipWithError("could not build the device");
    return;
  }
  for (auto _ : state) {
    state.PauseTiming();
    const bool staged = device.stagePackages();
    state.ResumeTiming();
    if (!staged) {
      state.SkipWithError("could not stage the packages");
      break;
    }
    device.installAll();
  }
  const std::uint32_t attempts = device.client()._getAndResetNumAppInstallsAttempted();
  if (attempts != kInstalls * state.iterations()) state.SkipWithError("an install was not tried");
  state.counters["installs"] = kInstalls;
}
BENCHMARK(BM_LegacyInstallQueue)->Iterations(5)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
