// The backup service: whether a backup holds an application's data, and restore cancellation.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "runtime/error.h"

namespace appsync {

// A client's handle on the backup service. Safe from any thread.
class SWManager {
 public:
  SWManager() = default;
  virtual ~SWManager() = default;
  SWManager(const SWManager&) = delete;
  SWManager& operator=(const SWManager&) = delete;

  // True when the backup holds data for the application; *size (when given) receives its size.
  // False, with *size untouched, when it holds none or the query failed.
  virtual bool restoreDataExistsForApplicationWithBundleID(const std::string& bundleID,
                                                           std::uint64_t* size) = 0;
  // Stops restoring the application's data. False on failure, with *error (when given) set.
  virtual bool cancelApplicationRestoreWithBundleID(const std::string& bundleID,
                                                    ErrorRef* error) = 0;
};

// The backup service. Safe from any thread.
class SWBackupService {
 public:
  SWBackupService() = default;
  virtual ~SWBackupService() = default;
  SWBackupService(const SWBackupService&) = delete;
  SWBackupService& operator=(const SWBackupService&) = delete;

  // A new manager, owned by the caller; it must not outlive the service. Never null.
  virtual std::shared_ptr<SWManager> newManager() = 0;
};

}  // namespace appsync
