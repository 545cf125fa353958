// The backup service: whether a backup holds an application's data, and restore cancellation.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "runtime/error.h"

namespace appsync {

class SWManager {
 public:
  virtual ~SWManager() = default;
  // True when the backup holds data for the application; *size (when given) receives its size.
  virtual bool restoreDataExistsForApplicationWithBundleID(const std::string& bundleID,
                                                           std::uint64_t* size) = 0;
  virtual bool cancelApplicationRestoreWithBundleID(const std::string& bundleID,
                                                    ErrorRef* error) = 0;
};

class SWBackupService {
 public:
  virtual ~SWBackupService() = default;
  // A new manager object; never null.
  virtual std::shared_ptr<SWManager> newManager() = 0;
};

}  // namespace appsync
