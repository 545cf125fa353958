// The todo-list writer: load (or reuse what was last written), change in place, rewrite whole.
#include "state/todo_list.h"

#include <algorithm>

#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
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

bool isValidAssetPath(const plist::Value* value) {
  const std::string* text = value ? value->string() : nullptr;
  return text && text->find("/..") == std::string::npos;
}

bool isValidApplicationIdentifier(const plist::Value* value) {
  if (!isValidAssetPath(value)) return false;
  const std::string& text = *value->string();
  if (text.empty() || text == "." || text == "..") return false;
  return std::none_of(text.begin(), text.end(), [](char c) {
    const auto byte = static_cast<unsigned char>(c);
    return c == '/' || byte < 0x20 || byte == 0x7f;
  });
}

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

TodoList::TodoList(std::string path, TRHostFramework& tr) : path_(std::move(path)), tr_(tr) {}

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

std::optional<plist::Array> TodoList::currentList(FileIdentity* identity) {
  std::optional<plist::Array> cached = std::move(cached_);
  cached_.reset();
  if (cached && fileIdentity(path_) == cachedIdentity_) {
    *identity = cachedIdentity_;
    return cached;
  }
  ++loads_;
  return loadTodoList(tr_, path_, nullptr, identity);
}

void TodoList::applyBatch(const std::vector<Change>& batch) {
  // A list replaced between our read and our write makes the write step aside; the batch is
  // then applied to the new list. Bounded, so that a file replaced without pause cannot hold a
  // writer forever.
  constexpr int kMaxAttempts = 16;
  for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
    FileIdentity identity;
    std::optional<plist::Array> list = currentList(&identity);
    if (!list || list->empty()) return;

    // The messages are written once the outcome is known, so that a change made again on a
    // replacing list is reported once.
    const LogCategory& log = tr_.TRGetLogCategory(kAppSyncLogCategory);
    const bool logging = log.enabled(LogLevel::Default);
    std::vector<std::string> messages;
    bool changed = false;
    for (const Change& change : batch) {
      plist::Dict* record = findTodoRecord(*list, change.identifier);
      if (!record) continue;
      if (logging) {
        const LogArg args[] = {LogArg(kPluginBundleIdentifier), LogArg(change.identifier),
                               LogArg(record->find(kTodoOperationKey)), LogArg(change.state)};
        messages.push_back(
            formatLogMessage("%s|Changing %{public}@ from %{public}@ to %{public}@", args));
      }
      record->set(std::string(kTodoOperationKey), change.state);
      changed = true;
    }
    if (!changed) {  // nothing matched: the file stays byte for byte as it is
      cached_ = std::move(list);
      cachedIdentity_ = identity;
      return;
    }

    plist::Value root(std::move(*list));
    std::optional<plist::Bytes> bytes = plist::writeBinary(root);
    list = std::move(*root.array());
    ReplaceOutcome outcome =
        bytes ? replaceFileIfUnchanged(path_, *bytes, identity, &cachedIdentity_)
              : ReplaceOutcome::Failed;
    if (outcome == ReplaceOutcome::Changed) continue;
    ++rewrites_;
    for (const std::string& message : messages) log.write(LogLevel::Default, message);
    if (outcome == ReplaceOutcome::Replaced) cached_ = std::move(list);
    return;
  }
}

std::uint64_t TodoList::rewriteCount() const { return rewrites_.load(); }
std::uint64_t TodoList::loadCount() const { return loads_.load(); }

std::size_t TodoList::pendingChangeCount() {
  std::lock_guard lock(mutex_);
  return pending_.size();
}

}  // namespace appsync
