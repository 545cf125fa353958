// Running a replay script over a device: the steps in order, background steps on threads of
// their own, virtual time moved deadline by deadline, and the device at rest after every step.
#pragma once

#include <cstddef>
#include <exception>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
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

  // Runs every step; returns how many failed. An action's bad arguments stop the replay with
  // InputError (background steps are collected first).
  std::size_t run();

 private:
  struct Background {
    const Step* step;
    std::thread thread;
    ActionResult result;
    std::exception_ptr error;
  };

  void runStep(const Step& step);
  void runAwait(const Step& step, StepRecord& record);
  void startBackground(const Step& step);
  // Joins a background step; rethrows its InputError, else gives its failure (empty: none).
  std::string collect(Background& background);
  void advance(Duration by);
  void settle();
  void finish(const Step& step, StepRecord& record, bool expectation);
  void joinAll();

  const Script& script_;
  DeviceSession& session_;
  Transcript& transcript_;
  std::ostream& errors_;
  std::function<void()> extraSettle_;
  std::map<std::string, Background> background_;
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
