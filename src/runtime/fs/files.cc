// Whole-file reads, atomic whole-file writes and directory operations over POSIX.
#include "runtime/fs/files.h"

#include <fcntl.h>
#include <stdio.h>  // renameat2
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <system_error>
#include <vector>

namespace appsync {

namespace {

// Closes a descriptor on every way out of a function.
class FileDescriptor {
 public:
  explicit FileDescriptor(int fd) : fd_(fd) {}
  ~FileDescriptor() {
    if (fd_ >= 0) ::close(fd_);
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;

  int get() const { return fd_; }
  bool valid() const { return fd_ >= 0; }
  // Closes now, reporting the result (a delayed write error can surface here).
  int close() {
    int result = ::close(fd_);
    fd_ = -1;
    return result;
  }

 private:
  int fd_;
};

bool fail(ErrorRef* error, int err, const std::string& path) {
  setError(error, makePOSIXError(err, path));
  return false;
}

// Writes everything, going on after partial writes and interruptions. False with errno set.
bool writeAll(int fd, const std::uint8_t* data, std::size_t size) {
  while (size > 0) {
    ssize_t n = ::write(fd, data, size);
    if (n < 0) {
      if (errno == EINTR) continue;
      return false;
    }
    data += n;
    size -= static_cast<std::size_t>(n);
  }
  return true;
}

// Reads up to `size` bytes, retrying interruptions. Returns what was read, or -1 with errno.
ssize_t readSome(int fd, std::uint8_t* data, std::size_t size) {
  for (;;) {
    ssize_t n = ::read(fd, data, size);
    if (n >= 0 || errno != EINTR) return n;
  }
}

int errnoOf(const std::error_code& ec) { return ec.value() != 0 ? ec.value() : EIO; }

FileIdentity identityOf(const struct stat& st) {
  return FileIdentity{st.st_dev, st.st_ino, st.st_size, st.st_mtim};
}

// Writes `bytes` to a new temporary file beside `path` (same directory, so that a rename stays
// within one file system and is atomic), with the old file's permission bits (0644 for a new
// file) and, where we may, its owner. Returns the temporary file's path, or absent with *error
// set and nothing left behind. *identity receives the new file's identity.
std::optional<std::string> writeTemporaryBeside(const std::string& path,
                                                std::span<const std::uint8_t> bytes,
                                                ErrorRef* error, FileIdentity* identity) {
  std::string::size_type slash = path.rfind('/');
  std::string directory = slash == std::string::npos ? std::string() : path.substr(0, slash + 1);
  std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  if (name.empty()) {
    fail(error, EISDIR, path);
    return std::nullopt;
  }

  mode_t mode = 0644;
  struct stat old;
  bool existed = ::stat(path.c_str(), &old) == 0;
  if (existed) {
    if (S_ISDIR(old.st_mode)) {
      fail(error, EISDIR, path);
      return std::nullopt;
    }
    mode = old.st_mode & 07777;
  }

  std::string temporary = directory + "." + name + ".XXXXXX";
  FileDescriptor fd(::mkostemp(temporary.data(), O_CLOEXEC));
  if (!fd.valid()) {
    fail(error, errno, path);
    return std::nullopt;
  }
  auto abandon = [&](int err) -> std::optional<std::string> {
    if (fd.valid()) fd.close();
    ::unlink(temporary.c_str());
    fail(error, err, path);
    return std::nullopt;
  };
  // Keep the old file's owner where we may (a privileged writer replacing a user's file);
  // permission bits go after the owner, since a change of owner can clear some of them.
  if (existed && (old.st_uid != ::geteuid() || old.st_gid != ::getegid())) {
    (void)!::fchown(fd.get(), old.st_uid, old.st_gid);
  }
  if (::fchmod(fd.get(), mode) != 0) return abandon(errno);
  if (!writeAll(fd.get(), bytes.data(), bytes.size())) return abandon(errno);
  struct stat written;
  if (::fstat(fd.get(), &written) != 0) return abandon(errno);
  if (fd.close() != 0) return abandon(errno);
  if (identity) *identity = identityOf(written);
  return temporary;
}

}  // namespace

bool FileIdentity::operator==(const FileIdentity& other) const {
  return device == other.device && inode == other.inode && size == other.size &&
         modified.tv_sec == other.modified.tv_sec && modified.tv_nsec == other.modified.tv_nsec;
}

std::optional<FileIdentity> fileIdentity(const std::string& path) {
  struct stat st;
  if (::stat(path.c_str(), &st) != 0) return std::nullopt;
  return identityOf(st);
}

std::optional<plist::Bytes> readFile(const std::string& path, ErrorRef* error,
                                     FileIdentity* identity) {
  FileDescriptor fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!fd.valid()) {
    fail(error, errno, path);
    return std::nullopt;
  }
  struct stat st;
  if (::fstat(fd.get(), &st) != 0) {
    fail(error, errno, path);
    return std::nullopt;
  }
  if (S_ISDIR(st.st_mode)) {
    fail(error, EISDIR, path);
    return std::nullopt;
  }
  if (static_cast<std::uint64_t>(st.st_size) > plist::kMaxInputSize) {
    fail(error, EFBIG, path);
    return std::nullopt;
  }
  if (identity) *identity = identityOf(st);
  plist::Bytes bytes;
  // The size is only a hint: the file may change while it is read, and some files report 0.
  // One byte more than announced lets the loop see the end without another resize.
  bytes.resize(static_cast<std::size_t>(st.st_size) + 1);
  std::size_t used = 0;
  for (;;) {
    if (used == bytes.size()) {
      if (bytes.size() > plist::kMaxInputSize) {
        fail(error, EFBIG, path);
        return std::nullopt;
      }
      bytes.resize(std::min(bytes.size() * 2 + 4096, plist::kMaxInputSize + 1));
    }
    ssize_t n = readSome(fd.get(), bytes.data() + used, bytes.size() - used);
    if (n < 0) {
      fail(error, errno, path);
      return std::nullopt;
    }
    if (n == 0) break;
    used += static_cast<std::size_t>(n);
  }
  if (used > plist::kMaxInputSize) {
    fail(error, EFBIG, path);
    return std::nullopt;
  }
  bytes.resize(used);
  return bytes;
}

bool writeFileAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                         ErrorRef* error) {
  std::optional<std::string> temporary = writeTemporaryBeside(path, bytes, error, nullptr);
  if (!temporary) return false;
  if (::rename(temporary->c_str(), path.c_str()) != 0) {
    int err = errno;
    ::unlink(temporary->c_str());
    return fail(error, err, path);
  }
  return true;
}

ReplaceOutcome replaceFileIfUnchanged(const std::string& path, std::span<const std::uint8_t> bytes,
                                      const FileIdentity& expected, FileIdentity* written,
                                      ErrorRef* error) {
  FileIdentity mine;
  std::optional<std::string> temporary = writeTemporaryBeside(path, bytes, error, &mine);
  if (!temporary) return ReplaceOutcome::Failed;
  const char* tmp = temporary->c_str();
  auto done = [&](ReplaceOutcome outcome) {
    ::unlink(tmp);
    if (outcome == ReplaceOutcome::Replaced && written) *written = mine;
    return outcome;
  };

  if (::renameat2(AT_FDCWD, tmp, AT_FDCWD, path.c_str(), RENAME_EXCHANGE) != 0) {
    if (errno == ENOENT) return done(ReplaceOutcome::Changed);  // removed since it was read
    if (errno != EINVAL && errno != ENOSYS) {
      fail(error, errno, path);
      return done(ReplaceOutcome::Failed);
    }
    // A file system without exchange: check, then rename, which leaves a short window.
    if (fileIdentity(path) != expected) return done(ReplaceOutcome::Changed);
    if (::rename(tmp, path.c_str()) != 0) {
      fail(error, errno, path);
      return done(ReplaceOutcome::Failed);
    }
    if (written) *written = mine;
    return ReplaceOutcome::Replaced;
  }
  // The displaced file now lies at the temporary name.
  if (fileIdentity(*temporary) == expected) return done(ReplaceOutcome::Replaced);

  // Someone replaced the file after it was read: put their version back. Should yet another
  // version have arrived over ours meanwhile, it is the newest and takes the path instead.
  if (::renameat2(AT_FDCWD, tmp, AT_FDCWD, path.c_str(), RENAME_EXCHANGE) == 0 &&
      fileIdentity(*temporary) != mine) {
    ::rename(tmp, path.c_str());
  }
  return done(ReplaceOutcome::Changed);
}

bool writePlistAtomically(const std::string& path, const plist::Value& value, plist::Format format,
                          ErrorRef* error) {
  std::string message;
  std::optional<plist::Bytes> bytes = plist::write(value, format, &message);
  if (!bytes) {
    setError(error, makeError(kPropertyListErrorDomain, 1, message, path));
    return false;
  }
  return writeFileAtomically(path, *bytes, error);
}

std::optional<plist::Dict> readPlistDictionary(const std::string& path) {
  std::optional<plist::Bytes> bytes = readFile(path);
  if (!bytes) return std::nullopt;
  std::optional<plist::Value> root = plist::parse(*bytes);
  if (!root || !root->dict()) return std::nullopt;
  return std::move(*root->dict());
}

bool fileExists(const std::string& path) {
  struct stat st;
  return ::stat(path.c_str(), &st) == 0;
}

bool isSymbolicLink(const std::string& path) {
  struct stat st;
  return ::lstat(path.c_str(), &st) == 0 && S_ISLNK(st.st_mode);
}

bool directoryExists(const std::string& path) {
  struct stat st;
  return ::stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

std::size_t existingDirectoryPrefix(const std::string& path) {
  std::size_t end = path.size();
  while (end > 0 && !directoryExists(path.substr(0, end))) {
    const std::string::size_type slash = path.rfind('/', end - 1);
    end = slash == std::string::npos ? 0 : slash;
  }
  return end;
}

bool createDirectories(const std::string& path, ErrorRef* error) {
  if (path.empty()) return fail(error, ENOENT, path);
  const std::size_t existing = existingDirectoryPrefix(path);
  if (existing == path.size()) return true;
  // Each prefix that ends a component past the existing one, then the whole path.
  for (std::string::size_type end = path.find('/', existing + 1);; end = path.find('/', end + 1)) {
    std::string prefix = path.substr(0, end);
    if (!prefix.empty() && prefix.back() != '/' && ::mkdir(prefix.c_str(), 0755) != 0) {
      int err = errno;
      if (err != EEXIST || !directoryExists(prefix)) {
        return fail(error, err == EEXIST ? ENOTDIR : err, path);
      }
    }
    if (end == std::string::npos) break;
  }
  return true;
}

bool createDirectory(const std::string& path, ErrorRef* error) {
  if (::mkdir(path.c_str(), 0755) != 0) return fail(error, errno, path);
  return true;
}

bool removeAll(const std::string& path, ErrorRef* error) {
  std::error_code ec;
  std::filesystem::remove_all(path, ec);
  if (ec) return fail(error, errnoOf(ec), path);
  return true;
}

bool removeFile(const std::string& path, ErrorRef* error) {
  if (::unlink(path.c_str()) != 0) return fail(error, errno, path);
  return true;
}

bool moveItem(const std::string& from, const std::string& to, ErrorRef* error) {
  if (::rename(from.c_str(), to.c_str()) != 0) return fail(error, errno, from);
  return true;
}

bool copyFile(const std::string& from, const std::string& to, ErrorRef* error) {
  FileDescriptor source(::open(from.c_str(), O_RDONLY | O_CLOEXEC));
  if (!source.valid()) return fail(error, errno, from);
  struct stat st;
  if (::fstat(source.get(), &st) != 0) return fail(error, errno, from);
  if (!S_ISREG(st.st_mode)) return fail(error, S_ISDIR(st.st_mode) ? EISDIR : EINVAL, from);

  FileDescriptor target(
      ::open(to.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, st.st_mode & 07777));
  if (!target.valid()) return fail(error, errno, to);
  // From here on the destination is ours: remove it if the copy does not complete.
  auto abandon = [&](int err, const std::string& culprit) {
    target.close();
    ::unlink(to.c_str());
    return fail(error, err, culprit);
  };
  std::vector<std::uint8_t> buffer(64 * 1024);
  for (;;) {
    ssize_t n = readSome(source.get(), buffer.data(), buffer.size());
    if (n < 0) return abandon(errno, from);
    if (n == 0) break;
    if (!writeAll(target.get(), buffer.data(), static_cast<std::size_t>(n))) {
      return abandon(errno, to);
    }
  }
  if (target.close() != 0) {
    int err = errno;
    ::unlink(to.c_str());
    return fail(error, err, to);
  }
  return true;
}

std::optional<std::uint64_t> fileSize(const std::string& path, ErrorRef* error) {
  struct stat st;
  if (::stat(path.c_str(), &st) != 0) {
    fail(error, errno, path);
    return std::nullopt;
  }
  return static_cast<std::uint64_t>(st.st_size);
}

std::FILE* openFileForAppending(const std::string& path) {
  const int fd = ::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644);
  if (fd < 0) return nullptr;
  std::FILE* file = ::fdopen(fd, "a");
  if (file == nullptr) ::close(fd);
  return file;
}

}  // namespace appsync
