// The fake registry's bundle files: reading a bundle's Info.plist, icon and size, and writing
// store metadata into a container.
#include "platform/fake/fake_ar_bundle_files.h"

#include <system_error>
#include <utility>

#include "runtime/fs/files.h"
#include "runtime/fs/paths.h"
#include "runtime/plist/codec.h"
#include "platform/ar.h"
#include "platform/bundle_keys.h"

namespace appsync::fake_ar {

namespace fs = std::filesystem;

namespace {

constexpr std::string_view kMetadataFileName = "CaravelMetadata.plist";
constexpr std::string_view kDefaultIconFile = "Icon.png";

}  // namespace

std::optional<plist::Dict> readInfoPlist(const std::string& bundle, std::string* why) {
  const std::string path = (fs::path(bundle) / "Info.plist").string();
  ErrorRef readError;
  std::optional<plist::Bytes> bytes = readFile(path, &readError);
  if (!bytes) {
    *why = "cannot read " + path + (readError ? ": " + readError->describe() : std::string());
    return std::nullopt;
  }
  plist::ParseError parseError;
  std::optional<plist::Value> root = plist::parse(*bytes, &parseError);
  if (!root) {
    *why = "cannot parse " + path + ": " + parseError.message;
    return std::nullopt;
  }
  if (!root->dict()) {
    *why = path + " is not a dictionary";
    return std::nullopt;
  }
  return std::move(*root->dict());
}

std::optional<std::string> stringValue(const plist::Dict& dict, std::string_view key) {
  const std::string* s = plist::stringAt(dict, key);
  return s ? std::optional<std::string>(*s) : std::nullopt;
}

std::optional<std::string> iconIn(const std::string& bundle, const plist::Dict& info) {
  std::string name =
      stringValue(info, _kBNBundleIconFileKey).value_or(std::string(kDefaultIconFile));
  std::optional<std::string> path = Paths::confined(bundle, name);
  if (path && !fileExists(*path) && fs::path(name).extension().empty()) {
    path = Paths::confined(bundle, name + ".png");
  }
  if (path && fileExists(*path)) return path;
  return std::nullopt;
}

std::uint64_t treeSize(const fs::path& dir) {
  std::uint64_t total = 0;
  std::error_code ec;
  for (fs::recursive_directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec)) {
    std::error_code sizeError;
    if (it->is_regular_file(sizeError)) {
      std::uintmax_t size = it->file_size(sizeError);
      if (!sizeError) total += size;
    }
  }
  return total;
}

bool writeMetadata(const std::string& container, const plist::Dict& options) {
  const plist::Value* metadata = options.find(ARCaravelMetadataKey);
  if (!metadata) return false;
  const std::string path = (fs::path(container) / kMetadataFileName).string();
  if (const plist::Bytes* bytes = metadata->data()) {
    return createDirectories(container) && writeFileAtomically(path, *bytes);
  }
  if (metadata->dict()) {
    return createDirectories(container) &&
           writePlistAtomically(path, *metadata, plist::Format::Binary);
  }
  return false;
}

}  // namespace appsync::fake_ar
