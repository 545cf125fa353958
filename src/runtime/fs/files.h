// File operations of the plugin: whole-file reads, atomic whole-file writes, directories.
// Failures come back as POSIX errors naming the path; nothing throws.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <cstdio>
#include <ctime>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "runtime/error.h"
#include "runtime/plist/codec.h"
#include "runtime/plist/value.h"

namespace appsync {

// One version of a file: the same inode with the same size and modification time. A file
// replaced by a rename, or rewritten in place, has another identity.
struct FileIdentity {
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  timespec modified{};
  bool operator==(const FileIdentity& other) const;
};

// The identity of the file at `path` now; absent when there is none.
std::optional<FileIdentity> fileIdentity(const std::string& path);

// Reads a whole file, without caching. Absent (and *error set) when it cannot be read, or when
// it is larger than the property-list size bound. *identity (when given) receives the identity
// of the file that was read, taken from the open file itself.
std::optional<plist::Bytes> readFile(const std::string& path, ErrorRef* error = nullptr,
                                     FileIdentity* identity = nullptr);

// Opens `path` for appending, creating it if needed; null when it cannot be opened or is a
// symbolic link (appending through one could write anywhere). The caller closes it.
std::FILE* openFileForAppending(const std::string& path);

// Replaces `path` with `bytes` so that any reader, and any crash of this process, sees either the
// old file or the new one: a temporary file in the same directory is written completely, then
// renamed over the target. It is not synced to the disk; the guarantee covers crashes of the
// process, not of the machine. The new file keeps the old one's permission bits (0644 for a new
// file). On failure the old file is left as it was and the temporary file is removed. A process
// killed in the middle may leave its temporary file (".NAME.XXXXXX") behind.
bool writeFileAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                         ErrorRef* error = nullptr);

enum class ReplaceOutcome {
  Replaced,  // `path` now holds the new bytes
  Changed,   // `path` was no longer the expected version (or was gone); it was left as found
  Failed,    // the new file could not be written; `path` was left as it was (*error says why)
};

// Writes `bytes` over `path` like writeFileAtomically, but only while `path` is still the
// version `expected`: the new file is exchanged atomically with whatever is there, and the
// displaced file is put back when it turns out to be another version. So a file that someone
// else replaced after it was read is never overwritten with what was derived from the old one.
// *written (when given) receives the identity of the new file after a replacement.
ReplaceOutcome replaceFileIfUnchanged(const std::string& path, std::span<const std::uint8_t> bytes,
                                      const FileIdentity& expected, FileIdentity* written,
                                      ErrorRef* error = nullptr);

// Serialises `value` in `format` and writes it atomically. A value the format cannot carry is
// an error of kPropertyListErrorDomain with the codec's message and the path.
bool writePlistAtomically(const std::string& path, const plist::Value& value, plist::Format format,
                          ErrorRef* error = nullptr);

// The property list at `path` when its root is a dictionary; absent when the file is missing,
// unreadable, not a property list or of another root type.
std::optional<plist::Dict> readPlistDictionary(const std::string& path);

bool fileExists(const std::string& path);
bool directoryExists(const std::string& path);
// True when `path` itself is a symbolic link (not followed).
bool isSymbolicLink(const std::string& path);

// The length of the longest prefix of `path` that ends at a component boundary and names an
// existing directory: path.size() when the whole path is one, 0 when no prefix is. Found from
// the deepest end upwards, so that making a path whose parents exist costs few system calls.
std::size_t existingDirectoryPrefix(const std::string& path);
// mkdir -p. True when the directory exists afterwards.
bool createDirectories(const std::string& path, ErrorRef* error = nullptr);
// mkdir of the last component only (parents must exist). True when it was created.
bool createDirectory(const std::string& path, ErrorRef* error = nullptr);
// rm -rf. True when nothing is left at the path.
bool removeAll(const std::string& path, ErrorRef* error = nullptr);
// Removes one file. True when it was removed.
bool removeFile(const std::string& path, ErrorRef* error = nullptr);
// rename(2); fails when the destination exists and is a non-empty directory.
bool moveItem(const std::string& from, const std::string& to, ErrorRef* error = nullptr);
// Copies one regular file; fails when the destination exists.
bool copyFile(const std::string& from, const std::string& to, ErrorRef* error = nullptr);
std::optional<std::uint64_t> fileSize(const std::string& path, ErrorRef* error = nullptr);

}  // namespace appsync
