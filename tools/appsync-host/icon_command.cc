// appsync-host icon: renders a bundle's home-screen icon to a PNG file, as the device shows it.
#include <cstdio>
#include <memory>
#include <string>

#include "commands.h"
#include "platform/icon/home_screen_icon_service.h"
#include "runtime/fs/files.h"

namespace appsync::host {

namespace {

int renderIcon(const std::string& bundleDir, const std::string& out, int size) {
  std::string why;
  auto png = renderIconPng(bundleDir, size, &why);
  if (!png) {
    std::fprintf(stderr, "%s: no icon: %s\n", bundleDir.c_str(), why.c_str());
    return 1;
  }
  ErrorRef error;
  if (!writeFileAtomically(out, *png, &error)) {
    std::fprintf(stderr, "%s: cannot write: %s\n", out.c_str(),
                 error ? error->describe().c_str() : "unknown error");
    return 1;
  }
  std::printf("%s: %d x %d icon\n", out.c_str(), size, size);
  return 0;
}

}  // namespace

void addIconCommand(CLI::App& app, int& status) {
  auto* command =
      app.add_subcommand("icon", "Render an application bundle's home-screen icon as a PNG file");
  auto bundleDir = std::make_shared<std::string>();
  auto out = std::make_shared<std::string>();
  auto size = std::make_shared<int>(HomeScreenIconService::kDefaultIconSize);
  command->add_option("BUNDLE_DIR", *bundleDir, "Application bundle directory (NAME.app)")
      ->required();
  command->add_option("-o,--output", *out, "PNG file to write")->required();
  command->add_option("--size", *size, "Icon side in pixels")
      ->capture_default_str()
      ->check(CLI::Range(1, HomeScreenIconService::kMaxIconSize));
  command->callback(
      [bundleDir, out, size, &status] { status = renderIcon(*bundleDir, *out, *size); });
}

}  // namespace appsync::host
