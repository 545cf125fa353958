// appsync-host replay SCRIPT.yaml --root DIR [--fresh] [--quiet]: runs a scripted session on a
// device and prints its transcript.
#include <iostream>
#include <memory>

#include "commands.h"
#include "replay/runner.h"

namespace appsync::host {

void addReplayCommand(CLI::App& app, int& status) {
  auto* command = app.add_subcommand(
      "replay", "Run a replay script on a device and print its transcript as JSON lines");
  auto request = std::make_shared<replay::ReplayRequest>();
  command->add_option("SCRIPT", request->script, "The script (YAML); docs/replay.md")->required();
  command->add_option("--root", request->root, "The device's directory")->required();
  command->add_flag("--fresh", request->fresh,
                    "Remove the device at the root first (for a script with \"device\")");
  command->add_flag("--quiet", request->quiet, "Print only failed steps and the summary");
  command->callback(
      [request, &status] { status = replay::replay(*request, std::cout, std::cerr); });
}

}  // namespace appsync::host
