// One command at a time on a device: flock on ROOT/.platform/lock.
#include "device_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <utility>

namespace appsync::host {

DeviceLock DeviceLock::acquire(const std::filesystem::path& stateDirectory) {
  const std::string path = (stateDirectory / "lock").string();
  const int fd = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644);
  if (fd < 0) {
    throw std::runtime_error("cannot open the device lock " + path + ": " + std::strerror(errno));
  }
  if (::flock(fd, LOCK_EX | LOCK_NB) != 0) {
    const int err = errno;
    char holder[32] = {};
    const ssize_t n = ::pread(fd, holder, sizeof holder - 1, 0);
    ::close(fd);
    if (err != EWOULDBLOCK) {
      throw std::runtime_error("cannot lock the device " + path + ": " + std::strerror(err));
    }
    std::string pid = n > 0 ? std::string(holder, static_cast<std::size_t>(n)) : "unknown";
    while (!pid.empty() && (pid.back() == '\n' || pid.back() == ' ')) pid.pop_back();
    throw DeviceBusy("the device at " + stateDirectory.parent_path().string() +
                     " is in use by another appsync-host command (process " + pid +
                     "); try again when it has finished");
  }
  // Who holds it, for the message another command prints.
  const std::string pid = std::to_string(::getpid()) + "\n";
  if (::ftruncate(fd, 0) != 0 || ::pwrite(fd, pid.data(), pid.size(), 0) < 0) {
    // The pid is only a courtesy for the message; the lock itself is held.
  }
  return DeviceLock(fd);
}

DeviceLock::DeviceLock(DeviceLock&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}

DeviceLock& DeviceLock::operator=(DeviceLock&& other) noexcept {
  if (this != &other) {
    if (fd_ >= 0) ::close(fd_);
    fd_ = std::exchange(other.fd_, -1);
  }
  return *this;
}

DeviceLock::~DeviceLock() {
  if (fd_ >= 0) ::close(fd_);  // closing the descriptor releases the lock
}

}  // namespace appsync::host
