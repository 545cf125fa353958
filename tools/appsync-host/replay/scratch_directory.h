// A directory under the device root where an action builds something before moving or packing
// it into place (a bundle on its way into a zip archive or into the registry). Removed when the
// action is done.
#pragma once

#include <filesystem>

namespace appsync::host::replay {

class ScratchDirectory {
 public:
  // ROOT/tmp/appsync-host-N, created empty. Throws std::runtime_error when it cannot be made.
  explicit ScratchDirectory(const std::filesystem::path& root);
  ~ScratchDirectory();
  ScratchDirectory(const ScratchDirectory&) = delete;
  ScratchDirectory& operator=(const ScratchDirectory&) = delete;

  const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

}  // namespace appsync::host::replay
