// TRAsset from a script's mapping and back.
#include "replay/asset_spec.h"

#include <optional>
#include <string>

#include "replay/action_table.h"

namespace appsync::host::replay {

namespace {

std::optional<std::string> readPath(const YamlField& field, std::string_view key,
                                    const std::filesystem::path& root) {
  auto value = field.optional(key);
  if (!value) return std::nullopt;
  return clientPath(root, value->string());
}

void setShownPath(plist::Dict& dict, std::string key, const std::optional<std::string>& path,
                  const std::filesystem::path& root) {
  if (path) dict.set(std::move(key), shownPath(root, *path));
}

}  // namespace

std::shared_ptr<TRAsset> readAsset(const YamlField& field, const std::filesystem::path& root) {
  field.allowOnly({"identifier", "dataclass", "prettyName", "path", "relativePath", "download",
                   "restore", "completedParts", "storePID", "variantOptions", "infoPlist",
                   "storePlist", "icon", "downloadProgress", "installProgress"});
  std::optional<std::string> prettyName;
  if (auto value = field.optional("prettyName")) prettyName = value->string();
  const auto dataclass = field.optional("dataclass");
  const auto download = field.optional("download");
  auto asset = std::make_shared<TRAsset>(
      field["identifier"].string(),
      dataclass ? dataclass->string() : std::string(kApplicationDataclass), prettyName,
      download && download->boolean());
  asset->setPath(readPath(field, "path", root));
  if (auto relative = field.optional("relativePath")) {
    // The host's own form: a path relative to its public staging folder, handed over as written.
    if (field.has("path")) relative->fail("an asset takes path or relativePath, not both");
    const std::string text = relative->string();
    if (text.starts_with('/')) relative->fail("a relative path does not begin with \"/\"");
    asset->setPath(text);
  }
  asset->setInfoPlist(readPath(field, "infoPlist", root));
  asset->setStorePlist(readPath(field, "storePlist", root));
  asset->setIcon(readPath(field, "icon", root));
  if (auto value = field.optional("restore")) asset->setIsRestore(value->boolean());
  if (auto value = field.optional("completedParts")) {
    asset->setCompletedAssetParts(value->unsignedInteger());
  }
  if (auto value = field.optional("storePID")) asset->setStorePID(value->integer());
  if (auto value = field.optional("variantOptions")) asset->setVariantOptions(readDict(*value));
  if (auto value = field.optional("downloadProgress")) {
    asset->setDownloadProgress(static_cast<float>(value->real()));
  }
  if (auto value = field.optional("installProgress")) {
    asset->setInstallProgress(static_cast<float>(value->real()));
  }
  return asset;
}

plist::Dict assetValue(const TRAsset& asset, const std::filesystem::path& root) {
  plist::Dict dict{{"identifier", asset.identifier()}, {"dataclass", asset.dataclass()}};
  if (auto prettyName = asset.prettyName()) dict.set("prettyName", *prettyName);
  setShownPath(dict, "path", asset.path(), root);
  setShownPath(dict, "infoPlist", asset.infoPlist(), root);
  setShownPath(dict, "storePlist", asset.storePlist(), root);
  setShownPath(dict, "icon", asset.icon(), root);
  dict.set("download", asset.isDownload());
  dict.set("restore", asset.isRestore());
  dict.set("completedParts", asset.completedAssetParts());
  dict.set("storePID", asset.storePID());
  if (plist::Dict options = asset.variantOptions(); !options.empty()) {
    dict.set("variantOptions", std::move(options));
  }
  dict.set("downloadProgress", static_cast<double>(asset.downloadProgress()));
  dict.set("installProgress", static_cast<double>(asset.installProgress()));
  return dict;
}

}  // namespace appsync::host::replay
