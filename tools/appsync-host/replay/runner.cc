// The replay engine: steps in order, background steps, virtual time and expectations.
#include "replay/runner.h"

#include <system_error>

#include "device_description.h"
#include "replay/plist_difference.h"

namespace appsync::host::replay {

namespace fs = std::filesystem;

namespace {

void appendProduced(DeviceSession::Produced& to, const DeviceSession::Produced& from) {
  to.log.insert(to.log.end(), from.log.begin(), from.log.end());
  to.transactions.insert(to.transactions.end(), from.transactions.begin(), from.transactions.end());
}

// The outcome of an action's result against the step's `result` (or the awaiting step's).
void judgeResult(const YamlField& step, const ActionResult& result, StepRecord& record) {
  record.result = result;
  auto expected = step.optional("result");
  if (!expected) {
    const bool missing = result && result->string() && *result->string() == "not implemented";
    record.outcome = missing ? "not implemented" : "ok";
    return;
  }
  const plist::Value want = expected->plist();
  std::optional<std::string> difference;
  if (!result) {
    difference = "result: expected " + want.describe() + ", found nothing";
  } else {
    difference = firstDifference(want, *result, "result");
  }
  if (difference) {
    record.outcome = "failed: " + *difference;
    record.failed = true;
  } else {
    record.outcome = "ok";
  }
}

StepRecord recordOf(const Step& step) {
  StepRecord record;
  record.step = step.index;
  record.line = step.line;
  record.action = step.describe();
  return record;
}

void markFailed(StepRecord& record, const std::string& what) {
  record.outcome = "failed: " + what;
  record.failed = true;
}

// Removes the device at `root`: only a directory that holds one, and only while no other
// command holds it.
void removeDevice(const fs::path& root) {
  const fs::path state = DeviceSession::stateDirectory(root);
  std::error_code ec;
  if (!fs::is_directory(fs::symlink_status(state, ec))) return;
  DeviceLock lock = DeviceLock::acquire(state);
  for (const auto& entry : fs::directory_iterator(root)) {
    fs::remove_all(entry.path(), ec);  // links are removed, not followed
    if (ec)
      throw std::runtime_error("cannot remove " + entry.path().string() + ": " + ec.message());
  }
}

}  // namespace

Runner::Runner(const Script& script, DeviceSession& session, Transcript& transcript,
               std::ostream& errors)
    : script_(script), session_(session), transcript_(transcript), errors_(errors) {}

Runner::~Runner() { joinAll(); }

void Runner::joinAll() {
  finishBackground();
  for (auto& [name, background] : background_) {
    if (background->thread.joinable()) background->thread.join();
  }
  for (auto& background : abandoned_) {
    if (background->thread.joinable()) background->thread.join();
  }
}

void Runner::finishBackground() {
  session_.releaseHeld();
  settle();
  ManualClock& clock = session_.clock();
  std::vector<Background*> running;
  for (auto& [name, background] : background_) running.push_back(background.get());
  for (auto& background : abandoned_) running.push_back(background.get());
  for (Background* background : running) {
    while (!background->done) {
      if (auto next = clock.earliestDeadline()) {
        if (*next > clock.now()) clock.advance(*next - clock.now());
        clock.waitForDueWaiters();
      } else {
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
      }
      settle();
    }
  }
}

std::optional<std::string> Runner::waitOrExplain(Background& background) {
  // Real time, only to tell a step that cannot finish from one that is slow: the step either
  // finishes or is found waiting on something only the script can move.
  const auto giveUp = std::chrono::steady_clock::now() + patience_;
  while (!background.done && std::chrono::steady_clock::now() < giveUp) {
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  if (background.done) return std::nullopt;
  const std::vector<std::string> held = session_.heldServices();
  if (!held.empty()) {
    std::string names;
    for (const auto& name : held) names += (names.empty() ? "" : ", ") + name;
    return "still running while the script holds " + names + ": release it before the await";
  }
  if (session_.clock().waiterCount() > 0) {
    return "still waiting for time to pass: advance the clock before the await";
  }
  background.thread.join();  // busy, not stuck
  return std::nullopt;
}

std::size_t Runner::run() {
  for (const Step& step : script_.steps) runStep(step);
  finishBackground();
  // A step started in the background and never awaited: collected now, and a failure.
  for (auto& background : abandoned_) background->thread.join();
  abandoned_.clear();
  for (auto& [name, entry] : background_) {
    Background& background = *entry;
    StepRecord record = recordOf(*background.step);
    record.background = name;
    const std::string failure = collect(background);
    record.result = background.result;
    markFailed(record, "background step " + name + " never awaited" +
                           (failure.empty() ? "" : " (" + failure + ")"));
    finish(*background.step, record, true);
  }
  background_.clear();
  return failed_;
}

void Runner::runStep(const Step& step) {
  StepRecord record = recordOf(step);
  if (step.selector == "advance") {
    advance(step.value.duration());
    record.outcome = "ok";
  } else if (step.selector == "await") {
    runAwait(step, record);
  } else if (step.selector == "expect") {
    auto difference = evaluateExpectation(session_, step.field, output_);
    if (difference) {
      markFailed(record, *difference);
    } else {
      record.outcome = "ok";
    }
  } else if (step.background) {
    startBackground(step);
    record.background = step.background;
    record.outcome = "ok";
  } else {
    StepContext context{session_, step.field, step.selector, step.value, script_.directory};
    try {
      judgeResult(step.field, runAction(context), record);
    } catch (const InputError&) {
      throw;
    } catch (const std::exception& e) {
      markFailed(record, e.what());
    }
  }
  settle();
  finish(step, record, step.selector == "expect");
}

void Runner::startBackground(const Step& step) {
  auto& entry = background_[*step.background];
  entry = std::make_unique<Background>();
  Background& background = *entry;
  background.step = &step;
  background.thread = std::thread([this, &background, &step] {
    StepContext context{session_, step.field, step.selector, step.value, script_.directory};
    try {
      background.result = runAction(context);
    } catch (...) {
      background.error = std::current_exception();
    }
    background.done = true;
  });
  letBackgroundGetGoing(background);
}

void Runner::letBackgroundGetGoing(const Background& background) {
  // Real time again, only as a bound: the next step starts once this one has finished or may
  // be waiting for something only the script moves, so that time moved by a later `advance`
  // is time the step waits through, and what it did before its wait is done.
  const auto giveUp = std::chrono::steady_clock::now() + patience_;
  while (!background.done && std::chrono::steady_clock::now() < giveUp) {
    if (session_.clock().waiterCount() > 0 || !session_.heldServices().empty()) return;
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
}

std::string Runner::collect(Background& background) {
  if (auto stuck = waitOrExplain(background)) return *stuck;
  if (background.thread.joinable()) background.thread.join();
  settle();
  if (!background.error) return "";
  try {
    std::rethrow_exception(background.error);
  } catch (const InputError&) {
    throw;
  } catch (const std::exception& e) {
    return e.what();
  }
}

void Runner::runAwait(const Step& step, StepRecord& record) {
  auto found = background_.find(step.value.string());
  Background& background = *found->second;
  const std::string failure = collect(background);
  if (failure.empty()) {
    judgeResult(step.field, background.result, record);
  } else {
    record.result = background.result;
    markFailed(record, failure);
  }
  if (background.thread.joinable()) abandoned_.push_back(std::move(found->second));
  background_.erase(found);
}

// Time moves from one waiter's deadline to the next, and the device comes to rest at each, so
// that timers fire in deadline order however far the step moves it.
void Runner::advance(Duration by) {
  ManualClock& clock = session_.clock();
  const TimePoint target = clock.now() + by;
  for (;;) {
    auto next = clock.earliestDeadline();
    if (!next || *next > target) break;
    if (*next > clock.now()) clock.advance(*next - clock.now());
    clock.waitForDueWaiters();
    settle();
  }
  if (clock.now() < target) {
    clock.advance(target - clock.now());
    clock.waitForDueWaiters();
    settle();
  }
}

void Runner::settle() {
  session_.settle();
  if (extraSettle_) extraSettle_();
}

void Runner::finish(const Step& step, StepRecord& record, bool expectation) {
  record.produced = session_.takeProduced();
  appendProduced(output_.sinceStart, record.produced);
  if (!expectation) output_.lastStep = record.produced;
  if (record.failed) {
    ++failed_;
    errors_ << script_.file.string() << ":" << step.line << ": steps[" << step.index
            << "]: " << record.outcome.substr(std::string_view("failed: ").size()) << '\n';
  }
  transcript_.step(record);
}

std::unique_ptr<DeviceSession> openScriptDevice(const Script& script, const fs::path& root,
                                                bool fresh) {
  if (!script.device) {
    if (fresh) {
      throw InputError(script.file.string(), 0, "",
                       "--fresh makes a new device from the script's \"device\", and the "
                       "script names none");
    }
    return DeviceSession::open(root);
  }
  const YamlField& description = *script.device;
  const FakePlatform::Options options = deviceOptions(&description);
  if (fresh) {
    removeDevice(root);
  } else if (fs::exists(DeviceSession::stateDirectory(root))) {
    throw InputError(root.string(), 0, "",
                     "already holds a device (--fresh replaces it with the script's)");
  }
  auto session = DeviceSession::create(root, options);
  applyDescription(*session, &description);
  session->settle();
  session->takeProduced();  // the device's making is not the first step's
  return session;
}

int replay(const ReplayRequest& request, std::ostream& out, std::ostream& errors) {
  try {
    const Script script = loadScript(request.script);
    auto session = openScriptDevice(script, request.root, request.fresh);
    Transcript transcript(out, request.quiet);
    std::size_t failed = 0;
    {
      // An InputError leaves through here: the runner collects its background steps and the
      // session's destructor settles and saves the device.
      Runner runner(script, *session, transcript, errors);
      failed = runner.run();
    }
    session->close();
    transcript.summary(script.steps.size(), failed);
    return failed == 0 ? kExitDone : kExitFailed;
  } catch (const InputError& e) {
    errors << e.what() << '\n';
    return kExitBadInput;
  } catch (const std::exception& e) {
    // DeviceBusy, and work that could not be done (a device that cannot be saved).
    errors << "appsync-host replay: " << e.what() << '\n';
    return kExitFailed;
  }
}

}  // namespace appsync::host::replay
