// appsync-host show: the device as its fakes hold it, as tables for a person or as one JSON
// object for scripts. It loads the device, reads it and saves it back unchanged; the client is
// never created.
#include <unistd.h>

#include <cstdio>
#include <exception>
#include <memory>
#include <string>

#include "commands.h"
#include "device_session.h"
#include "device_table.h"
#include "device_view.h"
#include "input_error.h"

namespace appsync::host {

namespace {

struct ShowArguments {
  std::string root;
  bool json = false;
  std::size_t lines = 10;
};

int runShow(const ShowArguments& arguments) {
  std::string output;
  try {
    std::unique_ptr<DeviceSession> session = DeviceSession::open(arguments.root);
    const nlohmann::ordered_json view =
        collectDevice(session->device(), DeviceSession::logFile(arguments.root), arguments.lines);
    session->close();
    output = arguments.json
                 ? view.dump(2, ' ', false, nlohmann::ordered_json::error_handler_t::replace) + "\n"
                 : renderDeviceTable(view, ::isatty(STDOUT_FILENO) == 1);
  } catch (const InputError& e) {
    std::fprintf(stderr, "appsync-host show: %s\n", e.what());
    return kExitBadInput;
  } catch (const DeviceBusy& e) {
    std::fprintf(stderr, "appsync-host show: %s\n", e.what());
    return kExitFailed;
  } catch (const std::exception& e) {
    std::fprintf(stderr, "appsync-host show: %s\n", e.what());
    return kExitFailed;
  }
  std::fwrite(output.data(), 1, output.size(), stdout);
  return kExitDone;
}

}  // namespace

void addShowCommand(CLI::App& app, int& status) {
  auto* command = app.add_subcommand("show", "Show the device as its platform services hold it");
  auto arguments = std::make_shared<ShowArguments>();
  command->add_option("--root", arguments->root, "The device's directory")->required();
  command->add_flag("--json", arguments->json, "One JSON object for scripts instead of tables");
  command->add_option("--lines", arguments->lines, "Lines of the log and transaction log to show")
      ->capture_default_str()
      ->check(CLI::Range(0, 1000000));
  command->callback([arguments, &status] { status = runShow(*arguments); });
}

}  // namespace appsync::host
