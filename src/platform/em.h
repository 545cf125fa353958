// The low-level installer: the list of uninstalled applications, install options and store
// metadata objects.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "runtime/plist/value.h"

namespace appsync {

// Store metadata of one application, as handed to a placeholder or an install.
class EMStoreMetadata {
 public:
  explicit EMStoreMetadata(plist::Dict dictionary) : dictionary_(std::move(dictionary)) {}
  const plist::Dict& dictionary() const { return dictionary_; }
  std::string describe() const;

 private:
  plist::Dict dictionary_;
};

class EMInstallOptions {
 public:
  void setCaravelMetadata(std::shared_ptr<const EMStoreMetadata> metadata) {
    metadata_ = std::move(metadata);
  }
  void setArInstallType(std::uint64_t type) { arInstallType_ = type; }
  void setInstallTargetType(std::uint64_t type) { installTargetType_ = type; }
  const std::shared_ptr<const EMStoreMetadata>& caravelMetadata() const { return metadata_; }
  std::uint64_t arInstallType() const { return arInstallType_; }
  std::uint64_t installTargetType() const { return installTargetType_; }
  std::string describe() const;

 private:
  std::shared_ptr<const EMStoreMetadata> metadata_;
  std::uint64_t arInstallType_ = 0;
  std::uint64_t installTargetType_ = 0;
};

// The low-level installer. Safe from any thread.
class EMInstaller {
 public:
  EMInstaller() = default;
  virtual ~EMInstaller() = default;
  EMInstaller(const EMInstaller&) = delete;
  EMInstaller& operator=(const EMInstaller&) = delete;

  // Applications the installer has uninstalled and not yet been told to forget, keyed by
  // identifier. The caller owns the dictionary. Null when the list is unavailable.
  virtual std::unique_ptr<plist::Dict> EmplaceLookupUninstalled(const plist::Dict* options) = 0;
  // Forgets the given identifiers (unknown ones are ignored). 0 on success; otherwise an error
  // status, and nothing is forgotten.
  virtual int EmplaceClearUninstalled(const std::vector<std::string>& identifiers,
                                      const plist::Dict* options) = 0;
};

}  // namespace appsync
