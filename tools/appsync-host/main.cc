// appsync-host: plays the host daemon and the host computer against a device kept in a
// directory, and offers tools for the files of the field.
#include <CLI/CLI.hpp>

#include "commands.h"
#include "input_error.h"

int main(int argc, char** argv) {
  CLI::App app{"appsync-host: drive the application-sync plugin against a simulated device"};
  app.require_subcommand(1);
  int status = 0;
  appsync::host::addPlistCommands(app, status);
  appsync::host::addIconCommand(app, status);
  appsync::host::addDeviceCommands(app, status);
  appsync::host::addShowCommand(app, status);
  appsync::host::addReplayCommand(app, status);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& e) {
    // Help is success; any other mistake on the command line is bad input.
    const int printed = app.exit(e);
    return printed == 0 ? 0 : appsync::host::kExitBadInput;
  }
  return status;
}
