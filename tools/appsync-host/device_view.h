// The device as its fakes hold it, gathered into one JSON object: the registry, coordination,
// the todo list, restore state, the home screen, the installer, restrictions and the tails of
// the logs. `appsync-host show` prints it (as JSON or as tables); docs/simulator.md lists the
// keys. Gathering reads only: no operation of a fake is called and nothing is logged.
#pragma once

#include <cstddef>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "platform/fake/fake_platform.h"

namespace appsync::host {

// The name of the system notification whose state tells the home screen a sync is running.
inline constexpr const char* kSyncNotificationName = "com.vantor.pavilion.trc.wsyncnotify";

// `logFile` is the device's log (ROOT/appsync.log); `logLines` is how many of the last lines of
// it and of the transaction log to include.
nlohmann::ordered_json collectDevice(FakePlatform& device, const std::filesystem::path& logFile,
                                     std::size_t logLines);

// The last `count` lines of the text file at `path` (fewer when it has fewer; none when it is
// missing), without their line breaks.
std::vector<std::string> lastLinesOfFile(const std::filesystem::path& path, std::size_t count);

}  // namespace appsync::host
