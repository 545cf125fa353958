// The lock that gives one command at a time a device: an exclusive advisory lock on
// ROOT/.platform/lock, held for the command's whole run and released when the process ends
// (also when it crashes).
#pragma once

#include <filesystem>
#include <stdexcept>
#include <string>

namespace appsync::host {

// Another command holds the device. Commands print it and exit with status 1.
class DeviceBusy : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

class DeviceLock {
 public:
  // Takes the lock of the device whose state lives in `stateDirectory`, without waiting.
  // Throws DeviceBusy naming the root and the holder's process id, or std::runtime_error when the
  // lock file cannot be opened.
  static DeviceLock acquire(const std::filesystem::path& stateDirectory);
  DeviceLock(DeviceLock&& other) noexcept;
  DeviceLock& operator=(DeviceLock&& other) noexcept;
  ~DeviceLock();

 private:
  explicit DeviceLock(int fd) : fd_(fd) {}
  int fd_ = -1;
};

}  // namespace appsync::host
