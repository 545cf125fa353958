// The subcommands of appsync-host. Each adds itself to the command line and runs when chosen.
#pragma once

#include <CLI/CLI.hpp>

namespace appsync::host {

// Each returns the process exit status through `status` once its subcommand has run.
void addPlistCommands(CLI::App& app, int& status);
void addIconCommand(CLI::App& app, int& status);
// `device init`.
void addDeviceCommands(CLI::App& app, int& status);
void addShowCommand(CLI::App& app, int& status);
void addReplayCommand(CLI::App& app, int& status);

}  // namespace appsync::host
