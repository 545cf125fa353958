// appsync-host device init: makes a new device in a directory, from a description or the small
// default one, and says what it holds.
#include <cstdio>
#include <exception>
#include <memory>
#include <optional>
#include <string>
#include <system_error>

#include "commands.h"
#include "device_description.h"
#include "device_session.h"
#include "input_error.h"

namespace appsync::host {

namespace {

namespace fs = std::filesystem;

std::string relativeTo(const fs::path& root, const std::optional<std::string>& path) {
  if (!path) return "-";
  return fs::path(*path).lexically_relative(root).generic_string();
}

void printDevice(DeviceSession& session, const FakePlatform::Options& options) {
  std::size_t placeholders = 0;
  const auto apps = session.device().ar().applications();
  for (const auto& app : apps) {
    placeholders += app.isPlaceholder ? 1 : 0;
    std::printf("%s\t%s\t%s\t%s\t%s\n", app.identifier.c_str(), app.version.value_or("-").c_str(),
                app.applicationType.c_str(), app.isPlaceholder ? "placeholder" : "installed",
                relativeTo(session.root(), app.bundleDirectory).c_str());
  }
  std::printf("device at %s: %s road, %s the host daemon, %zu app%s (%zu placeholder%s)\n",
              session.root().string().c_str(), options.coordination ? "coordination" : "legacy",
              options.mainBundleIdentifier == "com.vantor.trc" ? "inside" : "outside", apps.size(),
              apps.size() == 1 ? "" : "s", placeholders, placeholders == 1 ? "" : "s");
}

int initDevice(const fs::path& root, const std::string& from) {
  std::optional<YamlField> description;
  if (!from.empty()) description = YamlField::loadFile(from);
  const YamlField* given = description ? &*description : nullptr;
  // Reading the options reads the whole description: bad input stops before the device exists.
  const FakePlatform::Options options = deviceOptions(given);
  std::unique_ptr<DeviceSession> session = DeviceSession::create(root, options);
  try {
    applyDescription(*session, given);
    session->close();
  } catch (...) {
    // No half-made device stays behind: without its state the root holds no device.
    session.reset();
    std::error_code ec;
    fs::remove_all(DeviceSession::stateDirectory(root), ec);
    throw;
  }
  printDevice(*session, options);
  return kExitDone;
}

}  // namespace

void addDeviceCommands(CLI::App& app, int& status) {
  auto* device = app.add_subcommand("device", "Make and manage simulated devices");
  device->require_subcommand(1);
  auto* init = device->add_subcommand(
      "init", "Make a new device in a directory, from a description or the default one");
  auto root = std::make_shared<std::string>();
  auto from = std::make_shared<std::string>();
  init->add_option("--root", *root, "Directory of the device (must not hold one yet)")->required();
  init->add_option("--from", *from, "Device description (YAML; see docs/device-description.md)");
  init->callback([root, from, &status] {
    try {
      status = initDevice(fs::absolute(*root).lexically_normal(), *from);
    } catch (const InputError& e) {
      std::fprintf(stderr, "appsync-host device init: %s\n", e.what());
      status = kExitBadInput;
    } catch (const std::exception& e) {
      std::fprintf(stderr, "appsync-host device init: %s\n", e.what());
      status = kExitFailed;
    }
  });
}

}  // namespace appsync::host
