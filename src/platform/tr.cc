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

std::string TRAsset::identifier() const {
  std::lock_guard lock(mutex_);
  return identifier_;
}

std::string TRAsset::dataclass() const {
  std::lock_guard lock(mutex_);
  return dataclass_;
}

std::optional<std::string> TRAsset::prettyName() const {
  std::lock_guard lock(mutex_);
  return prettyName_;
}

plist::Dict TRAsset::variantOptions() const {
  std::lock_guard lock(mutex_);
  return variantOptions_;
}

void TRAsset::setVariantOptions(plist::Dict options) {
  std::lock_guard lock(mutex_);
  variantOptions_ = std::move(options);
}

std::optional<std::string> TRAsset::infoPlist() const {
  std::lock_guard lock(mutex_);
  return infoPlist_;
}

void TRAsset::setInfoPlist(std::optional<std::string> path) {
  std::lock_guard lock(mutex_);
  infoPlist_ = std::move(path);
}

std::optional<std::string> TRAsset::storePlist() const {
  std::lock_guard lock(mutex_);
  return storePlist_;
}

void TRAsset::setStorePlist(std::optional<std::string> path) {
  std::lock_guard lock(mutex_);
  storePlist_ = std::move(path);
}

std::optional<std::string> TRAsset::icon() const {
  std::lock_guard lock(mutex_);
  return icon_;
}

void TRAsset::setIcon(std::optional<std::string> path) {
  std::lock_guard lock(mutex_);
  icon_ = std::move(path);
}

std::optional<std::string> TRAsset::path() const {
  std::lock_guard lock(mutex_);
  return path_;
}

void TRAsset::setPath(std::optional<std::string> path) {
  std::lock_guard lock(mutex_);
  path_ = std::move(path);
}

bool TRAsset::isRestore() const {
  std::lock_guard lock(mutex_);
  return isRestore_;
}

void TRAsset::setIsRestore(bool restore) {
  std::lock_guard lock(mutex_);
  isRestore_ = restore;
}

bool TRAsset::isDownload() const {
  std::lock_guard lock(mutex_);
  return isDownload_;
}

void TRAsset::setIsDownload(bool download) {
  std::lock_guard lock(mutex_);
  isDownload_ = download;
}

std::uint64_t TRAsset::completedAssetParts() const {
  std::lock_guard lock(mutex_);
  return completedAssetParts_;
}

void TRAsset::setCompletedAssetParts(std::uint64_t parts) {
  std::lock_guard lock(mutex_);
  completedAssetParts_ = parts;
}

std::int64_t TRAsset::storePID() const {
  std::lock_guard lock(mutex_);
  return storePID_;
}

void TRAsset::setStorePID(std::int64_t pid) {
  std::lock_guard lock(mutex_);
  storePID_ = pid;
}

float TRAsset::downloadProgress() const {
  std::lock_guard lock(mutex_);
  return downloadProgress_;
}

void TRAsset::setDownloadProgress(float progress) {
  std::lock_guard lock(mutex_);
  downloadProgress_ = progress;
}

float TRAsset::installProgress() const {
  std::lock_guard lock(mutex_);
  return installProgress_;
}

void TRAsset::setInstallProgress(float progress) {
  std::lock_guard lock(mutex_);
  installProgress_ = progress;
}

std::string TRAsset::shortDescription() const {
  std::lock_guard lock(mutex_);
  return "<TRAsset " + dataclass_ + " " + identifier_ + ">";
}

std::string TRAsset::describe() const {
  std::lock_guard lock(mutex_);
  std::string out = "<TRAsset " + dataclass_ + " " + identifier_;
  out += " prettyName=" + describeOptional(prettyName_);
  out += std::string(" download=") + (isDownload_ ? "1" : "0");
  out += std::string(" restore=") + (isRestore_ ? "1" : "0");
  out += " parts=" + std::to_string(completedAssetParts_);
  out += " storePID=" + std::to_string(storePID_);
  out += " path=" + describeOptional(path_);
  out += " variantOptions=" + plist::Value(variantOptions_).describe();
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
