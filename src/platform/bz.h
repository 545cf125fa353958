// The store service: refresh of purchase receipts.
#pragma once

#include <functional>
#include <memory>

#include "runtime/error.h"

namespace appsync {

// The store's library of purchased software. Safe from any thread.
class BZSoftwareLibrary {
 public:
  BZSoftwareLibrary() = default;
  virtual ~BZSoftwareLibrary() = default;
  BZSoftwareLibrary(const BZSoftwareLibrary&) = delete;
  BZSoftwareLibrary& operator=(const BZSoftwareLibrary&) = delete;

  // Returns at once; `completion` runs exactly once, on a store thread (never the caller's),
  // with the failure or null on success.
  virtual void refreshReceiptsWithCompletionBlock(std::function<void(ErrorRef)> completion) = 0;
};

// The store service. Safe from any thread.
class BZStoreService {
 public:
  BZStoreService() = default;
  virtual ~BZStoreService() = default;
  BZStoreService(const BZStoreService&) = delete;
  BZStoreService& operator=(const BZStoreService&) = delete;

  // A new library, owned by the caller; it must not outlive the service. Never null.
  virtual std::shared_ptr<BZSoftwareLibrary> newSoftwareLibrary() = 0;
};

}  // namespace appsync
