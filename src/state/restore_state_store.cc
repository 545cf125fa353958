// The restore state store: whole-file read-modify-write cycles, serialised by one lock.
#include "state/restore_state_store.h"

#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync {

RestoreStateStore::RestoreStateStore(std::string path) : path_(std::move(path)) {}

RestoreStateStore::Load RestoreStateStore::load(plist::Dict* root) {
  auto bytes = readFile(path_);
  if (!bytes) return Load::Missing;
  auto value = plist::parse(*bytes);
  if (!value || !value->dict()) return Load::Unusable;
  *root = std::move(*value->dict());
  return Load::Loaded;
}

std::optional<plist::Value> RestoreStateStore::property(std::string_view key,
                                                        std::string_view identifier,
                                                        const std::optional<std::string>& version) {
  std::lock_guard lock(mutex_);
  if (!version) return std::nullopt;
  plist::Dict root;
  if (load(&root) != Load::Loaded) return std::nullopt;
  const plist::Dict* versions = plist::dictAt(root, identifier);
  const plist::Dict* properties = versions ? plist::dictAt(*versions, *version) : nullptr;
  const plist::Value* value = properties ? properties->find(key) : nullptr;
  if (!value) return std::nullopt;
  return *value;
}

void RestoreStateStore::setProperty(plist::Value value, std::string_view key,
                                    std::string_view identifier,
                                    const std::optional<std::string>& version) {
  std::lock_guard lock(mutex_);
  plist::Dict root;
  if (load(&root) == Load::Unusable) return;
  if (!version) return;
  if (!root.contains(identifier)) root.set(std::string(identifier), plist::Dict());
  plist::Dict* versions = root.find(identifier)->dict();
  if (!versions) return;  // an entry of another shape: leave the file as it is
  if (!versions->contains(*version)) versions->set(*version, plist::Dict());
  plist::Dict* properties = versions->find(*version)->dict();
  if (!properties) return;
  properties->set(std::string(key), std::move(value));
  writePlistAtomically(path_, plist::Value(std::move(root)), plist::Format::Xml);
}

void RestoreStateStore::clean(std::string_view identifier) {
  std::lock_guard lock(mutex_);
  plist::Dict root;
  Load loaded = load(&root);
  if (loaded == Load::Missing) return;
  if (loaded == Load::Loaded) root.erase(identifier);
  if (loaded == Load::Unusable || root.empty()) {
    removeFile(path_);
    return;
  }
  writePlistAtomically(path_, plist::Value(std::move(root)), plist::Format::Xml);
}

}  // namespace appsync
