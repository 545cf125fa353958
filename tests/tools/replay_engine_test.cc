// The replay engine: virtual time moved deadline by deadline, background steps, and failed
// expectations reported with their step and line while the replay goes on.
#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <mutex>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "replay/runner.h"
#include "runtime/dispatch/delayed_work.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using host::replay::Runner;

std::size_t countLines(const std::string& text, const std::string& part) {
  std::size_t count = 0;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) count += line.find(part) != line.npos;
  return count;
}

// A device in a temporary directory, and the replay on it of script.yaml: "steps:" on line 1,
// then `steps`.
struct EngineReplay {
  explicit EngineReplay(const FakePlatform::Options& options = {})
      : session(host::DeviceSession::create(dir.path() / "device", options)) {}
  std::size_t run(const std::string& steps, const std::function<void(Runner&)>& setUp = {},
                  bool quiet = false) {
    const auto script = host::replay::readScript(
        host::YamlField::loadText("steps:\n" + steps, dir / "script.yaml"), dir.path());
    host::replay::Transcript transcript(out, quiet);
    Runner runner(script, *session, transcript, errors);
    if (setUp) setUp(runner);
    return runner.run();
  }
  testing::TempDir dir;
  std::unique_ptr<host::DeviceSession> session;
  std::ostringstream out, errors;
};

// Timers due within one advance fire one by one, each at its own time: a single jump would
// make them all fire at the end, together.
TEST(ReplayEngineTest, AdvanceFiresEachTimerAtItsDeadlineInOrder) {
  EngineReplay replay;
  ManualClock& clock = replay.session->clock();
  const TimePoint start = clock.now();
  DelayedWorkQueue timers("timers", clock);
  std::mutex mutex;
  std::vector<std::pair<std::string, Duration>> fired;
  const auto fire = [&](std::string name) {
    return [&, name] {
      std::lock_guard lock(mutex);
      fired.emplace_back(name, clock.now() - start);
    };
  };
  timers.after(10s, fire("a"));
  clock.waitForWaiters(1);
  timers.after(30s, fire("c"));
  timers.after(25s, fire("b"));
  timers.after(41s, fire("d"));

  EXPECT_EQ(replay.run("  - advance: 30s\n  - advance: 10s\n",
                       [&](Runner& r) { r.alsoSettle([&] { timers.waitUntilIdle(); }); }),
            0u)
      << replay.errors.str();
  std::lock_guard lock(mutex);
  EXPECT_EQ(fired,
            (std::vector<std::pair<std::string, Duration>>{{"a", 10s}, {"b", 25s}, {"c", 30s}}));
  EXPECT_EQ(clock.now() - start, 40s);
  EXPECT_EQ(countLines(replay.out.str(), "\"outcome\":\"ok\""), 2u) << replay.out.str();
}

// A held service keeps its events across the steps that follow (the engine settles the device
// after every step without letting them go); the end of the replay delivers them.
TEST(ReplayEngineTest, HeldEventsWaitUntilTheScriptReleasesThem) {
  EngineReplay replay;
  CallbackThread& registryEvents = replay.session->device().ar().callbackThread();
  std::vector<std::size_t> heldAfterSettling;  // events still queued each time the device rests
  EXPECT_EQ(replay.run("  - call: supportedDataclasses\n"
                       "  - {event: hold, service: registry}\n"
                       "  - {platform: install-app, identifier: com.example.notes, name: Notes}\n"
                       "  - {expect: registry, app: com.example.notes, version: \"1.0\"}\n",
                       [&](Runner& r) {
                         r.alsoSettle(
                             [&] { heldAfterSettling.push_back(registryEvents.pendingCount()); });
                       }),
            0u)
      << replay.errors.str() << replay.out.str();
  ASSERT_GE(heldAfterSettling.size(), 4u);
  EXPECT_EQ(heldAfterSettling[1], 0u);  // held, nothing happened yet
  EXPECT_GT(heldAfterSettling[2], 0u);  // the install's events wait ...
  EXPECT_GT(heldAfterSettling[3], 0u);  // ... across the next step too
  EXPECT_EQ(heldAfterSettling.back(), 0u);
  EXPECT_FALSE(registryEvents.isHeld());
}

// An await of a step that waits for a held service fails with the reason instead of hanging,
// and the replay still ends: what is held is let go at the end and the step finishes.
TEST(ReplayEngineTest, AnAwaitThatCouldNeverFinishSaysWhy) {
  EngineReplay replay(
      {.coordination = true, .mainBundleIdentifier = std::string(kHostDaemonBundleIdentifier)});
  EXPECT_EQ(replay.run("  - {event: hold, service: notifications}\n"
                       "  - {event: startup, background: up}\n"
                       "  - await: up\n",
                       [](Runner& r) { r.setPatience(std::chrono::milliseconds(50)); }),
            1u);
  EXPECT_NE(replay.errors.str().find("script.yaml:4: steps[2]: still running while the script "
                                     "holds notifications: release it before the await"),
            std::string::npos)
      << replay.errors.str();
  EXPECT_TRUE(replay.session->client().hasInstallCoordinatorObserver());
}

TEST(ReplayEngineTest, BackgroundStepsAreCheckedWhenAwaitedAndFailWhenForgotten) {
  EngineReplay replay;
  EXPECT_EQ(replay.run("  - {call: supportedDataclasses, background: first}\n"
                       "  - {call: supportedDataclasses, background: second}\n"
                       "  - {await: second, result: [Calendar]}\n"
                       "  - {await: first, result: [Application]}\n"
                       "  - {call: supportedDataclasses, background: forgotten}\n",
                       {}, true),
            2u);
  const std::string file = replay.dir / "script.yaml", errors = replay.errors.str();
  EXPECT_NE(errors.find(file + ":4: steps[2]: result[0]: expected \"Calendar\", found "
                               "\"Application\""),
            std::string::npos)
      << errors;
  EXPECT_NE(errors.find(file + ":6: steps[4]: background step forgotten never awaited"),
            std::string::npos)
      << errors;
  // Quiet: the two failed steps only (the summary is the command's).
  EXPECT_EQ(countLines(replay.out.str(), "\"step\""), 2u) << replay.out.str();
  EXPECT_EQ(countLines(replay.out.str(), "\"result\":[\"Application\"]"), 2u) << replay.out.str();
}

TEST(ReplayEngineTest, FailedExpectationsAreReportedAndTheReplayGoesOnToExitOne) {
  testing::TempDir dir;
  const std::filesystem::path root = dir.path() / "device";
  std::filesystem::create_directories(root);
  // A directory that holds no device is never cleared, even with --fresh.
  testing::writeText(root / "keep.txt", "mine");
  const std::filesystem::path script = dir.path() / "script.yaml";
  testing::writeText(script,
                     "device: {}\n"
                     "steps:\n"
                     "  - {expect: todo, app: com.example.notes, state: SENT}\n"
                     "  - {expect: file, path: keep.txt}\n"
                     "  - {expect: file, path: var/mobile/nothing.plist, plist: [1]}\n"
                     "  - {expect: registry, app: com.example.notes, absent: true}\n");
  std::ostringstream out, errors;
  const host::replay::ReplayRequest request{.script = script, .root = root, .fresh = true};
  EXPECT_EQ(host::replay::replay(request, out, errors), host::kExitFailed);
  const std::string file = script.string();
  EXPECT_NE(errors.str().find(file + ":3: steps[0]: expected com.example.notes SENT, found no "
                                     "todo list"),
            std::string::npos)
      << errors.str();
  EXPECT_NE(errors.str().find(file + ":5: steps[2]: var/mobile/nothing.plist does not exist"),
            std::string::npos)
      << errors.str();
  EXPECT_EQ(countLines(out.str(), "\"outcome\":\"ok\""), 2u) << out.str();
  EXPECT_NE(out.str().find("{\"summary\":{\"steps\":4,\"failed\":2}}"), std::string::npos)
      << out.str();
  EXPECT_EQ(testing::readText(root / "keep.txt"), "mine");

  // The device made there is a device: --fresh replaces it; without --fresh it is refused.
  std::ostringstream again, refused;
  EXPECT_EQ(host::replay::replay(request, again, refused), host::kExitFailed) << refused.str();
  EXPECT_FALSE(std::filesystem::exists(root / "keep.txt"));
  const host::replay::ReplayRequest keep{.script = script, .root = root};
  EXPECT_EQ(host::replay::replay(keep, again, refused), host::kExitBadInput);
  EXPECT_NE(refused.str().find("already holds a device"), std::string::npos) << refused.str();
}

}  // namespace
}  // namespace appsync
