// Where a host-supplied name joined to a base directory leads.
#include "client/asset_path.h"

#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <system_error>

namespace appsync {

bool resolvesInside(const std::string& base, std::string_view name) {
  namespace fs = std::filesystem;
  const fs::path path = fs::path(base) / fs::path(name);
  // Walk the components below `base`: up to the first that does not exist, none may be a link.
  fs::path prefix(base);
  bool passesLink = false;
  for (const fs::path& part : fs::path(name)) {
    prefix /= part;
    struct stat st;
    if (::lstat(prefix.c_str(), &st) != 0) break;
    if (S_ISLNK(st.st_mode)) {
      passesLink = true;
      break;
    }
  }
  if (!passesLink) return true;
  std::error_code ec;
  const fs::path resolvedBase = fs::weakly_canonical(base, ec);
  if (ec) return false;
  const fs::path resolved = fs::weakly_canonical(path, ec);
  if (ec) return false;
  // Component by component, so that "/a/bc" is not taken to lie inside "/a/b".
  const auto mismatch =
      std::mismatch(resolvedBase.begin(), resolvedBase.end(), resolved.begin(), resolved.end());
  return mismatch.first == resolvedBase.end();
}

bool resolvesInsideRoot(const std::string& path, const std::filesystem::path& root) {
  const std::filesystem::path name = std::filesystem::path(path).lexically_relative(root);
  if (name.empty() || *name.begin() == "..") return false;
  return resolvesInside(root.string(), name.string());
}

}  // namespace appsync
