// The replay's transcript: one JSON object per step on one line, then a summary line.
#pragma once

#include <cstddef>
#include <optional>
#include <ostream>
#include <string>

#include "device_session.h"
#include "replay/step_context.h"

namespace appsync::host::replay {

struct StepRecord {
  std::size_t step = 0;  // steps[step]
  int line = 0;
  std::string action;                     // "call supportedDataclasses"
  std::optional<std::string> background;  // the name of a step started in the background
  ActionResult result;
  DeviceSession::Produced produced;  // log lines and transactions of the step
  std::string outcome;               // "ok", "not implemented" or "failed: what differed"
  bool failed = false;
};

class Transcript {
 public:
  // Quiet: only failed steps and the summary.
  Transcript(std::ostream& out, bool quiet) : out_(out), quiet_(quiet) {}

  void step(const StepRecord& record);
  void summary(std::size_t steps, std::size_t failed);

 private:
  std::ostream& out_;
  bool quiet_;
};

}  // namespace appsync::host::replay
