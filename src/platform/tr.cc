// The host sync framework's data objects: assets and account records.
#include "platform/tr.h"

#include <utility>

namespace appsync {

namespace {

std::string describeOptional(const std::optional<std::string>& text) {
  return text ? *text : std::string("(null)");
}

}  // namespace

std::shared_ptr<TRAsset> TRAsset::downloadAssetWithIdentifier(
    std::string identifier, std::string dataclass, std::optional<std::string> prettyName) {
  return std::make_shared<TRAsset>(std::move(identifier), std::move(dataclass),
                                   std::move(prettyName), true);
}

TRAsset::TRAsset(std::string identifier, std::string dataclass,
                 std::optional<std::string> prettyName, bool isDownload)
    : identifier_(std::move(identifier)),
      dataclass_(std::move(dataclass)),
      prettyName_(std::move(prettyName)),
      isDownload_(isDownload) {}

std::string TRAsset::identifier() const { return identifier_; }
std::string TRAsset::dataclass() const { return dataclass_; }
std::optional<std::string> TRAsset::prettyName() const { return prettyName_; }

plist::Dict TRAsset::variantOptions() const { return variantOptions_.get(); }
void TRAsset::setVariantOptions(plist::Dict options) { variantOptions_.set(std::move(options)); }
std::optional<std::string> TRAsset::infoPlist() const { return infoPlist_.get(); }
void TRAsset::setInfoPlist(std::optional<std::string> path) { infoPlist_.set(std::move(path)); }
std::optional<std::string> TRAsset::storePlist() const { return storePlist_.get(); }
void TRAsset::setStorePlist(std::optional<std::string> path) { storePlist_.set(std::move(path)); }
std::optional<std::string> TRAsset::icon() const { return icon_.get(); }
void TRAsset::setIcon(std::optional<std::string> path) { icon_.set(std::move(path)); }
std::optional<std::string> TRAsset::path() const { return path_.get(); }
void TRAsset::setPath(std::optional<std::string> path) { path_.set(std::move(path)); }

bool TRAsset::isRestore() const { return isRestore_.get(); }
void TRAsset::setIsRestore(bool restore) { isRestore_.set(restore); }
bool TRAsset::isDownload() const { return isDownload_.get(); }
void TRAsset::setIsDownload(bool download) { isDownload_.set(download); }
std::uint64_t TRAsset::completedAssetParts() const { return completedAssetParts_.get(); }
void TRAsset::setCompletedAssetParts(std::uint64_t parts) { completedAssetParts_.set(parts); }
std::int64_t TRAsset::storePID() const { return storePID_.get(); }
void TRAsset::setStorePID(std::int64_t pid) { storePID_.set(pid); }
float TRAsset::downloadProgress() const { return downloadProgress_.get(); }
void TRAsset::setDownloadProgress(float progress) { downloadProgress_.set(progress); }
float TRAsset::installProgress() const { return installProgress_.get(); }
void TRAsset::setInstallProgress(float progress) { installProgress_.set(progress); }

std::string TRAsset::shortDescription() const {
  return "<TRAsset " + dataclass_ + " " + identifier_ + ">";
}

std::string TRAsset::describe() const {
  std::string out = "<TRAsset " + dataclass_ + " " + identifier_;
  out += " prettyName=" + describeOptional(prettyName_);
  out += std::string(" download=") + (isDownload() ? "1" : "0");
  out += std::string(" restore=") + (isRestore() ? "1" : "0");
  out += " parts=" + std::to_string(completedAssetParts());
  out += " storePID=" + std::to_string(storePID());
  out += " path=" + describeOptional(path());
  out += " variantOptions=" + plist::Value(variantOptions()).describe();
  out += ">";
  return out;
}

std::string TRMutableAccountInfo::describe() const {
  std::string out = "<TRMutableAccountInfo vantorID=" + describeOptional(vantorID_);
  out += " PRID=" + (prid_ ? std::to_string(*prid_) : std::string("(null)"));
  out += " altPRID=" + describeOptional(altPRID_) + ">";
  return out;
}

}  // namespace appsync
