// The todo-list writer: load (or reuse what was last written), change in place, rewrite whole.
#include "state/todo_list.h"

#include "runtime/fs/files.h"
#include "state/loaders.h"

namespace appsync {

namespace {

bool identifierMatches(const plist::Value& record, std::string_view identifier) {
  const plist::Dict* dict = record.dict();
  if (!dict) return false;
  const std::string* id = plist::stringAt(*dict, kTodoIdentifierKey);
  return id && *id == identifier;
}

}  // namespace

const plist::Dict* findTodoRecord(const plist::Array& list, std::string_view identifier) {
  for (const plist::Value& record : list) {
    if (identifierMatches(record, identifier)) return record.dict();
  }
  return nullptr;
}

plist::Dict* findTodoRecord(plist::Array& list, std::string_view identifier) {
  for (plist::Value& record : list) {
    if (identifierMatches(record, identifier)) return record.dict();
  }
  return nullptr;
}

bool TodoList::FileIdentity::operator==(const FileIdentity& o) const {
  return device == o.device && inode == o.inode && size == o.size &&
         modified.tv_sec == o.modified.tv_sec && modified.tv_nsec == o.modified.tv_nsec &&
         changed.tv_sec == o.changed.tv_sec && changed.tv_nsec == o.changed.tv_nsec;
}

TodoList::TodoList(std::string path, TRHostFramework& tr) : path_(std::move(path)), tr_(tr) {}

std::optional<TodoList::FileIdentity> TodoList::identityOf() const {
  struct stat st {};
  if (::stat(path_.c_str(), &st) != 0) return std::nullopt;
  return FileIdentity{st.st_dev, st.st_ino, st.st_size, st.st_mtim, st.st_ctim};
}

void TodoList::changeAssetID(const std::string& identifier, const std::string& state) {
  std::unique_lock lock(mutex_);
  const std::uint64_t ticket = ++nextTicket_;
  pending_.push_back({identifier, state});
  while (writtenTicket_ < ticket) {
    if (writing_) {
      written_.wait(lock);
      continue;
    }
    // This caller writes everything queued so far, its own change included.
    writing_ = true;
    std::vector<Change> batch;
    batch.swap(pending_);
    const std::uint64_t last = nextTicket_;
    lock.unlock();
    applyBatch(batch);
    lock.lock();
    writing_ = false;
    writtenTicket_ = last;
    written_.notify_all();
  }
}

void TodoList::applyBatch(const std::vector<Change>& batch) {
  // Reuse the list this object wrote last unless someone has replaced the file since.
  std::optional<FileIdentity> identity = identityOf();
  bool reuse = cached_ && identity && cachedIdentity_ && *identity == *cachedIdentity_;
  std::optional<plist::Value> list;  // holds the root array
  if (reuse) list = std::move(cached_);
  cached_.reset();
  cachedIdentity_.reset();

  bool changed = false;
  for (const Change& change : batch) {
    if (!list) {
      ++loads_;
      auto loaded = loadTodoList(tr_, path_, nullptr);
      if (!loaded) continue;
      list = plist::Value(std::move(*loaded));
    }
    plist::Array& records = *list->array();
    if (records.empty()) continue;
    plist::Dict* record = findTodoRecord(records, change.identifier);
    if (!record) continue;
    const plist::Value* current = record->find(kTodoOperationKey);
    pluginLog(tr_.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Default,
              "%s|Changing %{public}@ from %{public}@ to %{public}@", change.identifier, current,
              change.state);
    record->set(std::string(kTodoOperationKey), change.state);
    changed = true;
  }
  if (!changed) {
    if (reuse && list) {  // the file is still the one this object wrote
      cached_ = std::move(list);
      cachedIdentity_ = identity;
    }
    return;
  }

  ++rewrites_;
  if (writePlistAtomically(path_, *list, plist::Format::Binary)) {
    cachedIdentity_ = identityOf();
    if (cachedIdentity_) cached_ = std::move(list);
  }
}

std::uint64_t TodoList::rewriteCount() const { return rewrites_.load(); }
std::uint64_t TodoList::loadCount() const { return loads_.load(); }

}  // namespace appsync
