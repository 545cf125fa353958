// The `expect:` steps of a replay: what the device, its log or its transaction log must show.
// Kinds: file, log, todo, registry, progress, homescreen, transactions, coordinator
// (docs/replay.md).
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "device_session.h"
#include "yaml_input.h"

namespace appsync::host::replay {

// Checks the fields of an `expect:` step (its kind, the fields that kind takes, their types)
// without looking at a device. Throws InputError naming the field.
void checkExpectation(const YamlField& step);

// What the replay has produced: from its start, and in the last step that was not an
// expectation (`since: start` or `since: step`).
struct ReplayOutput {
  DeviceSession::Produced sinceStart;
  DeviceSession::Produced lastStep;
};

// What differed, or nothing when the device meets the expectation. Throws InputError for a
// path that leads through a symbolic link.
std::optional<std::string> evaluateExpectation(DeviceSession& session, const YamlField& step,
                                               const ReplayOutput& output);

}  // namespace appsync::host::replay
