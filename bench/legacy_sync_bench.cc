// One whole sync on the legacy road, run by the simulator's replay engine as `appsync-host
// replay` runs a script: the host uploads a todo list of N new apps and their icon layout,
// reconciles, asks for the outstanding transfers (a placeholder per app), then for every app
// delivers a bundle folder into the public staging folder and reports its transfer done (the
// install queue installs it), ends the transfer phase and the sync. The script is written and
// read, and a fresh device made, outside the timing; the timing covers every step and the
// device coming to rest after each. Afterwards every app must be "INSTALLED" in the todo list,
// else the run reports an error instead of a figure. The device lies in TMPDIR (default /tmp).
#include <benchmark/benchmark.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>

#include "bench_support.h"
#include "replay/runner.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "state/todo_list.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using host::DeviceSession;
using host::replay::Runner;
using host::replay::Script;
using host::replay::Transcript;

constexpr int kAppsPerPage = 20;
constexpr const char* kUploadFolder = "var/mobile/Media/PublicStaging/ApplicationSync";

std::string appIdentifier(int i) {
  char text[64];
  std::snprintf(text, sizeof text, "com.example.harbor%04d", i);
  return text;
}

std::string appName(int i) {
  char text[64];
  std::snprintf(text, sizeof text, "Harbor%04d", i);
  return text;
}

std::string syncScript(int apps) {
  std::ostringstream s;
  s << "device: {road: legacy}\nsteps:\n";
  s << "  - stage: file\n    path: " << kUploadFolder << "/ApplicationsSync.plist\n    plist:\n";
  for (int i = 0; i < apps; ++i) {
    s << "      - {identifier: " << appIdentifier(i) << ", operation: install, version: \"1.0\""
      << ", name: " << appName(i) << "}\n";
  }
  s << "  - stage: file\n    path: " << kUploadFolder << "/PavilionIconState.plist\n    plist:\n";
  for (int i = 0; i < apps; ++i) {
    s << (i % kAppsPerPage == 0 ? "      - [" : ", ") << appIdentifier(i);
    if (i % kAppsPerPage == kAppsPerPage - 1 || i == apps - 1) s << "]\n";
  }
  s << "  - call: \"reconcileSync:withNewAnchor:progressCallback:error:\"\n"
       "    syncType: 1\n    newAnchor: B1\n";
  s << "  - call: outstandingAssetTransfers\n";
  for (int i = 0; i < apps; ++i) {
    s << "  - {stage: package, identifier: " << appIdentifier(i) << ", name: " << appName(i)
      << ", as: folder}\n";
    s << "  - call: \"assetTransfer:succeeded:withError:\"\n    asset: {identifier: "
      << appIdentifier(i) << ", download: true, path: var/mobile/Media/PublicStaging/" << appName(i)
      << ".app, variantOptions: {Version: \"1.0\"}}\n    succeeded: true\n";
  }
  s << "  - call: \"assetTransferEndedWithSuccess:\"\n    success: true\n";
  s << "  - call: \"syncEndedWithSuccess:\"\n    success: true\n";
  return s.str();
}

// Empty when every app of the todo list is installed; else what is not.
std::string notInstalled(const DeviceSession& session, int apps) {
  const std::optional<plist::Bytes> bytes = readFile(session.paths().todoList());
  const std::optional<plist::Value> list = bytes ? plist::parse(*bytes) : std::nullopt;
  if (!list || !list->array()) return "the todo list is missing or unreadable";
  for (int i = 0; i < apps; ++i) {
    const plist::Dict* record = findTodoRecord(*list->array(), appIdentifier(i));
    const std::string* state = record ? plist::stringAt(*record, kTodoOperationKey) : nullptr;
    if (!state || *state != kTodoInstalled) {
      return appIdentifier(i) + " ended as " + (state ? *state : std::string("nothing"));
    }
  }
  return "";
}

// One sync on a fresh device at `root`. Empty when every step passed and every app ended
// installed; else what went wrong. Only running the steps is timed.
std::string timedSync(benchmark::State& state, const Script& script, const fs::path& root,
                      int apps) {
  std::unique_ptr<DeviceSession> session = host::replay::openScriptDevice(script, root, true);
  std::ostringstream transcriptText;  // quiet: failed steps only
  std::ostringstream errors;
  Transcript transcript(transcriptText, true);
  std::size_t failed = 0;
  {
    Runner runner(script, *session, transcript, errors);
    state.ResumeTiming();
    failed = runner.run();
    state.PauseTiming();
  }
  const std::string missing = notInstalled(*session, apps);
  session->close();
  if (failed > 0) return "a step failed: " + errors.str();
  return missing;
}

void BM_LegacySync(benchmark::State& state) {
  const int apps = static_cast<int>(state.range(0));
  const bench::TempDir workspace("legacy_sync_bench");
  if (workspace.path().empty()) {
    state.SkipWithError("could not make the temporary directory");
    return;
  }
  const fs::path scriptFile = workspace.path() / "sync.yaml";
  std::ofstream(scriptFile) << syncScript(apps);
  const fs::path root = workspace.path() / "device";
  for (auto _ : state) {
    state.PauseTiming();
    std::string problem;
    try {
      problem = timedSync(state, host::replay::loadScript(scriptFile), root, apps);
    } catch (const std::exception& e) {  // bad input, or a device that cannot be made or saved
      problem = e.what();
    }
    state.ResumeTiming();
    if (!problem.empty()) {
      state.SkipWithError(problem.c_str());
      break;
    }
  }
  state.counters["apps"] = apps;
  state.SetItemsProcessed(state.iterations() * apps);
}
BENCHMARK(BM_LegacySync)
    ->Arg(100)
    ->Arg(1000)
    ->Iterations(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
