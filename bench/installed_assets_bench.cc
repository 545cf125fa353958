// The inventory of vanished applications with 10,000 candidates: 5,000 on the installer's
// uninstalled list and 5,000 last-sync apps that are gone (beside 1,000 still installed, which
// are asked about and dropped), judged against a previous todo list of 10,000 records. Logging
// stays on as in production: one line per candidate and the summary that describes all three
// lists.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <cstdio>
#include <string>

#include "bench_device.h"
#include "runtime/fs/files.h"

namespace appsync {
namespace {

constexpr int kFromInstaller = 5000;
constexpr int kGoneSinceLastSync = 5000;
constexpr int kStillInstalled = 1000;
constexpr int kTodoRecords = 10000;

std::string app(const char* group, int i) {
  char text[64];
  std::snprintf(text, sizeof text, "com.example.%s%05d", group, i);
  return text;
}

class InventoryDevice {
 public:
  InventoryDevice() {
    if (!device_.made()) return;
    FakePlatform& device = device_.device();

    plist::Array lastSync;
    for (int i = 0; i < kFromInstaller; ++i) device.em().addUninstalled(app("removed", i));
    for (int i = 0; i < kGoneSinceLastSync; ++i) lastSync.emplace_back(app("gone", i));
    for (int i = 0; i < kStillInstalled; ++i) {
      device.ar().putApplication({.identifier = app("kept", i)});
      lastSync.emplace_back(app("kept", i));
    }
    // Every other candidate has a record: a third of those still being worked on, the rest
    // finished; the records of apps that are not candidates fill the list up.
    plist::Array todo;
    const char* const states[] = {"DOWNLOADED", "INSTALLED", "FAILED"};
    for (int i = 0; i < kTodoRecords; ++i) {
      const std::string id =
          i % 2 ? app(i % 4 == 1 ? "removed" : "gone", i / 2 % 5000) : app("other", i);
      todo.emplace_back(plist::Dict{{"identifier", id}, {"operation", states[i % 3]}});
    }
    const Paths& paths = device.paths();
    createDirectories(paths.syncFolder());
    ok_ = writePlistAtomically(paths.todoList(), plist::Value(std::move(todo)),
                               plist::Format::Binary) &&
          writePlistAtomically(paths.lastSyncAppState(), plist::Value(std::move(lastSync)),
                               plist::Format::Binary);
    device_.openClient();
  }

  bool ok() const { return ok_; }
  AppsClient& client() { return device_.client(); }
  std::uint64_t logLines() const { return device_.logLines(); }

 private:
  bench::TempDevice device_{"installed_assets_bench"};
  bool ok_ = false;
};

void BM_InstalledAssets10000Candidates(benchmark::State& state) {
  InventoryDevice device;
  if (!device.ok()) return state.SkipWithError("cannot build the device");
  std::size_t deleted = 0;
  const std::uint64_t linesBefore = device.logLines();
  for (auto _ : state) {
    plist::Dict result = device.client().installedAssets();
    deleted = result.find("_Deleted")->array()->size();
    benchmark::DoNotOptimize(result);
  }
  state.counters["candidates"] = kFromInstaller + kGoneSinceLastSync;
  state.counters["reported"] = static_cast<double>(deleted);
  state.counters["log_lines"] = static_cast<double>(device.logLines() - linesBefore) /
                                static_cast<double>(state.iterations());
}
BENCHMARK(BM_InstalledAssets10000Candidates)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
