// The documented path check on host-supplied names.
#include "client/asset_path.h"

#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <system_error>

namespace appsync {

bool isValidAssetPath(std::string_view object) {
  return object.find("/..") == std::string_view::npos;
}

bool isValidAssetPath(const plist::Value* object) {
  const std::string* text = object ? object->string() : nullptr;
  return text && isValidAssetPath(std::string_view(*text));
}

bool isValidAssetPath(const std::optional<std::string>& object) {
  return object && isValidAssetPath(std::string_view(*object));
}

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

}  // namespace appsync
