// The documented path check on host-supplied names.
#include "client/asset_path.h"

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

bool resolvesInside(const std::string& path, const std::string& base) {
  std::error_code ec;
  const std::filesystem::path resolvedBase = std::filesystem::weakly_canonical(base, ec);
  if (ec) return false;
  const std::filesystem::path resolved = std::filesystem::weakly_canonical(path, ec);
  if (ec) return false;
  // Component by component, so that "/a/bc" is not taken to lie inside "/a/b".
  const auto mismatch =
      std::mismatch(resolvedBase.begin(), resolvedBase.end(), resolved.begin(), resolved.end());
  return mismatch.first == resolvedBase.end();
}

}  // namespace appsync
