// The placeholder directory of an application and the two file operations both placeholder
// roads use: making the directory and writing the icon.
#include <cerrno>
#include <vector>

#include "client/apps_client.h"
#include "restore/placeholder_info.h"
#include "runtime/fs/files.h"
#include "runtime/fs/paths.h"

namespace appsync {

namespace {

// Makes `path` and every missing parent, one component at a time, so that the caller learns
// which directories are new. Those are appended to `made`, outermost first.
bool makeDirectoryChain(const std::string& path, std::vector<std::string>& made, ErrorRef* error) {
  if (path.empty()) {
    setError(error, makePOSIXError(ENOENT, path));
    return false;
  }
  // Only the components past the deepest existing directory are new.
  const std::size_t existing = existingDirectoryPrefix(path);
  if (existing == path.size()) return true;
  for (std::string::size_type end = path.find('/', existing + 1);; end = path.find('/', end + 1)) {
    const std::string prefix = path.substr(0, end);
    if (!prefix.empty() && prefix.back() != '/') {
      ErrorRef mkdirError;
      if (createDirectory(prefix, &mkdirError)) {
        made.push_back(prefix);
      } else if (!directoryExists(prefix)) {  // not one made at the same time by someone else
        setError(error, fileExists(prefix) ? makePOSIXError(ENOTDIR, prefix) : mkdirError);
        return false;
      }
    }
    if (end == std::string::npos) break;
  }
  return true;
}

}  // namespace

// An identifier that would climb out of "com.vantor.trc.Apps" ("../x", "a/../../b") has no
// placeholder path; both roads treat that as a directory that could not be created.
std::optional<std::string> AppsClient::placeholderAppPathForBundleIdentifier(
    const std::string& bundleID) {
  return Paths::placeholderDirectory(platform_.system.temporaryDirectory(), bundleID);
}

// Every directory this call makes receives the attributes, and so does the target when it
// already existed (a second attempt for the same application). Owner and group are best
// effort: a failure to set them does not fail the creation and is not logged.
bool AppsClient::createPlaceHolderPath(const std::string& path,
                                       const std::string& forBundleIdentifier,
                                       const FileAttributes& withAttributes) {
  std::vector<std::string> made;
  ErrorRef error;
  const bool created = makeDirectoryChain(path, made, &error);
  for (const std::string& directory : made) {
    applyFileAttributes(platform_, directory, withAttributes);
  }
  if (created && (made.empty() || made.back() != path)) {
    applyFileAttributes(platform_, path, withAttributes);
  }
  reportPlaceholderDirectory(platform_, forBundleIdentifier, path, created, error);
  return created;
}

// The file is replaced whole if it exists; its owner and group are best effort, as above.
bool AppsClient::writeIconData(const std::optional<plist::Bytes>& iconData,
                               const std::string& atPath, std::uint64_t* returningFileSize,
                               const std::string& forBundleIdentifier,
                               const FileAttributes& withAttributes) {
  if (!iconData) {
    logError("%s|no icon data for '%{public}@'", forBundleIdentifier);
    return false;
  }
  const bool created = writeFileAtomically(atPath, *iconData);
  std::uint64_t size = 0;
  if (created) {
    applyFileAttributes(platform_, atPath, withAttributes);
    if (std::optional<std::uint64_t> written = fileSize(atPath)) {
      size = *written;
      if (returningFileSize) *returningFileSize = size;
    }
  }
  logDefault("%s|icon data for '%{public}@' was writen to %{public}@ with status:%d fileSize:%llu",
             forBundleIdentifier, atPath, created, size);
  return created;
}

}  // namespace appsync
