// Reading and rewriting an application's store metadata file without following links.
#include "reporting/store_metadata.h"

#include <sys/stat.h>

#include <algorithm>
#include <system_error>

#include "runtime/fs/files.h"

namespace appsync {

namespace fs = std::filesystem;

namespace {

// True for a regular file (not a link to one) whose directory, links resolved, lies inside the
// device root.
bool isOwnFileInsideRoot(const std::string& path, const fs::path& deviceRoot) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) return false;
  std::error_code error;
  const fs::path directory = fs::canonical(fs::path(path).parent_path(), error);
  if (error) return false;
  return std::mismatch(deviceRoot.begin(), deviceRoot.end(), directory.begin(), directory.end())
             .first == deviceRoot.end();
}

}  // namespace

std::optional<fs::path> resolvedDeviceRoot(const fs::path& deviceRoot) {
  std::error_code error;
  fs::path root = fs::canonical(deviceRoot, error);
  if (error) return std::nullopt;
  return root;
}

std::optional<std::string> storeMetadataPath(const std::optional<std::string>& container) {
  if (!container) return std::nullopt;
  return *container + "/" + std::string(kStoreMetadataFileName);
}

std::optional<StoreMetadata> loadStoreMetadata(const std::string& path,
                                               const fs::path& deviceRoot) {
  if (!isOwnFileInsideRoot(path, deviceRoot)) return std::nullopt;
  std::optional<plist::Bytes> bytes = readFile(path);
  if (!bytes) return std::nullopt;
  StoreMetadata metadata;
  std::optional<plist::Value> root = plist::parse(*bytes, nullptr, &metadata.format);
  if (!root || !root->dict()) return std::nullopt;
  metadata.root = std::move(*root->dict());
  metadata.bytes = std::move(*bytes);
  return metadata;
}

bool writeStoreMetadata(const std::string& path, const StoreMetadata& metadata,
                        const fs::path& deviceRoot) {
  if (!isOwnFileInsideRoot(path, deviceRoot)) return false;
  std::optional<plist::Bytes> bytes = plist::write(plist::Value(metadata.root), metadata.format);
  if (!bytes) return false;
  // Most rewrites before a backup set "DeviceBasedBLK" to the value it already has: replacing
  // a file with its own bytes would only cost a new file and leave the content as it was.
  if (*bytes == metadata.bytes) return true;
  return writeFileAtomically(path, *bytes);
}

void forEachApplicationMetadata(ARApplicationWorkspace& registry, const fs::path& deviceRoot,
                                const StoreMetadataVisitor& visit) {
  const std::optional<fs::path> root = resolvedDeviceRoot(deviceRoot);
  registry.enumerateBundlesOfType(
      ARBundleTypeApplications, [&](const std::shared_ptr<const ARBundleProxy>& proxy, bool*) {
        const ARApplicationProxy* application = proxy->asApplicationProxy();
        if (!application) return;
        const std::optional<std::string> path = storeMetadataPath(application->bundleContainerURL);
        std::optional<StoreMetadata> metadata;
        if (path && root) metadata = loadStoreMetadata(*path, *root);
        visit(*application, path, metadata);
      });
}

}  // namespace appsync
