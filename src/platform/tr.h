// The host sync framework: assets, account records, the device service, log categories and
// the recoverable-error test.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "runtime/error.h"
#include "runtime/guarded.h"
#include "runtime/log/log.h"
#include "runtime/plist/value.h"

namespace appsync {

inline constexpr std::string_view kApplicationDataclass = "Application";

// The log categories the plugin writes to: its own messages, the few summaries that go to the
// host's sync category, and the category of the account type check.
inline constexpr int kAppSyncLogCategory = 8;
inline constexpr int kSyncSummaryLogCategory = 14;
inline constexpr int kTypeCheckLogCategory = 0;

// Asset-part codes of a transfer.
inline constexpr std::uint64_t kTRAssetPartApplication = 1;
inline constexpr std::uint64_t kTRAssetPartApplicationData = 2;
inline constexpr std::uint64_t kTRAssetPartAll = 3;

// One transfer request or delivered file. Shared between the host's threads and the client's
// install operations, so every accessor is thread-safe.
class TRAsset {
 public:
  // A download request of the dataclass (isDownload true).
  static std::shared_ptr<TRAsset> downloadAssetWithIdentifier(
      std::string identifier, std::string dataclass, std::optional<std::string> prettyName);

  TRAsset(std::string identifier, std::string dataclass, std::optional<std::string> prettyName,
          bool isDownload);
  TRAsset(const TRAsset&) = delete;
  TRAsset& operator=(const TRAsset&) = delete;

  std::string identifier() const;
  std::string dataclass() const;
  std::optional<std::string> prettyName() const;

  plist::Dict variantOptions() const;
  void setVariantOptions(plist::Dict options);
  // Paths of the bundle's information and store-metadata property lists.
  std::optional<std::string> infoPlist() const;
  void setInfoPlist(std::optional<std::string> path);
  std::optional<std::string> storePlist() const;
  void setStorePlist(std::optional<std::string> path);
  // File location of the icon image.
  std::optional<std::string> icon() const;
  void setIcon(std::optional<std::string> path);
  // Where the delivered file lies.
  std::optional<std::string> path() const;
  void setPath(std::optional<std::string> path);

  bool isRestore() const;
  void setIsRestore(bool restore);
  bool isDownload() const;
  void setIsDownload(bool download);
  std::uint64_t completedAssetParts() const;
  void setCompletedAssetParts(std::uint64_t parts);
  std::int64_t storePID() const;
  void setStorePID(std::int64_t pid);
  float downloadProgress() const;
  void setDownloadProgress(float progress);
  float installProgress() const;
  void setInstallProgress(float progress);

  // "<TRAsset Application com.example.app>": for messages.
  std::string shortDescription() const;
  std::string describe() const;

 private:
  const std::string identifier_;
  const std::string dataclass_;
  const std::optional<std::string> prettyName_;
  Guarded<plist::Dict> variantOptions_;
  Guarded<std::optional<std::string>> infoPlist_, storePlist_, icon_, path_;
  Guarded<bool> isRestore_;
  Guarded<bool> isDownload_;
  Guarded<std::uint64_t> completedAssetParts_;
  Guarded<std::int64_t> storePID_;
  Guarded<float> downloadProgress_, installProgress_;
};

// One store account, as reported to the host.
class TRMutableAccountInfo {
 public:
  void setVantorID(std::optional<std::string> id) { vantorID_ = std::move(id); }
  void setPRID(std::optional<std::int64_t> prid) { prid_ = prid; }
  void setAltPRID(std::optional<std::string> alt) { altPRID_ = std::move(alt); }
  const std::optional<std::string>& vantorID() const { return vantorID_; }
  const std::optional<std::int64_t>& PRID() const { return prid_; }
  const std::optional<std::string>& altPRID() const { return altPRID_; }
  std::string describe() const;

 private:
  std::optional<std::string> vantorID_;
  std::optional<std::int64_t> prid_;
  std::optional<std::string> altPRID_;
};

// The host's device service. Hosts of older versions lack some operations; ask first. Safe from any
// thread.
class TRDeviceService {
 public:
  enum class Operation { prioritizeAsset, cancelAssetTransferForFailedAsset };

  TRDeviceService() = default;
  virtual ~TRDeviceService() = default;
  TRDeviceService(const TRDeviceService&) = delete;
  TRDeviceService& operator=(const TRDeviceService&) = delete;

  // Whether the running host offers `operation`. Cannot fail. Calling an operation the host
  // does not offer aborts the process.
  virtual bool respondsTo(Operation operation) const = 0;
  // Asks the host to move one transfer to the front (`asset` is shared with it). Returns at
  // once; `completion` runs exactly once, on a host thread (never the caller's), with the
  // failure or null.
  virtual void prioritizeAsset(std::shared_ptr<TRAsset> asset,
                               std::function<void(ErrorRef)> completion) = 0;
  // Gives up a transfer whose install was cancelled. Returns at once; reports no failure.
  virtual void cancelAssetTransferForFailedAsset(std::shared_ptr<TRAsset> asset) = 0;
};

// The host sync framework's functions. Safe from any thread.
class TRHostFramework {
 public:
  TRHostFramework() = default;
  virtual ~TRHostFramework() = default;
  TRHostFramework(const TRHostFramework&) = delete;
  TRHostFramework& operator=(const TRHostFramework&) = delete;

  // The log object of category `category` (0, 8 and 14 are used). Cannot fail; owned by the
  // framework and valid for its lifetime; safe from any thread.
  virtual LogCategory& TRGetLogCategory(int category) = 0;
  // Whether a later retry of whatever failed with `error` can succeed. False for null.
  virtual bool TRIsRecoverableError(const ErrorRef& error) = 0;
  // The device service, shared by every caller: the same object each call, never null.
  virtual std::shared_ptr<TRDeviceService> TRDeviceServiceSharedInstance() = 0;
};

}  // namespace appsync
