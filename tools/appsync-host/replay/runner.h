// Running a replay script over a device: the steps in order, background steps on threads of
// their own, virtual time moved deadline by deadline, and the device at rest after every step.
#pragma once

#include <atomic>
#include <cstddef>
#include <exception>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <ostream>
#include <string>
#include <thread>
#include <vector>

#include "device_session.h"
#include "replay/expectations.h"
#include "replay/script.h"
#include "replay/step_context.h"
#include "replay/transcript.h"

namespace appsync::host::replay {

class Runner {
 public:
  // Failed steps are also reported on `errors` ("SCRIPT:LINE: steps[N]: what differed").
  Runner(const Script& script, DeviceSession& session, Transcript& transcript,
         std::ostream& errors);
  // Collects background steps still running (an InputError cut the replay short).
  ~Runner();
  Runner(const Runner&) = delete;
  Runner& operator=(const Runner&) = delete;

  // Work of the caller's own to wait for whenever the device is brought to rest, after the
  // session has settled (a test's own timer queue).
  void alsoSettle(std::function<void()> settle) { extraSettle_ = std::move(settle); }
  // How long an await lets a background step run before it looks for a held service or a wait
  // on the clock that keeps the step from finishing, and the most a background step is given to
  // get going before the next step starts (real time; 10 seconds by default).
  void setPatience(std::chrono::milliseconds patience) { patience_ = patience; }

  // Runs every step; returns how many failed. An action's bad arguments stop the replay with
  // InputError (background steps are collected first).
  std::size_t run();

 private:
  struct Background {
    const Step* step = nullptr;
    std::thread thread;
    std::atomic<bool> done{false};
    ActionResult result;
    std::exception_ptr error;
  };

  void runStep(const Step& step);
  void runAwait(const Step& step, StepRecord& record);
  void startBackground(const Step& step);
  // Returns once the step has finished, or some thread waits on the clock, or a service is held
  // (or after the patience).
  void letBackgroundGetGoing(const Background& background);
  // Joins a background step; rethrows its InputError, else gives its failure (empty: none).
  std::string collect(Background& background);
  // Waits for a background step to finish. When it is still running after a while and can only
  // be waiting for a held service or for time to move, says so instead of waiting for ever.
  std::optional<std::string> waitOrExplain(Background& background);
  // Lets every held service go and moves time on until each background step has finished: the
  // end of a replay, where nothing else would make them finish.
  void finishBackground();
  void advance(Duration by);
  void settle();
  void finish(const Step& step, StepRecord& record, bool expectation);
  void joinAll();

  const Script& script_;
  DeviceSession& session_;
  Transcript& transcript_;
  std::ostream& errors_;
  std::function<void()> extraSettle_;
  std::chrono::milliseconds patience_{10'000};
  std::map<std::string, std::unique_ptr<Background>> background_;
  // Awaited while they could not finish: joined at the end, once they can.
  std::vector<std::unique_ptr<Background>> abandoned_;
  ReplayOutput output_;
  std::size_t failed_ = 0;
};

// The device a script runs on: with `device:`, a new one made at `root` (an existing device
// there is removed first when `fresh`; a directory without .platform is never removed), else
// the device already at `root`. Throws InputError, or DeviceBusy.
std::unique_ptr<DeviceSession> openScriptDevice(const Script& script,
                                                const std::filesystem::path& root, bool fresh);

struct ReplayRequest {
  std::filesystem::path script;
  std::filesystem::path root;
  bool fresh = false;
  bool quiet = false;
};

// `appsync-host replay`: reads the script, runs it, saves the device. Returns the exit status:
// 0 done, 1 a step failed (or the device is busy), 2 bad input (the message on `errors`).
int replay(const ReplayRequest& request, std::ostream& out, std::ostream& errors);

}  // namespace appsync::host::replay
