// The inventory of vanished applications with 10,000 candidates: 5,000 on the installer's
// uninstalled list and 5,000 last-sync apps that are gone (beside 1,000 still installed, which
// are asked about and dropped), judged against a previous todo list of 10,000 records. Logging
// stays on as in production: one line per candidate and the summary that describes all three
// lists.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>

#include "bench_support.h"
#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
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
    std::string pattern =
        (std::filesystem::temp_directory_path() / "appsync-bench-XXXXXX").string();
    if (!::mkdtemp(pattern.data())) return;
    root_ = pattern;
    device_ = std::make_unique<FakePlatform>(root_);
    device_->tr().logger().setSink(sink_);

    plist::Array lastSync;
    for (int i = 0; i < kFromInstaller; ++i) device_->em().addUninstalled(app("removed", i));
    for (int i = 0; i < kGoneSinceLastSync; ++i) lastSync.emplace_back(app("gone", i));
    for (int i = 0; i < kStillInstalled; ++i) {
      device_->ar().putApplication({.identifier = app("kept", i)});
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
    const Paths& paths = device_->paths();
    createDirectories(paths.syncFolder());
    ok_ = writePlistAtomically(paths.todoList(), plist::Value(std::move(todo)),
                               plist::Format::Binary) &&
          writePlistAtomically(paths.lastSyncAppState(), plist::Value(std::move(lastSync)),
                               plist::Format::Binary);
    client_ = std::make_unique<AppsClient>(device_->platform());
  }
  ~InventoryDevice() {
    client_.reset();
    device_.reset();
    std::error_code ec;
    if (!root_.empty()) std::filesystem::remove_all(root_, ec);
  }

  bool ok() const { return ok_; }
  AppsClient& client() { return *client_; }
  std::uint64_t logLines() const { return sink_->count(); }

 private:
  std::filesystem::path root_;
  std::shared_ptr<bench::CountingLogSink> sink_ = std::make_shared<bench::CountingLogSink>();
  std::unique_ptr<FakePlatform> device_;
  std::unique_ptr<AppsClient> client_;
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
