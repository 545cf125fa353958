// The replay engine: virtual time moved deadline by deadline, background steps, and failed
// expectations reported with their step and line while the replay goes on.
#include <gtest/gtest.h>

#include <filesystem>
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
using host::replay::Transcript;

host::replay::Script scriptOf(const testing::TempDir& dir, const std::string& text) {
  return host::replay::readScript(host::YamlField::loadText(text, dir / "script.yaml"), dir.path());
}

std::size_t countLines(const std::string& text, const std::string& part) {
  std::size_t count = 0;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) count += line.find(part) != line.npos;
  return count;
}

// Timers due within one advance fire one by one, each at its own time: a single jump would
// make them all fire at the end, together.
TEST(ReplayEngineTest, AdvanceFiresEachTimerAtItsDeadlineInOrder) {
  testing::TempDir dir;
  auto session = host::DeviceSession::create(dir.path() / "device", {});
  ManualClock& clock = session->clock();
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

  const auto script = scriptOf(dir, "steps:\n  - advance: 30s\n  - advance: 10s\n");
  std::ostringstream out, errors;
  Transcript transcript(out, false);
  {
    Runner runner(script, *session, transcript, errors);
    runner.alsoSettle([&] { timers.waitUntilIdle(); });
    EXPECT_EQ(runner.run(), 0u) << errors.str();
  }
  std::lock_guard lock(mutex);
  EXPECT_EQ(fired,
            (std::vector<std::pair<std::string, Duration>>{{"a", 10s}, {"b", 25s}, {"c", 30s}}));
  EXPECT_EQ(clock.now() - start, 40s);
  EXPECT_EQ(countLines(out.str(), "\"outcome\":\"ok\""), 2u) << out.str();
}

// A held service keeps its events across the steps that follow (the engine settles the device
// after every step without letting them go); the end of the replay delivers them.
TEST(ReplayEngineTest, HeldEventsWaitUntilTheScriptReleasesThem) {
  testing::TempDir dir;
  auto session = host::DeviceSession::create(dir.path() / "device", {});
  const auto script = scriptOf(dir,
                               "steps:\n"
                               "  - call: supportedDataclasses\n"
                               "  - event: hold\n"
                               "    service: registry\n"
                               "  - platform: install-app\n"
                               "    identifier: com.example.notes\n"
                               "    name: Notes\n"
                               "  - expect: registry\n"
                               "    app: com.example.notes\n"
                               "    version: \"1.0\"\n");
  CallbackThread& registryEvents = session->device().ar().callbackThread();
  std::vector<std::size_t> heldAfterSettling;  // events still queued each time the device rests
  std::ostringstream out, errors;
  Transcript transcript(out, false);
  {
    Runner runner(script, *session, transcript, errors);
    runner.alsoSettle([&] { heldAfterSettling.push_back(registryEvents.pendingCount()); });
    EXPECT_EQ(runner.run(), 0u) << errors.str() << out.str();
  }
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
  testing::TempDir dir;
  FakePlatform::Options daemon;
  daemon.coordination = true;
  daemon.mainBundleIdentifier = std::string(kHostDaemonBundleIdentifier);
  auto session = host::DeviceSession::create(dir.path() / "device", daemon);
  const auto script = scriptOf(dir,
                               "steps:\n"
                               "  - event: hold\n"
                               "    service: notifications\n"
                               "  - event: startup\n"
                               "    background: up\n"
                               "  - await: up\n");
  std::ostringstream out, errors;
  Transcript transcript(out, false);
  {
    Runner runner(script, *session, transcript, errors);
    runner.setPatience(std::chrono::milliseconds(50));
    EXPECT_EQ(runner.run(), 1u);
  }
  EXPECT_NE(errors.str().find("script.yaml:6: steps[2]: still running while the script holds "
                              "notifications: release it before the await"),
            std::string::npos)
      << errors.str();
  EXPECT_TRUE(session->client().hasInstallCoordinatorObserver());
}

TEST(ReplayEngineTest, BackgroundStepsAreCheckedWhenAwaitedAndFailWhenForgotten) {
  testing::TempDir dir;
  auto session = host::DeviceSession::create(dir.path() / "device", {});
  const auto script = scriptOf(dir,
                               "steps:\n"
                               "  - call: supportedDataclasses\n"
                               "    background: first\n"
                               "  - call: supportedDataclasses\n"
                               "    background: second\n"
                               "  - await: second\n"
                               "    result: [Calendar]\n"
                               "  - await: first\n"
                               "    result: [Application]\n"
                               "  - call: supportedDataclasses\n"
                               "    background: forgotten\n");
  std::ostringstream out, errors;
  Transcript transcript(out, true);
  Runner runner(script, *session, transcript, errors);
  EXPECT_EQ(runner.run(), 2u);
  const std::string file = (dir / "script.yaml");
  EXPECT_NE(errors.str().find(file + ":6: steps[2]: result[0]: expected \"Calendar\", found "
                                     "\"Application\""),
            std::string::npos)
      << errors.str();
  EXPECT_NE(errors.str().find(file + ":10: steps[4]: background step forgotten never awaited"),
            std::string::npos)
      << errors.str();
  // Quiet: the two failed steps only (the summary is the command's).
  EXPECT_EQ(countLines(out.str(), "\"step\""), 2u) << out.str();
  EXPECT_EQ(countLines(out.str(), "\"result\":[\"Application\"]"), 2u) << out.str();
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
                     "  - expect: todo\n"
                     "    app: com.example.notes\n"
                     "    state: SENT\n"
                     "  - expect: file\n"
                     "    path: keep.txt\n"
                     "  - expect: file\n"
                     "    path: var/mobile/nothing.plist\n"
                     "    plist: [1]\n"
                     "  - expect: registry\n"
                     "    app: com.example.notes\n"
                     "    absent: true\n");
  std::ostringstream out, errors;
  const host::replay::ReplayRequest request{.script = script, .root = root, .fresh = true};
  EXPECT_EQ(host::replay::replay(request, out, errors), host::kExitFailed);
  const std::string file = script.string();
  EXPECT_NE(errors.str().find(file + ":3: steps[0]: expected com.example.notes SENT, found no "
                                     "todo list"),
            std::string::npos)
      << errors.str();
  EXPECT_NE(errors.str().find(file + ":8: steps[2]: var/mobile/nothing.plist does not exist"),
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
