// The host's todo list on disk, and the one writer that records each application's progress in
// it. Every change is on disk when changeAssetID returns; concurrent changes never lose one
// another, and changes that arrive while a rewrite is running share the next rewrite.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/tr.h"
#include "runtime/fs/files.h"
#include "runtime/plist/value.h"

namespace appsync {

// The record keys and operation states of the todo list.
inline constexpr std::string_view kTodoIdentifierKey = "identifier";
inline constexpr std::string_view kTodoOperationKey = "operation";
inline constexpr std::string_view kTodoVersionKey = "version";
inline constexpr std::string_view kTodoNameKey = "name";
inline constexpr std::string_view kTodoInstall = "install";
inline constexpr std::string_view kTodoRemove = "remove";
inline constexpr std::string_view kTodoSent = "SENT";
inline constexpr std::string_view kTodoDownloaded = "DOWNLOADED";
inline constexpr std::string_view kTodoInstalled = "INSTALLED";
inline constexpr std::string_view kTodoFailed = "FAILED";

// The host's own test of a todo record's identifier or of a delivered package path: present, a
// string, and without "/.." in it.
bool isValidAssetPath(const plist::Value* value);
// Whether a todo record's identifier may be acted upon: it passes isValidAssetPath and can name
// one application, that is one path component of its own (not empty, ".", ".." or absolute, no
// "/", no NUL, newline or other control character). "../x" passes the host's test but is no
// application; acting on it could reach outside the directory it is joined to.
bool isValidApplicationIdentifier(const plist::Value* value);

// The first record of `list` whose "identifier" equals `identifier` (records that are not
// dictionaries never match); null when there is none.
const plist::Dict* findTodoRecord(const plist::Array& list, std::string_view identifier);
plist::Dict* findTodoRecord(plist::Array& list, std::string_view identifier);

class TodoList {
 public:
  TodoList(std::string path, TRHostFramework& tr);
  TodoList(const TodoList&) = delete;
  TodoList& operator=(const TodoList&) = delete;

  // Sets the "operation" of the first record of `identifier` to `state` and rewrites the list
  // as a binary property list. Nothing is written when the list is absent, empty or does not
  // parse, or when no record matches. A list that someone replaces while it is being changed
  // is never overwritten: the change is made again on the list that replaced it. Safe from
  // any thread.
  void changeAssetID(const std::string& identifier, const std::string& state);

  // How many times the file was rewritten and read since construction (for benchmarks/tests).
  std::uint64_t rewriteCount() const;
  std::uint64_t loadCount() const;
  // Changes queued behind the rewrite that is running.
  std::size_t pendingChangeCount();

 private:
  struct Change {
    std::string identifier;
    std::string state;
  };
  // The list to change: the one this object wrote last while the file is still that version,
  // else the file as it is now. Absent when there is no usable list.
  std::optional<plist::Array> currentList(FileIdentity* identity);
  void applyBatch(const std::vector<Change>& batch);

  const std::string path_;
  TRHostFramework& tr_;

  // Group commit: callers queue their change; one of them at a time writes the queue.
  std::mutex mutex_;
  std::condition_variable written_;
  std::vector<Change> pending_;
  std::uint64_t nextTicket_ = 0;
  std::uint64_t writtenTicket_ = 0;
  bool writing_ = false;

  // Owned by the writing caller: the list as this object last wrote it, and the identity of
  // the file it wrote (taken from the file itself), so an untouched file is not read and
  // parsed again.
  std::optional<plist::Array> cached_;
  FileIdentity cachedIdentity_;
  std::atomic<std::uint64_t> rewrites_{0};
  std::atomic<std::uint64_t> loads_{0};
};

}  // namespace appsync
