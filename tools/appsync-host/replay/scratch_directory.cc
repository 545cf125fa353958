// Scratch directories under the device root.
#include "replay/scratch_directory.h"

#include <atomic>
#include <string>
#include <system_error>

#include "device_files.h"

namespace appsync::host::replay {

ScratchDirectory::ScratchDirectory(const std::filesystem::path& root) {
  const std::filesystem::path parent = root / "tmp";
  makeDeviceDirectory(root, parent);  // refuses a link on the way
  // Steps may run side by side (in the background), and a killed command may have left one.
  static std::atomic<unsigned> counter{0};
  std::error_code ec;
  do {
    path_ = parent / ("appsync-host-" + std::to_string(++counter));
  } while (std::filesystem::exists(std::filesystem::symlink_status(path_, ec)));
  makeDeviceDirectory(root, path_);
}

ScratchDirectory::~ScratchDirectory() {
  std::error_code ec;
  std::filesystem::remove_all(path_, ec);  // never follows a link inside
}

}  // namespace appsync::host::replay
